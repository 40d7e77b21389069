#include "tools/orloctl/ShowDer.h"

#include <algorithm>

#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/DerText.h"

namespace {

using nlohmann::ordered_json;

constexpr unsigned deepest = 64;

ordered_json integerValue(const DERItem& content) {
    if (content.length == 0 || content.length > sizeof(std::int64_t))
        return "0x" + hexText(content);
    std::uint64_t number = (content.data[0] & 0x80) != 0 ? UINT64_MAX : 0;
    for (std::uint64_t i = 0; i < content.length; ++i)
        number = number << 8 | content.data[i];
    return static_cast<std::int64_t>(number);
}

// Strings and times whose characters are mostly ASCII.
bool isText(DERTag tag) {
    constexpr DERTag texts[] = {12, 18, 19, 20, DERTagIA5String, 23, 24, 26};
    return std::find(std::begin(texts), std::end(texts), tag) != std::end(texts);
}

// Numbers with dots, or the octets when a number is too large for them.
std::string oidValue(const DERItem& content) {
    const std::string numbers = oidText(content);
    return numbers.empty() ? "0x" + hexText(content) : numbers;
}

// The value of a primitive item; null when it has none to show.
ordered_json valueOf(DERTag tag, const DERItem& content) {
    constexpr DERTag enumerated = 10;
    if (isText(tag))
        return escapedText(content);
    if (tag == DERTagBoolean && content.length == 1)
        return content.data[0] != 0;
    if (tag == DERTagInteger || tag == enumerated)
        return integerValue(content);
    if (tag == DERTagObjectIdentifier)
        return oidValue(content);
    return content.length != 0 ? ordered_json(hexText(content)) : ordered_json();
}

class Tree {
public:
    Tree(const std::uint8_t* data, std::size_t length) : whole_{data, length}, end_(data + length) {}

    // Goes through all items, and keeps where the tree ends and what is wrong first.
    void check(Report& report);

    std::uint64_t count() const { return count_; }

    // The items, each with the items inside it as its list.
    Elements items() const { return itemsIn(whole_); }

private:
    void check(const DERItem& content, unsigned depth, Report& report);
    void note(Report& report, const std::uint8_t* item, const DerFault& fault) const;

    Elements itemsIn(const DERItem& content) const;
    Element describe(const DERItem& encoding, const DERDecodedInfo& item) const;

    std::uint64_t offsetOf(const std::uint8_t* place) const { return static_cast<std::uint64_t>(place - whole_.data); }

    DERItem whole_;
    const std::uint8_t* end_; // of what can be read
    std::uint64_t count_ = 0;
};

void Tree::note(Report& report, const std::uint8_t* item, const DerFault& fault) const {
    if (!report.ok)
        return;
    const std::uint64_t offset = offsetOf(item) + fault.offset;
    report.ok = false;
    report.json["problemOffset"] = offset;
    report.problem = "Strict DER ends at offset " + std::to_string(offset) + ", in the item at offset " +
                     std::to_string(offsetOf(item)) + ": " + fault.reason + ".";
}

Element Tree::describe(const DERItem& encoding, const DERDecodedInfo& item) const {
    Element element{{{"offset", offsetOf(encoding.data)},
                     {"headerLength", encoding.length - item.content.length},
                     {"contentLength", item.content.length},
                     {"tag", derTagName(item.tag)},
                     {"constructed", isConstructed(item.tag)}},
                    {}};
    if (isConstructed(item.tag))
        element.json["items"] = element.lists.add(itemsIn(item.content));
    else if (ordered_json value = valueOf(item.tag, item.content); !value.is_null())
        element.json["value"] = std::move(value);
    if (const auto fault = derContentFault(item.tag, item.content))
        element.json["fault"] = fault->reason;
    return element;
}

Elements Tree::itemsIn(const DERItem& content) const {
    return [tree = *this, content](const auto& take) {
        DerItems items(content);
        while (items.next() && items.encoding().data < tree.end_ && take(tree.describe(items.encoding(), items.item())))
            ;
    };
}

void Tree::check(const DERItem& content, unsigned depth, Report& report) {
    DerItems items(content);
    while (items.next() && items.encoding().data < end_) {
        const DERDecodedInfo& item = items.item();
        ++count_;
        if (auto fault = derContentFault(item.tag, item.content)) {
            fault->offset += items.encoding().length - item.content.length;
            note(report, items.encoding().data, *fault);
        }
        if (isConstructed(item.tag) && depth == deepest) {
            note(report, item.content.data, {0, "items are nested deeper than " + std::to_string(deepest) + " levels"});
            end_ = item.content.data;
        } else if (isConstructed(item.tag))
            check(item.content, depth + 1, report);
    }
    if (!items.isBroken() || items.encoding().data >= end_)
        return;
    if (const auto fault = derHeaderFault(items.encoding())) {
        note(report, items.encoding().data, *fault);
        end_ = items.encoding().data;
    }
}

void Tree::check(Report& report) {
    if (whole_.length == 0)
        note(report, whole_.data, {0, "there are no octets"});
    else
        check(whole_, 0, report);
}

} // namespace

Report showDer(const std::uint8_t* data, std::size_t length) {
    Report report;
    Tree tree(data, length);
    report.json["length"] = length;
    tree.check(report);
    report.json["items"] = report.lists.add(tree.items(), tree.count());
    return report;
}
