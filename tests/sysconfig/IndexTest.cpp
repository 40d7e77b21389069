// The index of the lists: what keys of an adversary do to it.
#include <cstdint>
#include <string>
#include <tuple>

#include <gtest/gtest.h>

#include "sysconfig/SysConfig3Internal.h"
#include "tests/sysconfig/Blob.h"

namespace {

using sysconfig::SysConfig3Ptr;

// The number of entries that looking up every key once would pass.
template <typename List>
std::uint64_t costOfAllLookups(const List& list) {
    std::uint64_t cost = 0;
    for (std::uint64_t bucket = 0; bucket < list.bucketCount(); ++bucket) {
        std::uint64_t length = 0;
        for (const auto* entry = list.buckets[bucket]; entry != nullptr; entry = entry->bucketNext)
            cost += ++length;
    }
    return cost;
}

BlobParts withPayloadKeys(std::uint32_t count, std::uint32_t (*keyOf)(std::uint32_t)) {
    Bytes entries;
    for (std::uint32_t i = 0; i < count; ++i) {
        const std::uint32_t key = keyOf(i);
        entries.insert(entries.end(), {0x30, 0x0B, 0x02, 0x04, static_cast<std::uint8_t>(key),
                                       static_cast<std::uint8_t>(key >> 8), static_cast<std::uint8_t>(key >> 16),
                                       static_cast<std::uint8_t>(key >> 24), 0x16, 0x00, 0x01, 0x01, 0xFF});
    }
    return {.payload = item("31", entries)};
}

TEST(Index, standsAMillionKeysOfAnAdversary) {
    constexpr std::uint32_t million = 1000000;
    const std::tuple<const char*, std::uint32_t (*)(std::uint32_t), std::uint32_t> rows[] = {
        {"consecutive", [](std::uint32_t i) { return i + 1; }, million},
        {"equal in the low bits", [](std::uint32_t i) { return (i + 1) << 12; }, million},
        {"evenly spaced", [](std::uint32_t i) { return (i + 1) * 4095; }, million},
        {"equal in the middle", [](std::uint32_t i) { return (i & 0xFFF) | (i >> 12 | 0x100) << 22; }, million},
        {"all equal", [](std::uint32_t) { return keyWCh0; }, 1},
    };
    for (const auto& [what, keyOf, count] : rows) {
        const SysConfig3Ptr object = decodeParts(withPayloadKeys(million, keyOf));
        ASSERT_EQ(sysConfig3GetPayloadEntryCount(object.get()), count) << what;
        // An entry costs 1, and chance collisions add a half to that.
        EXPECT_LT(costOfAllLookups(object->payload), 2 * count) << what;
    }
}

TEST(Index, spreadsMetadataKeysToo) {
    constexpr std::uint32_t count = 30000;
    const SysConfig3Ptr object = newObject();
    for (std::uint32_t i = 0; i < count; ++i)
        ASSERT_TRUE(add(object, metadataString(std::to_string(i << 8).c_str(), "")));
    EXPECT_EQ(sysConfig3GetMetadataEntryCount(object.get()), count);
    EXPECT_LT(costOfAllLookups(object->metadata), 2 * count);
}

TEST(Index, hasASecretOfTheObjectsOwn) {
    const SysConfig3Ptr a = newObject();
    const SysConfig3Ptr b = newObject();
    EXPECT_NE(sysconfig::hashOf(a->secret, keyWCh0), sysconfig::hashOf(b->secret, keyWCh0));
}

} // namespace
