#include "tools/makers/Img4Maker.h"

#include "der/DEREncode.h"

#include <fstream>
#include <iterator>
#include <stdexcept>

namespace img4maker {

std::uint32_t fourCC(std::string_view text) {
    if (text.size() != 4)
        throw std::invalid_argument("not a four-character code: " + std::string(text));
    std::uint32_t code = 0;
    for (const char character : text)
        code = code << 8 | static_cast<std::uint8_t>(character);
    return code;
}

DERTag propertyTag(std::string_view text) {
    return DERTagPrivateConstructed(std::uint64_t{fourCC(text)});
}

Bytes filler(std::size_t count, std::uint8_t seed) {
    Bytes octets(count);
    for (std::size_t i = 0; i < count; ++i)
        octets[i] = static_cast<std::uint8_t>(seed + i * 37 + i / 7);
    return octets;
}

Bytes join(const List& parts) {
    Bytes joined;
    for (const Bytes& part : parts)
        joined.insert(joined.end(), part.begin(), part.end());
    return joined;
}

Bytes readFile(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    if (!file)
        throw std::runtime_error("cannot read " + path);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

void writeFile(const std::filesystem::path& path, const Bytes& contents) {
    create_directories(path.parent_path());
    std::ofstream file(path, std::ios::binary);
    file.exceptions(std::ios::failbit | std::ios::badbit);
    file.write(reinterpret_cast<const char*>(contents.data()), static_cast<std::streamsize>(contents.size()));
    file.close();
}

Bytes item(DERTag tag, const Bytes& content) {
    Bytes encoding(DERLengthOfItem(tag, content.size()));
    std::uint64_t written = encoding.size();
    if (DEREncodeItem(tag, content.size(), content.data(), encoding.data(), &written) != DERSuccess ||
        written != encoding.size())
        throw std::logic_error("the encoder did not fill the length that it measured");
    return encoding;
}

Bytes sequence(const List& elements) {
    return item(DERTagSequence, join(elements));
}

Bytes set(const List& elements) {
    return item(DERTagSet, join(elements));
}

Bytes context(unsigned number, const Bytes& content) {
    return item(DERTagContextConstructed(number), content);
}

Bytes boolean(bool value) {
    return item(DERTagBoolean, {static_cast<std::uint8_t>(value ? 0xFF : 0x00)});
}

Bytes integer(std::uint64_t value) {
    Bytes content;
    do {
        content.insert(content.begin(), static_cast<std::uint8_t>(value));
        value >>= 8;
    } while (value != 0);
    if ((content.front() & 0x80) != 0)
        content.insert(content.begin(), 0);
    return item(DERTagInteger, content);
}

Bytes octets(const Bytes& content) {
    return item(DERTagOctetString, content);
}

Bytes ia5(std::string_view text) {
    return item(DERTagIA5String, Bytes(text.begin(), text.end()));
}

Bytes property(std::string_view name, const Bytes& value) {
    return item(propertyTag(name), sequence({ia5(name), value}));
}

Bytes object(std::string_view name, const List& properties) {
    return property(name, set(properties));
}

Bytes payload(const Payload& fields) {
    List elements = {ia5("IM4P"), ia5(fields.type), ia5(fields.version), octets(fields.data)};
    if (!fields.keybag.empty())
        elements.push_back(octets(fields.keybag));
    if (!fields.compression.empty())
        elements.push_back(fields.compression);
    if (!fields.properties.empty())
        elements.push_back(context(0, fields.properties));
    return sequence(elements);
}

Bytes compression(std::uint64_t algorithm, std::uint64_t uncompressedSize) {
    return sequence({integer(algorithm), integer(uncompressedSize)});
}

Bytes payloadProperties(const List& properties) {
    return sequence({ia5("PAYP"), set(properties)});
}

Bytes manifestBody(const Manifest& fields) {
    List elements = {object("MANP", fields.properties)};
    elements.insert(elements.end(), fields.objects.begin(), fields.objects.end());
    return set({property("MANB", fields.version == 2 ? sequence(elements) : set(elements))});
}

Bytes manifest(const Manifest& fields) {
    return sequence({ia5("IM4M"), integer(fields.version), manifestBody(fields), octets(fields.signature),
                     item(DERTagSequence, fields.certChain)});
}

Bytes unsignedManifest(const Manifest& fields) {
    return sequence({ia5("IM4M"), integer(fields.version), manifestBody(fields)});
}

Bytes restoreInfo(const List& properties) {
    return sequence({ia5("IM4R"), set(properties)});
}

Bytes container(const Bytes& payload, const Bytes& manifest, const Bytes& restoreInfo) {
    List elements = {ia5("IMG4"), payload};
    if (!manifest.empty())
        elements.push_back(context(0, manifest));
    if (!restoreInfo.empty())
        elements.push_back(context(1, restoreInfo));
    return sequence(elements);
}

namespace {

List imageProperties(std::uint8_t seed) {
    return {property("dgsO", octets(filler(48, seed))), property("keyO", boolean(true)),
            property("proO", boolean(true)), property("secO", boolean(true))};
}

} // namespace

Bytes exampleTicket(bool entitled) {
    List sepProperties = imageProperties(3);
    sepProperties.push_back(property("eksp", boolean(entitled)));
    sepProperties.push_back(property("digA", octets(filler(48, 4))));
    sepProperties.push_back(property("digB", octets(filler(32, 5))));
    Manifest ticket;
    ticket.properties = {property("nonH", octets(filler(32, 6))),
                         property("brdI", integer(12)),
                         property("epoC", integer(1)),
                         property("chpI", integer(0x1234)),
                         property("proC", boolean(true)),
                         property("secC", boolean(true)),
                         property("devI", integer(0x12345678ABCD)),
                         property("domI", integer(1)),
                         property("nonS", octets(filler(20, 7))),
                         property("osvr", ia5("1.2.3"))};
    ticket.objects = {object("boot", imageProperties(1)), object("kern", imageProperties(2)),
                      object("sepi", sepProperties)};
    return manifest(ticket);
}

Bytes exampleContainer() {
    Payload image;
    image.data = filler(200, 8);
    image.keybag = filler(40, 9);
    image.compression = compression(1, 4096);
    image.properties =
        payloadProperties({property("entP", integer(0x10000)), property("lodA", integer(0xFFFFFFF007004000)),
                           property("uuiD", octets(filler(16, 10))), property("revD", boolean(false)),
                           property("vers", set({property("verS", ia5("1.0.3"))}))});
    return container(payload(image), exampleTicket(),
                     restoreInfo({property("nonV", octets(filler(8, 11))), property("rcnt", integer(3)),
                                  property("rbig", integer(0x100000000)), property("rdbg", boolean(true))}));
}

std::string largeObjectName(unsigned number) {
    return {'o', static_cast<char>('0' + number / 100 % 10), static_cast<char>('0' + number / 10 % 10),
            static_cast<char>('0' + number % 10)};
}

Bytes largeManifest(unsigned objects) {
    Manifest large;
    large.properties = {property("brdI", integer(12)), property("chpI", integer(0x1234)),
                        property("devI", integer(0x12345678ABCD))};
    for (unsigned i = 0; i < objects; ++i) {
        List properties = imageProperties(static_cast<std::uint8_t>(i));
        properties.push_back(property("digA", octets(filler(48, 4))));
        properties.push_back(property("size", integer(i * std::uint64_t{1000})));
        properties.push_back(property("digC", octets(filler(32, 5))));
        properties.push_back(property("eksp", boolean(true)));
        large.objects.push_back(object(largeObjectName(i), properties));
    }
    return manifest(large);
}

} // namespace img4maker
