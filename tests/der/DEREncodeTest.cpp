#include "der/DEREncode.h"

#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "der/DEREncodeInternal.h"
#include "der/DERItemSpecs.h"
#include "tests/der/Bytes.h"
#include "tests/der/Headers.h"

namespace {

// Runs `encode(buffer, &length)` on buffers of every size up to one more than that of `expected`: one that is too small
// leaves the length as it was.
template <typename Encode>
void expectEncoding(const std::string& expected, const Encode& encode) {
    const std::uint64_t size = bytes(expected).size();
    for (std::uint64_t i = 0; i <= size + 1; ++i) {
        Bytes buffer(i);
        std::uint64_t length = i;
        ASSERT_EQ(encode(buffer.data(), &length), i < size ? DERBufferOverflow : DERSuccess) << "buffer of " << i;
        ASSERT_EQ(length, i < size ? i : size);
        EXPECT_TRUE(i < size || hexOf(buffer.data(), size) == expected) << hexOf(buffer);
    }
}

TEST(DEREncode, headersAreAsShortAsCanBe) {
    for (const auto& row : headers) {
        SCOPED_TRACE(row.identifier);
        expectEncoding(row.identifier, [&](std::uint8_t* buffer, std::uint64_t* length) {
            return DEREncodeTag(row.tag, buffer, length);
        });
        EXPECT_EQ(DERLengthOfLength(row.length), bytes(row.lengthOctets).size());
        expectEncoding(row.lengthOctets, [&](std::uint8_t* buffer, std::uint64_t* length) {
            return DEREncodeLength(row.length, buffer, length);
        });
        const std::string header = std::string(row.identifier) + " " + row.lengthOctets;
        expectEncoding(header, [&](std::uint8_t* buffer, std::uint64_t* length) {
            return DEREncodeHeaderSized(row.tag, row.length, buffer, *length, length);
        });
        if (row.length > 256)
            continue;
        const Bytes content(row.length, 0x5A);
        const std::string item = header + (content.empty() ? "" : " ") + hexOf(content);
        EXPECT_EQ(DERLengthOfItem(row.tag, row.length), bytes(item).size());
        expectEncoding(item, [&](std::uint8_t* buffer, std::uint64_t* length) {
            return DEREncodeItem(row.tag, row.length, content.data(), buffer, length);
        });
    }
}

struct Row {
    DERTag tag;
    unsigned options;
    const char* content;
};

// A record and its table, made from rows of a test table.
struct Object {
    explicit Object(const std::vector<Row>& rows) {
        for (const Row& row : rows) {
            contents.push_back(bytes(row.content));
            items.push_back(row.content == absent ? DERItem{} : itemOf(contents.back()));
            specs.push_back({(items.size() - 1) * sizeof(DERItem), row.tag, static_cast<std::uint16_t>(row.options)});
        }
    }
    std::uint16_t count() const { return static_cast<std::uint16_t>(specs.size()); }

    static constexpr const char* absent = "";
    std::vector<Bytes> contents;
    std::vector<DERItem> items;
    std::vector<DERItemSpec> specs;
};

TEST(DEREncode, sequencesFollowTheirTable) {
    const struct {
        std::string octets;
        std::vector<Row> rows;
        DERTag tag = DERTagSequence;
    } rows[] = {
        {"31 00", {}, DERTagSet},
        {"30 04 02 02 00 80", {{DERTagInteger, DEROptionSignedInteger, "80"}}},
        {"30 03 02 01 7F", {{DERTagInteger, DEROptionSignedInteger, "7F"}}},
        {"30 02 02 00", {{DERTagInteger, DEROptionSignedInteger, Object::absent}}},
        {"30 03 02 01 80", {{DERTagInteger, 0, "80"}}},
        {"30 03 01 01 FF",
         {{DERTagOctetString, DEROptionOptional, Object::absent}, {DERTagBoolean, DEROptionOptional, "FF"}}},
        {"30 02 04 00", {{DERTagOctetString, 0, Object::absent}}},
        {"30 06 30 03 02 01 05 80",
         {{DERTagBoolean, DEROptionWriteDER, "30 03 02 01 05"},
          {DERTagBoolean, DEROptionWriteDER, Object::absent},
          {DERTagInteger, DEROptionWriteDER | DEROptionSignedInteger, "80"}}},
        // The decoder's options mean nothing here.
        {"30 03 13 01 41", {{0x13, DEROptionAnyTag | DEROptionSkip | DEROptionSaveDER, "41"}}},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.octets);
        const Object object(row.rows);
        EXPECT_EQ(DERLengthOfEncodedSequence(row.tag, object.items.data(), object.count(), object.specs.data()),
                  bytes(row.octets).size());
        expectEncoding(row.octets, [&](std::uint8_t* buffer, std::uint64_t* length) {
            return DEREncodeSequence(row.tag, object.items.data(), object.count(), object.specs.data(), buffer, length);
        });
    }
}

