// Makes Img4 containers, payloads and manifests, sound ones and broken ones, for tests, fuzz seeds and the example
// device. The octets are the DER encoder's, put together from the inside out: every function returns one whole encoding
// and takes the encodings of what it holds.
#ifndef VELTRA_TOOLS_MAKERS_IMG4MAKER_H
#define VELTRA_TOOLS_MAKERS_IMG4MAKER_H

#include "der/DERTypes.h"

#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

namespace img4maker {

using Bytes = std::vector<std::uint8_t>;
using List = std::vector<Bytes>;

// The number that the four characters of `text` spell, and the private tag that it makes.
std::uint32_t fourCC(std::string_view text);
DERTag propertyTag(std::string_view text);

// `count` octets that look like data and are the same each time.
Bytes filler(std::size_t count, std::uint8_t seed = 0);
Bytes join(const List& parts);

// Whole files; the second makes the folders on the way too.
Bytes readFile(const std::string& path);
void writeFile(const std::filesystem::path& path, const Bytes& contents);

Bytes item(DERTag tag, const Bytes& content);
Bytes sequence(const List& elements);
Bytes set(const List& elements);
Bytes context(unsigned number, const Bytes& content); // constructed
Bytes boolean(bool value);
Bytes integer(std::uint64_t value);
Bytes octets(const Bytes& content);
Bytes ia5(std::string_view text);

// The property `name` with the encoded `value`; an object is a property whose value is a set of properties.
Bytes property(std::string_view name, const Bytes& value);
Bytes object(std::string_view name, const List& properties);

struct Payload {
    std::string_view type = "sepi";
    std::string_view version = "sepi-1.0";
    Bytes data = filler(64);
    Bytes keybag = {};      // none when empty
    Bytes compression = {}; // an encoding; none when empty
    Bytes properties = {};  // the content of [0]; none when empty
};
Bytes payload(const Payload& fields);
Bytes compression(std::uint64_t algorithm, std::uint64_t uncompressedSize);
Bytes payloadProperties(const List& properties);

struct Manifest {
    std::uint64_t version = 0;
    List properties = {}; // of "MANP"
    List objects = {};
    Bytes signature = filler(48);
    Bytes certChain = {}; // the content of the SEQUENCE
};
Bytes manifestBody(const Manifest& fields);
Bytes manifest(const Manifest& fields);
Bytes unsignedManifest(const Manifest& fields);

Bytes restoreInfo(const List& properties);

// An empty manifest or restore information is left out.
Bytes container(const Bytes& payload, const Bytes& manifest, const Bytes& restoreInfo);

// A boot ticket as a device stores it: a signed manifest with the objects "boot", "kern" and "sepi", the last of which
// carries the entitlement "eksp" with the value `entitled`.
Bytes exampleTicket(bool entitled = true);

// A container with everything that the format has: keybag, compression, payload properties, that ticket as manifest,
// and restore information.
Bytes exampleContainer();

// A manifest of at most a thousand objects with equally many properties each, the last of them "eksp", and the name of
// the object with the given number.
constexpr unsigned propertiesOfLargeObject = 8;
Bytes largeManifest(unsigned objects);
std::string largeObjectName(unsigned number);

} // namespace img4maker

#endif
