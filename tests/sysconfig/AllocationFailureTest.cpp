// Every allocation of the library fails in turn, and what it gives back is looked at. The linker leads the library's
// calls of malloc, calloc and free here; OpenSSL, which computes the HMACs, is led by main.
#include <cstdlib>
#include <functional>
#include <string>

#include <gtest/gtest.h>

#include "platform/Crypto.h"
#include "sysconfig/SysConfig3Internal.h"
#include "tests/support/FailingAllocation.h"
#include "tests/sysconfig/Blob.h"
#include "tests/sysconfig/Recorder.h"

extern "C" {
void* __real_malloc(std::size_t size);
void* __real_calloc(std::size_t count, std::size_t size);
void __real_free(void* memory);

void* __wrap_malloc(std::size_t size) {
    return mayAllocate() ? __real_malloc(size) : nullptr;
}

void* __wrap_calloc(std::size_t count, std::size_t size) {
    return mayAllocate() ? __real_calloc(count, size) : nullptr;
}

// What three octets of memory hold when they are given back.
void* watched = nullptr;
std::string given = "nothing";

void __wrap_free(void* memory) {
    if (memory != nullptr && memory == watched)
        given = hexOf(static_cast<const std::uint8_t*>(memory), 3);
    __real_free(memory);
}
}

namespace {

using sysconfig::SysConfig3Ptr;

// An object with all kinds of entry. Of version 0x30002 it has a key and valid HMACs.
SysConfig3Ptr filledObject(SysConfig3Version version) {
    SysConfig3Ptr object = newObject(version);
    if (version == 0x30002) {
        sysConfig3SetHMACKey(object.get(), hmacKey);
        sysConfig3UpdateHMAC(object.get());
    }
    // As many as the first index has room for, so that the next add makes it grow.
    for (std::uint32_t number = 0; number < 4; ++number) {
        const std::string name = std::to_string(number);
        add(object, payloadData(keyWCh0 + number, {1, 2}));
        add(object, payloadString(keyMiGB + number, "text"));
        add(object, metadataData(name.c_str(), {3}));
        add(object, metadataString((name + "s").c_str(), "v"));
    }
    return object;
}

std::string contentOf(const SysConfig3Ptr& object) {
    return payloadOf(object) + "; " + metadataOf(object);
}

// An operation on a filled object. One of version 0x30002 asks OpenSSL too, which succeeds without some of its memory.
struct Row {
    const char* name;
    SysConfig3Version version;
    std::function<bool(const SysConfig3Ptr&)> operation;
};

// Runs the operation with the allocation of the given number failing, if there is one.
void run(const Row& row, int failing) {
    SCOPED_TRACE(std::string(row.name) + ", allocation " + std::to_string(failing));
    const SysConfig3Ptr object = filledObject(row.version);
    const std::string before = contentOf(object);
    const Recorder recorder;
    failAllocation(failing);
    const bool success = row.operation(object);
    failAllocation(0);
    EXPECT_TRUE(success || (allocationHasFailed() && !Recorder::said.empty() && contentOf(object) == before));
    EXPECT_TRUE(success != allocationHasFailed() || row.version == 0x30002);
    if (row.version != 0x30002)
        return;
    // It is as it was, or changed and stale.
    EXPECT_TRUE(success || sysConfig3IsValidHMAC(object.get()));
    EXPECT_TRUE(sysConfig3UpdateHMAC(object.get()) && sysConfig3IsValidHMAC(object.get()));
}

std::function<bool(const SysConfig3Ptr&)> adding(const auto& entry) {
    return [&entry](const SysConfig3Ptr& object) { return add(object, entry); };
}

// Calls what gives bytes, which leaves `failed` behind where it fails.
std::function<bool(const SysConfig3Ptr&)> giving(bool (*give)(const __SysConfig3*, SysConfigData*),
                                                 const SysConfigData& failed = {nullptr, 32}) {
    return [give, failed](const SysConfig3Ptr& object) {
        SysConfigData out = hmacKey;
        const bool success = give(object.get(), &out);
        const sysconfig::BytesPtr owner(success ? out.data : nullptr);
        EXPECT_EQ(out.data == failed.data && out.length == failed.length, !success);
        return success;
    };
}

bool registerKey(const SysConfig3Ptr& object) {
    const bool success = sysConfig3SetHMACKey(object.get(), hmacKey);
    EXPECT_EQ(object->hmacKey.data == nullptr && object->hmacKey.length == 0, !success);
    return success;
}

TEST(AllocationFailure, isReportedAndLeavesEverythingAsItWas) {
    const Bytes blob = encode(filledObject(0x30003).get());
    const auto payload = payloadData(0x41414141, {9}), presentPayload = payloadData(keyWCh0, {9});
    const auto metadata = metadataString("new", "v");
    const auto decodeWhole = [&](const SysConfig3Ptr&) {
        SysConfig3Refusal why;
        const SysConfig3Ptr decoded(
            decodeSysConfig3Explained(blob.data(), static_cast<std::uint32_t>(blob.size()), &why));
        EXPECT_EQ(why.status, decoded != nullptr ? DERSuccess : DERBufferOverflow);
        return decoded != nullptr;
    };
    const auto makeObject = [](const SysConfig3Ptr&) { return newObject() != nullptr; };
    const auto makeKeyedObject = [](const SysConfig3Ptr&) {
        return SysConfig3Ptr(allocSysConfig3WithHMACKey(bCfg, 0x30002, hmacKey)) != nullptr;
    };
    const Row rows[] = {
        {"decode", 0x30003, decodeWhole},
        {"new payload entry", 0x30003, adding(payload)},
        {"payload entry of a present key", 0x30003, adding(presentPayload)},
        {"new metadata entry", 0x30003, adding(metadata)},
        {"entry of a keyed object", 0x30002, adding(presentPayload)},
        {"HMAC", 0x30002, giving(sysConfig3CreateFullHMAC)},
        {"key", 0x30003, registerKey},
        {"new object", 0x30003, makeObject},
        {"new keyed object", 0x30002, makeKeyedObject},
        {"encode", 0x30003, giving(encodeSysConfig3, hmacKey)},
        {"encode of a keyed object", 0x30002, giving(encodeSysConfig3, hmacKey)},
    };
    for (const Row& row : rows) {
        int failing = 0;
        do
            run(row, ++failing);
        while (allocationHasFailed());
        EXPECT_GT(failing, 1) << row.name;
    }
}

TEST(HMACKey, isOverwrittenBeforeItsMemoryIsGivenBack) {
    void (*const releases[])(SysConfig3Ptr&) = {
        [](SysConfig3Ptr& object) { sysConfig3SetHMACKey(object.get(), {}); },
        [](SysConfig3Ptr& object) { object.reset(); },
    };
    for (const auto release : releases) {
        SysConfig3Ptr object(allocSysConfig3WithHMACKey(bCfg, 0x30002, hmacKey));
        given = "nothing";
        watched = object->hmacKey.data;
        release(object);
        watched = nullptr;
        EXPECT_EQ(given, "00 00 00");
    }
}

} // namespace

int main(int argc, char** argv) {
    failAllocationsOfOpenSSL();
    // OpenSSL sets itself up once, which is not what is tested here.
    const SysConfig3Ptr object(allocSysConfig3WithHMACKey(bCfg, 0x30002, hmacKey));
    testing::InitGoogleTest(&argc, argv);
    return object != nullptr ? RUN_ALL_TESTS() : 1;
}
