#include "tools/orloctl/Img4Findings.h"

#include "platform/Crypto.h"
#include "tools/orloctl/DerText.h"

namespace img4show {

namespace {

constexpr std::uint64_t mostOctetsShown = 64;

std::string digestText(bool (*digest)(const void*, std::size_t, std::uint8_t*) noexcept, std::size_t size,
                       const DERItem& data) {
    std::uint8_t out[crypto::sha384Size];
    return digest(data.data, data.length, out) ? hexText({out, size}, size) : "";
}

} // namespace

void Findings::fault(const std::uint8_t* place, const std::string& reason) {
    if (!report_.ok)
        return;
    report_.ok = false;
    report_.json["problemOffset"] = offsetOf(place);
    report_.problem = reason + ", " + at(place) + ".";
}

void Findings::headerFault(const DERItem& rest, const std::string& what) {
    if (const auto why = derHeaderFault(rest))
        fault(rest.data + why->offset, what + ", which begins " + at(rest.data) + ", is no strict DER: " + why->reason);
}

std::string sha1Text(const DERItem& data) {
    return digestText(crypto::sha1, crypto::sha1Size, data);
}

std::string sha256Text(const DERItem& data) {
    return digestText(crypto::sha256, crypto::sha256Size, data);
}

std::string sha384Text(const DERItem& data) {
    return digestText(crypto::sha384, crypto::sha384Size, data);
}

nlohmann::ordered_json dataJson(const DERItem& data) {
    nlohmann::ordered_json json = {{"length", data.length}, {"hex", hexText(data)}};
    if (data.length > mostOctetsShown)
        json["sha256"] = sha256Text(data);
    return json;
}

} // namespace img4show
