#include "tools/orloctl/ShowDer.h"

#include <algorithm>

#include "der/DERDecode.h"
#include "tools/orloctl/DerText.h"

namespace {

using nlohmann::ordered_json;

constexpr unsigned deepest = 64;
constexpr std::uint64_t mostShown = 50000;
constexpr std::uint64_t mostOctetsOfValue = 32;
constexpr std::uint64_t mostCharactersOfValue = 128;

ordered_json integerValue(const DERItem& content) {
    if (content.length == 0 || content.length > sizeof(std::int64_t))
        return "0x" + hexText(content, mostOctetsOfValue);
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

// The value of a primitive item; null when it has none to show.
ordered_json valueOf(DERTag tag, const DERItem& content) {
    constexpr DERTag enumerated = 10;
    if (isText(tag))
        return escapedText(content, mostCharactersOfValue);
    if (tag == DERTagBoolean && content.length == 1)
        return content.data[0] != 0;
    if (tag == DERTagInteger || tag == enumerated)
        return integerValue(content);
    if (tag == DERTagObjectIdentifier)
        return oidText(content);
    return content.length != 0 ? ordered_json(hexText(content, mostOctetsOfValue)) : ordered_json();
}

std::string padded(std::uint64_t number, std::size_t width) {
    const std::string digits = std::to_string(number);
    return digits.size() < width ? std::string(width - digits.size(), ' ') + digits : digits;
}

class Tree {
public:
    // The findings go into `report`.
    Tree(const std::uint8_t* data, std::size_t length, Report& report)
        : data_(data), whole_{data, length}, report_(report) {}

    void show();

private:
    // Each returns false when the tree ends here.
    bool walk(const DERItem& content, unsigned depth, ordered_json& items);
    bool enter(const DERDecodedInfo& item, unsigned depth, ordered_json& shown);

    ordered_json describe(const DERItem& rest, const DERDecodedInfo& item, unsigned depth);
    void note(std::uint64_t offset, const DerFault& fault);
    std::uint64_t offsetOf(const DERItem& place) const { return static_cast<std::uint64_t>(place.data - data_); }

    const std::uint8_t* data_;
    DERItem whole_;
    std::uint64_t items_ = 0;
    Report& report_;
};

void Tree::note(std::uint64_t offset, const DerFault& fault) {
    if (!report_.ok)
        return;
    report_.ok = false;
    report_.json["problemOffset"] = offset + fault.offset;
    report_.problem = "Strict DER ends at offset " + std::to_string(offset + fault.offset) +
                      ", in the item at offset " + std::to_string(offset) + ": " + fault.reason + ".";
}

ordered_json Tree::describe(const DERItem& rest, const DERDecodedInfo& item, unsigned depth) {
    const auto headerLength = static_cast<std::uint64_t>(item.content.data - rest.data);
    ordered_json json = {{"offset", offsetOf(rest)},
                         {"headerLength", headerLength},
                         {"contentLength", item.content.length},
                         {"tag", derTagName(item.tag)},
                         {"constructed", isConstructed(item.tag)}};
    const ordered_json value = isConstructed(item.tag) ? ordered_json() : valueOf(item.tag, item.content);
    report_.text += padded(offsetOf(rest), 8) + padded(headerLength, 4) + padded(item.content.length, 9) + "  " +
                    std::string(2 * std::size_t{depth}, ' ') + derTagName(item.tag);
    if (!value.is_null()) {
        const std::string text = value.is_string() ? value.get<std::string>() : value.dump();
        report_.text += " " + (isText(item.tag) ? "\"" + text + "\"" : text);
        json["value"] = value;
    }
    report_.text += '\n';
    return json;
}

bool Tree::enter(const DERDecodedInfo& item, unsigned depth, ordered_json& shown) {
    ordered_json items = ordered_json::array();
    if (depth == deepest) {
        note(offsetOf(item.content), {0, "items are nested deeper than " + std::to_string(deepest) + " levels"});
        return false;
    }
    const bool goesOn = walk(item.content, depth + 1, items);
    if (shown.is_object())
        shown["items"] = std::move(items);
    return goesOn;
}

bool Tree::walk(const DERItem& content, unsigned depth, ordered_json& items) {
    DERSequence sequence;
    DERDecodedInfo item;
    DERDecodeSeqContentInit(&content, &sequence);
    while (sequence.next != sequence.end) {
        const DERItem rest = {sequence.next, static_cast<std::uint64_t>(sequence.end - sequence.next)};
        if (const auto fault = derHeaderFault(rest)) {
            note(offsetOf(rest), *fault);
            report_.text += padded(offsetOf(rest), 8) + "  not DER: " + fault->reason + "\n";
            return false;
        }
        if (DERDecodeSeqNext(&sequence, &item) != DERSuccess)
            return false;
        const bool isShown = ++items_ <= mostShown;
        ordered_json shown = isShown ? describe(rest, item, depth) : ordered_json();
        if (auto fault = derContentFault(item.tag, item.content)) {
            fault->offset += offsetOf(item.content) - offsetOf(rest);
            note(offsetOf(rest), *fault);
            if (isShown) {
                shown["fault"] = fault->reason;
                report_.text += std::string(23 + 2 * std::size_t{depth}, ' ') + "not DER: " + fault->reason + "\n";
            }
        }
        const bool goesOn = !isConstructed(item.tag) || enter(item, depth, shown);
        if (isShown)
            items.push_back(std::move(shown));
        if (!goesOn)
            return false;
    }
    return true;
}

void Tree::show() {
    ordered_json items = ordered_json::array();
    report_.json["length"] = whole_.length;
    report_.text = "  offset  hdr  content  item\n";
    if (whole_.length == 0)
        note(0, {0, "there are no octets"});
    else
        walk(whole_, 0, items);
    report_.json["items"] = std::move(items);
    if (items_ > mostShown) {
        report_.json["itemsNotShown"] = items_ - mostShown;
        report_.text += std::to_string(items_ - mostShown) + " further items are not shown\n";
    }
}

} // namespace

Report showDer(const std::uint8_t* data, std::size_t length) {
    Report report;
    Tree(data, length, report).show();
    return report;
}
