// Every allocation of the library fails in turn. The linker leads the library's calls of malloc and calloc here;
// OpenSSL, which computes the HMACs, is led by main.
#include <cstdlib>
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

void* __wrap_malloc(std::size_t size) {
    return mayAllocate() ? __real_malloc(size) : nullptr;
}

void* __wrap_calloc(std::size_t count, std::size_t size) {
    return mayAllocate() ? __real_calloc(count, size) : nullptr;
}
}

namespace {

using sysconfig::SysConfig3Ptr;

bool reported = false;

// Does not allocate, unlike the recorder of the other tests.
SYSCONFIG3_PRINTF(2, 3) void noteReport(int, const char*, ...) {
    reported = true;
}

// Runs `operation` with the allocation of the given number failing, if there is one. It must report the failure, unless
// it succeeds all the same, as OpenSSL does without some of its memory.
template <typename Operation>
bool run(int failing, Operation operation) {
    reported = false;
    setSysConfig3LogHandler(noteReport);
    failAllocation(failing + 1);
    const bool success = operation();
    failAllocation(0);
    setSysConfig3LogHandler(nullptr);
    EXPECT_TRUE(success || (allocationHasFailed() && reported)) << "allocation " << failing;
    return success;
}

// Calls `test` with 0, then with 1, until nothing has failed. Returns the number of failures.
template <typename Test>
int failEach(Test test) {
    int failing = 0;
    for (test(failing); allocationHasFailed(); test(failing))
        ++failing;
    return failing;
}

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

TEST(AllocationFailure, makesDecodeGiveNone) {
    const Bytes blob = encode(filledObject(0x30003));
    const int failures = failEach([&](int failing) {
        SysConfig3Ptr object;
        const bool success = run(failing, [&] { return (object = decode(blob)) != nullptr; });
        EXPECT_EQ(success, !allocationHasFailed());
    });
    // The object, two manifests of three HMACs, sixteen entries and two indexes.
    EXPECT_GE(failures, 1 + 2 * 4 + 16 + 2);
}

TEST(AllocationFailure, makesAddFailAndChangeNothing) {
    const std::string before = contentOf(filledObject(0x30003));
    const auto expectTwoFailures = [&](const auto& entry) {
        const int failures = failEach([&](int failing) {
            const SysConfig3Ptr object = filledObject(0x30003);
            const bool success = run(failing, [&] { return add(object, entry); });
            EXPECT_EQ(success, !allocationHasFailed());
            EXPECT_EQ(contentOf(object) == before, allocationHasFailed());
        });
        EXPECT_EQ(failures, 2);
    };
    expectTwoFailures(payloadData(0x41414141, {9}));
    expectTwoFailures(payloadData(keyWCh0, {9})); // a present key
    expectTwoFailures(metadataString("new", "v"));
    expectTwoFailures(metadataString("0", "v")); // a present key
}

TEST(AllocationFailure, leavesAKeyedObjectAsItWasOrChangedAndStale) {
    const std::string before = contentOf(filledObject(0x30002));
    const auto entry = payloadData(keyWCh0, {9});
    const int failures = failEach([&](int failing) {
        const SysConfig3Ptr object = filledObject(0x30002);
        const bool success = run(failing, [&] { return add(object, entry); });
        EXPECT_EQ(contentOf(object) == before, !success);
        EXPECT_TRUE(success || sysConfig3IsValidHMAC(object.get()));
        EXPECT_TRUE(sysConfig3UpdateHMAC(object.get()));
        EXPECT_TRUE(sysConfig3IsValidHMAC(object.get()));
    });
    // Three validations and two recomputations, each of which asks OpenSSL for memory.
    EXPECT_GE(failures, 2 * 5);
}

TEST(AllocationFailure, leavesACreatedHMACWithoutData) {
    const SysConfig3Ptr object = filledObject(0x30002);
    for (const auto create : {sysConfig3CreatePayloadHMAC, sysConfig3CreateMetadataHMAC, sysConfig3CreateFullHMAC}) {
        failEach([&](int failing) {
            SysConfigData out = {};
            const bool success = run(failing, [&] { return create(object.get(), &out); });
            const sysconfig::BytesPtr owner(out.data);
            EXPECT_EQ(out.data != nullptr, success);
            EXPECT_EQ(out.length, 32U);
        });
    }
}

TEST(AllocationFailure, makesARegisteredKeyAbsent) {
    const int failures = failEach([](int failing) {
        const SysConfig3Ptr object = filledObject(0x30002);
        const bool success = run(failing, [&] { return sysConfig3SetHMACKey(object.get(), hmacKey); });
        EXPECT_EQ(success, !allocationHasFailed());
        EXPECT_EQ(object->hmacKey.data == nullptr && object->hmacKey.length == 0, allocationHasFailed());
    });
    EXPECT_EQ(failures, 1);
}

TEST(AllocationFailure, makesANewObjectNone) {
    const int failures = failEach([](int failing) {
        SysConfig3Ptr object;
        const auto make = [&] {
            object.reset(allocSysConfig3WithHMACKey(bCfg, 0x30002, hmacKey));
            return object != nullptr;
        };
        EXPECT_TRUE(!run(failing, make) || sysConfig3IsValidHMAC(object.get()));
    });
    // The object, a manifest of three HMACs, the key, and the computed HMACs.
    EXPECT_GE(failures, 1 + 4 + 1 + 3);
}

TEST(AllocationFailure, makesEncodeFailAndLeaveTheResultAlone) {
    for (const SysConfig3Version version : {0x30002U, 0x30003U}) {
        const SysConfig3Ptr object = filledObject(version);
        const int failures = failEach([&](int failing) {
            std::uint8_t octet = 9;
            SysConfigData out = {&octet, 1};
            const bool success = run(failing, [&] { return encodeSysConfig3(object.get(), &out); });
            const sysconfig::BytesPtr owner(success ? out.data : nullptr);
            EXPECT_EQ(out.data == &octet && out.length == 1, !success);
        });
        // The blob itself, and what OpenSSL takes for three validations.
        EXPECT_GE(failures, sysConfig3HMACIsSupported(version) ? 1 + 2 * 3 : 1);
    }
}

TEST(AllocationFailure, isReportedByTheOperationThatMeetsIt) {
    const auto firstLineWhen = [](int failing, auto operation) {
        const Recorder recorder;
        failAllocation(failing + 1);
        operation();
        failAllocation(0);
        return Recorder::lines.empty() ? std::string() : Recorder::lines.front();
    };
    const SysConfig3Ptr object = filledObject(0x30003);
    const auto entry = payloadData(0x41414141, {9});
    const auto addEntry = [&] { return add(object, entry); };
    EXPECT_EQ(firstLineWhen(0, addEntry), "_allocSysConfig3PayloadEntryInternal: malloc failed.");
    EXPECT_EQ(firstLineWhen(1, addEntry), "_sysConfig3AddPayloadEntry: malloc failed.");
    EXPECT_EQ(firstLineWhen(0, [&] { return sysConfig3SetHMACKey(object.get(), hmacKey); }),
              "sysConfig3SetHMACKey: malloc() returned NULL.");
    EXPECT_EQ(firstLineWhen(0, [] { return newObject(); }), "allocSysConfig3: malloc failed.");
    EXPECT_EQ(firstLineWhen(0, [&] { return encode(object); }), "encodeSysConfig3: malloc failed.");
}

} // namespace

int main(int argc, char** argv) {
    failAllocationsOfOpenSSL();
    // OpenSSL sets itself up once, which is not what is tested here.
    const SysConfig3Ptr object(allocSysConfig3WithHMACKey(bCfg, 0x30002, hmacKey));
    testing::InitGoogleTest(&argc, argv);
    return object != nullptr ? RUN_ALL_TESTS() : 1;
}
