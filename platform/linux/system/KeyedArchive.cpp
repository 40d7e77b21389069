#include "platform/KeyedArchive.h"

#include <algorithm>
#include <string>

#include "platform/linux/system/JsonReader.h"

namespace {

constexpr char archiveErrorDomain[] = "KeyedArchiveErrorDomain";
enum ArchiveErrorCode {
    archiveEmpty = 1,
    archiveNoMap = 2,
};

// The major types of RFC 8949, section 3.1, which are the upper three bits of an item's first byte.
enum Major : unsigned {
    majorUnsigned = 0,
    majorNegative = 1,
    majorBytes = 2,
    majorText = 3,
    majorArray = 4,
    majorMap = 5,
    majorTag = 6,
    majorSimple = 7,
};
constexpr unsigned simpleFalse = 20, simpleTrue = 21;

unsigned major(std::uint8_t first) {
    return first >> 5;
}

// Walks over the heads of all items and lets pass only what an archive may hold, before the library sees the bytes: the
// library descends once for every nested head, also for texts of indefinite length, and wraps around at negative
// integers beyond 64 bits.
class HeadCheck {
public:
    explicit HeadCheck(const Value::Data& bytes) : bytes_(bytes) {}

    void run() { item(0); }

private:
    void item(std::size_t nesting) {
        if (++items_ > maximumItems)
            throw ArchiveFailure("more than " + std::to_string(maximumItems) + " items");
        require(1);
        const std::uint8_t first = bytes_[at_++];
        const std::uint64_t number = argument(first & 0x1F);
        switch (major(first)) {
        case majorUnsigned:
        case majorNegative:
            if (number > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max()))
                throw ArchiveFailure("an integer beyond 64 signed bits");
            return;
        case majorBytes:
        case majorText:
            require(number);
            at_ += static_cast<std::size_t>(number);
            return;
        case majorArray:
            return elements(number, nesting);
        case majorMap:
            require(number); // keeps the count below from wrapping
            return elements(number * 2, nesting);
        case majorTag:
            throw ArchiveFailure("a tagged item");
        default:
            if (number != simpleFalse && number != simpleTrue)
                throw ArchiveFailure("a number that is no integer, or a value of nothing");
        }
    }

    void elements(std::uint64_t count, std::size_t nesting) {
        if (nesting >= ValueBuilder::maximumNesting)
            throw ArchiveFailure("a nesting of more than " + std::to_string(ValueBuilder::maximumNesting));
        require(count); // an element has one byte at least
        for (; count > 0; --count)
            item(nesting + 1);
    }

    std::uint64_t argument(unsigned info) {
        if (info < 24)
            return info;
        if (info > 27)
            throw ArchiveFailure("an item of indefinite length");
        const std::size_t length = std::size_t{1} << (info - 24);
        require(length);
        std::uint64_t number = 0;
        for (std::size_t i = 0; i < length; ++i)
            number = number << 8 | bytes_[at_++];
        return number;
    }

    void require(std::uint64_t count) const {
        if (bytes_.size() - at_ < count)
            throw ArchiveFailure("an archive that was cut off");
    }

    static constexpr std::size_t maximumItems = ValueBuilder::maximumValues;

    const Value::Data& bytes_;
    std::size_t at_ = 0;
    std::size_t items_ = 0;
};

} // namespace

Value::Data archiveEncode(std::string_view rootKey, const Value& root) {
    const auto item = [](const Value::Data& data) { return nlohmann::json::binary(data); };
    Value::Data bytes = nlohmann::json::to_cbor({{rootKey, jsonOf<nlohmann::json>(root, item)}});
    ArchiveDecoder::create(bytes, nullptr)->decode(rootKey); // what could not be decoded again is no archive
    return bytes;
}

std::optional<ArchiveDecoder> ArchiveDecoder::create(const Value::Data& bytes, std::optional<Error>* error) {
    const bool empty = bytes.empty();
    if (!empty && major(bytes.front()) == majorMap)
        return ArchiveDecoder(bytes);
    if (error)
        *error = empty ? Error{archiveErrorDomain, archiveEmpty, "The archive is empty"}
                       : Error{archiveErrorDomain, archiveNoMap, "The data is not a keyed archive"};
    return std::nullopt;
}

Value ArchiveDecoder::decode(std::string_view rootKey) const {
    HeadCheck(bytes_).run();
    ValueBuilder builder(false);
    if (!nlohmann::json::sax_parse(bytes_.begin(), bytes_.end(), &builder, nlohmann::json::input_format_t::cbor))
        throw ArchiveFailure(builder.refusal());
    return builder.take()[rootKey];
}
