#include "tools/orloctl/ShowDer.h"

#include <algorithm>

#include "der/DERDecode.h"
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
    Tree(const std::uint8_t* data, std::size_t length) : data_(data), whole_{data, length}, end_(data + length) {}

    // Goes through all items, and keeps where the tree ends and what is wrong first.
    void check(Report& report);

    std::uint64_t count() const { return count_; }

    // The items, each with the items inside it as its list.
    Elements items() const { return itemsIn(whole_); }

private:
    void check(const DERItem& content, unsigned depth, Report& report);
    void note(Report& report, std::uint64_t offset, const DerFault& fault) const;

    Elements itemsIn(const DERItem& content) const;
    Element describe(const DERItem& rest, const DERDecodedInfo& item) const;

    std::uint64_t offsetOf(const DERItem& place) const { return static_cast<std::uint64_t>(place.data - data_); }

    const std::uint8_t* data_;
    DERItem whole_;
    const std::uint8_t* end_; // of what can be read
    std::uint64_t count_ = 0;
};

void Tree::note(Report& report, std::uint64_t offset, const DerFault& fault) const {
    if (!report.ok)
        return;
    report.ok = false;
    report.json["problemOffset"] = offset + fault.offset;
    report.problem = "Strict DER ends at offset " + std::to_string(offset + fault.offset) + ", in the item at offset " +
                     std::to_string(offset) + ": " + fault.reason + ".";
}

Element Tree::describe(const DERItem& rest, const DERDecodedInfo& item) const {
    Element element{{{"offset", offsetOf(rest)},
                     {"headerLength", static_cast<std::uint64_t>(item.content.data - rest.data)},
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
        DERSequence sequence;
        DERDecodedInfo item;
        DERDecodeSeqContentInit(&content, &sequence);
        while (sequence.next < tree.end_) {
            const DERItem rest = {sequence.next, static_cast<std::uint64_t>(sequence.end - sequence.next)};
            if (DERDecodeSeqNext(&sequence, &item) != DERSuccess || !take(tree.describe(rest, item)))
                return;
        }
    };
}

void Tree::check(const DERItem& content, unsigned depth, Report& report) {
    DERSequence sequence;
    DERDecodedInfo item;
    DERDecodeSeqContentInit(&content, &sequence);
    while (sequence.next != sequence.end && sequence.next < end_) {
        const DERItem rest = {sequence.next, static_cast<std::uint64_t>(sequence.end - sequence.next)};
        if (const auto fault = derHeaderFault(rest)) {
            note(report, offsetOf(rest), *fault);
            end_ = rest.data;
            return;
        }
        if (DERDecodeSeqNext(&sequence, &item) != DERSuccess)
            return;
        ++count_;
        if (auto fault = derContentFault(item.tag, item.content)) {
            fault->offset += offsetOf(item.content) - offsetOf(rest);
            note(report, offsetOf(rest), *fault);
        }
        if (isConstructed(item.tag) && depth == deepest) {
            note(report, offsetOf(item.content),
                 {0, "items are nested deeper than " + std::to_string(deepest) + " levels"});
            end_ = item.content.data;
        } else if (isConstructed(item.tag))
            check(item.content, depth + 1, report);
    }
}

void Tree::check(Report& report) {
    if (data_ == end_)
        note(report, 0, {0, "there are no octets"});
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
