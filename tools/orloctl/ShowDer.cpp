#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Findings.h"
#include "tools/orloctl/ShowFile.h"

namespace {

constexpr unsigned deepest = 64;

// An item and what is wrong with it; one that cannot be decoded has neither tag nor content.
struct Item {
    DERItem encoding;
    DERDecodedInfo decoded;
    std::optional<DerFault> fault;
    bool isEntered; // what is inside it is looked at
};

// Hands the items in `content` to `take` until that returns false.
template <typename Take>
void forEach(const DERItem& content, unsigned depth, const Take& take) {
    DerItems items(content);
    while (items.next()) {
        const DERDecodedInfo& decoded = items.item();
        Item item{items.encoding(), decoded, derContentFault(decoded.tag, decoded.content), isConstructed(decoded.tag)};
        if (item.isEntered && depth == deepest) {
            item.fault = {decoded.content.data, "items are nested deeper than " + std::to_string(deepest) + " levels"};
            item.isEntered = false;
        }
        if (!take(item))
            return;
    }
    if (const DERRefusal* why = items.refusal())
        take(Item{items.encoding(), {}, DerFault{why->place, derFaultText(*why)}, false});
}

std::uint64_t check(const DERItem& content, unsigned depth, Findings& findings) {
    std::uint64_t count = 0;
    forEach(content, depth, [&](const Item& item) {
        if (item.fault)
            findings.fault(item.fault->place, "Strict DER ends in the item at offset " +
                                                  std::to_string(findings.offsetOf(item.encoding.data)) + ": " +
                                                  item.fault->reason);
        count += 1 + (item.isEntered ? check(item.decoded.content, depth + 1, findings) : 0);
        return true;
    });
    return count;
}

Elements itemsIn(const DERItem& content, unsigned depth, const std::uint8_t* file) {
    return [=](const auto& take) {
        forEach(content, depth, [&](const Item& item) {
            const auto& [tag, inside] = item.decoded;
            Element element{{{"offset", item.encoding.data - file}}, {}};
            if (inside.data != nullptr)
                element.json.update({{"headerLength", item.encoding.length - inside.length},
                                     {"contentLength", inside.length},
                                     {"tag", derTagName(tag)},
                                     {"constructed", isConstructed(tag)}});
            if (item.isEntered)
                element.json["items"] = element.lists.add(itemsIn(inside, depth + 1, file));
            else if (auto value = derValue(tag, inside);
                     inside.data != nullptr && !isConstructed(tag) && !value.is_null())
                element.json["value"] = std::move(value);
            if (item.fault)
                element.json["fault"] = item.fault->reason;
            return take(element);
        });
    };
}

} // namespace

Report showDer(const DERItem& file) {
    Report report;
    Findings findings(file, report);
    report.json["length"] = file.length;
    if (file.length == 0)
        findings.fault(file.data, "There are no octets");
    report.json["items"] = report.lists.add(itemsIn(file, 0, file.data), check(file, 0, findings));
    return report;
}