TEST(DEREncode, rowsOutsideTheRecordAreRefused) {
    const DERItem items[5] = {};
    const std::tuple<std::uint64_t, std::uint64_t, DERReturn> rows[] = {
        {0x40, 0x50, DERSuccess},
        {0x40, 0x48, DERBufferOverflow},
        {0, 8, DERBufferOverflow},
        {UINT64_MAX - 15, 0x50, DERBufferOverflow},
        {UINT64_MAX - 7, UINT64_MAX, DERBufferOverflow},
    };
    for (const auto& [offset, objectSize, code] : rows) {
        SCOPED_TRACE(offset);
        const DERItemSpec specs[] = {{0, DERTagOctetString, 0}, {offset, DERTagOctetString, 0}};
        const bool good = code == DERSuccess;
        std::uint64_t size = 7;
        EXPECT_EQ(DERLengthOfSequenceContent(items, objectSize, 2, specs, &size), code);
        EXPECT_EQ(size, good ? 4 : 0);
        std::uint8_t buffer[64];
        std::uint64_t written = 7;
        EXPECT_EQ(DEREncodeSequenceFromObject(DERTagSet, items, objectSize, 2, specs, buffer, sizeof buffer, &written),
                  code);
        EXPECT_EQ(written, good ? 6 : 7);
    }
}

TEST(DEREncode, whatExceeds64BitsHasNoSize) {
    EXPECT_EQ(DERLengthOfItem(DERTagInteger, UINT64_MAX - 10), UINT64_MAX);
    EXPECT_EQ(DERLengthOfItem(DERTagInteger, UINT64_MAX - 9), 0U);
    const std::uint8_t octet = 0x80;
    const struct {
        DERItem items[2];
        unsigned options;
    } rows[] = {
        {{{&octet, UINT64_C(1) << 63}, {&octet, UINT64_C(1) << 63}}, DEROptionWriteDER},
        {{{&octet, 1}, {&octet, UINT64_MAX}}, 0},
        {{{&octet, 1}, {&octet, UINT64_MAX}}, DEROptionSignedInteger},
        {{{&octet, 1}, {&octet, UINT64_MAX - 5}}, DEROptionWriteDER},
    };
    for (const auto& row : rows) {
        const auto options = static_cast<std::uint16_t>(row.options);
        const DERItemSpec specs[] = {{0, DERTagInteger, options}, {sizeof(DERItem), DERTagInteger, options}};
        EXPECT_EQ(DERLengthOfEncodedSequence(DERTagSequence, row.items, 2, specs), 0U);
        std::uint8_t buffer[64];
        std::uint64_t length = sizeof buffer;
        EXPECT_EQ(DEREncodeSequence(DERTagSequence, row.items, 2, specs, buffer, &length), DERBufferOverflow);
        EXPECT_EQ(length, sizeof buffer);
    }
}

// A number whose highest bit is set gets its zero octet again.
TEST(DERItemSpecs, writeAKeyAsItWasRead) {
    const Hex modulus = "80", exponent = "83";
    const DERRSAPubKeyPKCS1 key = {modulus.item, exponent.item};
    expectEncoding("30 08 02 02 00 80 02 02 00 83", [&](std::uint8_t* buffer, std::uint64_t* length) {
        return DEREncodeSequence(DERTagSequence, &key, DERNumRSAPubKeyPKCS1ItemSpecs, DERRSAPubKeyPKCS1ItemSpecs,
                                 buffer, length);
    });
}

} // namespace
