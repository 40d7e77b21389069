#ifndef VELTRA_TOOLS_ORLOCTL_DERITEMS_H
#define VELTRA_TOOLS_ORLOCTL_DERITEMS_H

#include <cstdint>

#include "der/DERDecode.h"

// Walks the items in a content, each with its whole encoding:
//
//   DerItems items(content);
//   while (items.next())
//       ... items.item(), items.encoding() ...
//   if (items.refusal())
//       ... it says why no item could be decoded at the start of items.encoding() ...
class DerItems {
public:
    explicit DerItems(const DERItem& content) : rest_(content) {}

    // False at the end, and when what follows is no strict DER.
    bool next() {
        encoding_ = rest_;
        if (rest_.length == 0 || DERDecodeItemExplained(&rest_, &item_, &refusal_) != DERSuccess)
            return false;
        rest_.data = item_.content.data + item_.content.length;
        encoding_.length = static_cast<std::uint64_t>(rest_.data - encoding_.data);
        rest_.length -= encoding_.length;
        return true;
    }

    const DERDecodedInfo& item() const { return item_; }
    const DERItem& encoding() const { return encoding_; }
    const DERRefusal* refusal() const { return rest_.length != 0 ? &refusal_ : nullptr; }

private:
    DERItem rest_;
    DERDecodedInfo item_ = {};
    DERItem encoding_ = {};
    DERRefusal refusal_ = {};
};

#endif
