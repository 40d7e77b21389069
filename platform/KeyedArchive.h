// The keyed archive: one Value graph as bytes, under a root key. The encoding is CBOR (RFC 8949), one map with the root
// key as its only entry. Only the five kinds of a Value that hold something stand in an archive: dictionary, array,
// text, data and number.
#ifndef VELTRA_PLATFORM_KEYED_ARCHIVE_H
#define VELTRA_PLATFORM_KEYED_ARCHIVE_H

#include <optional>
#include <stdexcept>
#include <string_view>

#include "platform/Error.h"
#include "platform/Value.h"

// Raised for an archive whose contents cannot be decoded, or a graph that cannot be encoded.
class ArchiveFailure : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// The bytes of `root` under `rootKey`. Raises ArchiveFailure for a graph that could not be decoded again: one that
// holds a value of nothing or a text that is no UTF-8, or in which more than 32 collections, the archive's own map
// included, stand inside each other.
Value::Data archiveEncode(std::string_view rootKey, const Value& root);

// A decoder over the bytes of one archive, which it only reads during create.
class ArchiveDecoder {
public:
    // None, and *error filled, when `bytes` are no archive at all: empty, or not a map.
    static std::optional<ArchiveDecoder> create(const Value::Data& bytes, std::optional<Error>* error);

    // The object under `rootKey`, or nothing when the archive has no such key. Raises ArchiveFailure when the contents
    // are malformed, hold another kind of object than the five (a fraction, an integer beyond 64 signed bits, a tagged
    // item, null), a key twice in one map or an item of indefinite length, nest deeper than 32, or hold more than
    // 1048576 items, keys included.
    Value decode(std::string_view rootKey) const;

private:
    explicit ArchiveDecoder(Value::Data bytes) : bytes_(std::move(bytes)) {}
    Value::Data bytes_;
};

#endif
