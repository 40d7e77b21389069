#ifndef VELTRA_TOOLS_ORLOCTL_DERITEMS_H
#define VELTRA_TOOLS_ORLOCTL_DERITEMS_H

#include <cstdint>

#include "der/DERDecode.h"

// Walks the items in a content, each with its whole encoding:
//
//   DerItems items(content);
//   while (items.next())
//       ... items.item(), items.encoding() ...
//   if (items.isBroken())
//       ... no item could be decoded at the start of items.encoding() ...
class DerItems {
public:
    explicit DerItems(const DERItem& content) { DERDecodeSeqContentInit(&content, &rest_); }

    // False at the end, and when what follows is no strict DER.
    bool next() {
        encoding_ = {rest_.next, static_cast<std::uint64_t>(rest_.end - rest_.next)};
        if (DERDecodeSeqNext(&rest_, &item_) != DERSuccess)
            return false;
        encoding_.length = static_cast<std::uint64_t>(rest_.next - encoding_.data);
        return true;
    }

    const DERDecodedInfo& item() const { return item_; }
    const DERItem& encoding() const { return encoding_; }
    bool isBroken() const { return rest_.next != rest_.end; }

private:
    DERSequence rest_ = {};
    DERDecodedInfo item_ = {};
    DERItem encoding_ = {};
};

#endif
