#include "tools/orloctl/Findings.h"

#include "platform/Crypto.h"
#include "tools/orloctl/DerText.h"

void Findings::fault(const std::uint8_t* place, const std::string& reason) {
    if (!report_.ok())
        return;
    report_.json["problemOffset"] = offsetOf(place);
    report_.fail(reason + ", at offset " + std::to_string(offsetOf(place)) + ".");
}

std::string digestText(const DERItem& data, std::size_t size) {
    std::uint8_t digest[crypto::sha384Size];
    const auto compute = size == crypto::sha1Size     ? crypto::sha1
                         : size == crypto::sha256Size ? crypto::sha256
                                                      : crypto::sha384;
    return compute(data.data, data.length, digest) ? hexText({digest, size}) : "";
}

nlohmann::ordered_json dataJson(const DERItem& data) {
    constexpr std::uint64_t mostOctetsShown = 64;
    nlohmann::ordered_json json = {{"length", data.length}, {"hex", hexText(data)}};
    if (data.length > mostOctetsShown)
        json["sha256"] = digestText(data, crypto::sha256Size);
    return json;
}
