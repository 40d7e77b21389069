// Small conversions between the forms in which values, bytes and errors travel. All are pure but for the console lines
// of convertDataToDictionary, and may be called from any thread.
#ifndef VELTRA_DAEMON_CONVERSIONS_H
#define VELTRA_DAEMON_CONVERSIONS_H

#include <stdexcept>
#include <string>
#include <string_view>

#include "platform/Error.h"
#include "platform/Value.h"

// What hexString2Binary raises: a name and a reason.
class ConversionFailure : public std::runtime_error {
public:
    ConversionFailure(std::string name, const std::string& reason)
        : std::runtime_error(reason), name_(std::move(name)) {}
    const std::string& name() const { return name_; }

private:
    std::string name_;
};

// The keyed archive of `dictionary` under the root key "HSArchiverKey", as data; nothing for nothing, and for a
// dictionary that archiveEncode (platform/KeyedArchive.h) refuses.
Value convertDictionaryToData(const Value& dictionary);

// The object under the root key "HSArchiverKey" of the archive in `data`; nothing for nothing, and when the bytes are
// no archive. Writes to the system console log what it met. Raises ArchiveFailure when the contents cannot be decoded
// or hold a kind that does not belong in an archive.
Value convertDataToDictionary(const Value& data);

// Two lower-case hexadecimal digits a byte, as text; nothing for nothing and for empty data.
Value DatatoHexString(const Value& data);

// One character for each pair of hexadecimal digits, as text; nothing for an odd number of characters. White space at
// the start of a pair is skipped and its digits are read as far as they go, so a pair without a digit is U+0000. Values
// from 0x80 on are the code points U+0080 to U+00FF.
Value stringFromHexString(std::string_view text);

// The bytes that the pairs of hexadecimal digits in `text` name; "0x", "0X" and blanks are left out first. Raises
// ConversionFailure "IllegalInput" for an odd number of characters and for a pair that does not start with a digit,
// white space apart.
Value::Data hexString2Binary(std::string_view text);

// Base64 (RFC 4648, padded) in one line.
std::string base64EncodedString(const Value::Data& data);

// "LXError domain:<domain>, error code: <code>. Description: <description>".
std::string stringFromLXError(const Error& error);

// `value` when it is a number (integer or boolean), nothing otherwise.
Value isLXNumber(const Value& value);

#endif
