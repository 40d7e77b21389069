// Every allocation of the library fails in turn. The linker leads the library's calls of malloc and calloc here;
// OpenSSL, which computes the HMACs, takes its memory through the functions that main installs.
#include <cstdlib>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <openssl/crypto.h>

#include "platform/Crypto.h"
#include "sysconfig/SysConfig3Internal.h"
#include "tests/sysconfig/Blob.h"
#include "tests/sysconfig/Recorder.h"

namespace {

// Allocations until the one that fails. Negative while none shall fail.
int countdown = -1;
bool hasFailed = false;

bool mayAllocate() {
    if (countdown < 0)
        return true;
    if (countdown-- > 0)
        return true;
    hasFailed = true;
    return false;
}

} // namespace

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

void* allocateForOpenSSL(std::size_t size, const char*, int) {
    return mayAllocate() ? __real_malloc(size) : nullptr;
}

void* reallocateForOpenSSL(void* block, std::size_t size, const char*, int) {
    return mayAllocate() ? std::realloc(block, size) : nullptr;
}

void releaseForOpenSSL(void* block, const char*, int) {
    std::free(block);
}

std::uint8_t keyBytes[] = {'k', 'e', 'y'};
const SysConfigData key = {keyBytes, sizeof keyBytes};

bool reported = false;

// Does not allocate, unlike the recorder of the other tests.
SYSCONFIG3_PRINTF(2, 3) void noteReport(int, const char*, ...) {
    reported = true;
}

// Runs `operation` with the first allocation failing, then with the second, until it runs through. Each run must report
// the failure, unless it succeeds all the same, as OpenSSL does without some of its memory. Returns the number of
// failures.
template <typename Prepare, typename Operation, typename Check>
int failEach(Prepare prepare, Operation operation, Check check) {
    for (int failing = 0;; ++failing) {
        auto state = prepare();
        reported = false;
        hasFailed = false;
        setSysConfig3LogHandler(noteReport);
        countdown = failing;
        const bool success = operation(state);
        countdown = -1;
        setSysConfig3LogHandler(nullptr);
        if (!hasFailed) {
            EXPECT_TRUE(success);
            return failing;
        }
        EXPECT_TRUE(reported || success) << "allocation " << failing;
        check(state, success);
    }
}

// An object with all kinds of entry. Of version 0x30002 it has a key and valid HMACs.
SysConfig3Ptr filledObject(SysConfig3Version version) {
    SysConfig3Ptr object = newObject(version);
    if (version == 0x30002) {
        sysConfig3SetHMACKey(object.get(), key);
        sysConfig3UpdateHMAC(object.get());
    }
    // As many as the first index has room for, so that the next add makes it grow.
    for (std::uint32_t number = 0; number < 4; ++number) {
        const std::string name = std::to_string(number);
        sysConfig3AddPayloadEntry(object.get(), payloadData(keyWCh0 + number, {1, 2}).get());
        sysConfig3AddPayloadEntry(object.get(), payloadString(keyMiGB + number, "text").get());
        sysConfig3AddMetadataEntry(object.get(), metadataData(name.c_str(), {3}).get());
        sysConfig3AddMetadataEntry(object.get(), metadataString((name + "s").c_str(), "v").get());
    }
    return object;
}

std::string contentOf(const SysConfig3Ptr& object) {
    return payloadOf(object.get()) + "; " + metadataOf(object.get());
}

TEST(AllocationFailure, makesDecodeGiveNone) {
    const Bytes blob = encode(filledObject(0x30003).get());
    struct State {
        SysConfig3Ptr object;
    };
    const int failures = failEach([] { return State{}; },
                                  [&](State& state) {
                                      state.object = decode(blob);
                                      return state.object != nullptr;
                                  },
                                  [](const State&, bool success) { EXPECT_FALSE(success); });
    // The object, its manifests, sixteen entries and two indexes.
    EXPECT_GE(failures, 1 + 16 + 16 + 2);
}

TEST(AllocationFailure, makesAddFailAndChangeNothing) {
    const auto newPayload = payloadData(0x41414141, {9});
    const auto samePayload = payloadData(keyWCh0, {9});
    const auto newMetadata = metadataString("new", "v");
    const auto sameMetadata = metadataString("0", "v");
    const struct {
        const char* what;
        const __SysConfig3PayloadEntry* payload;
        const __SysConfig3MetadataEntry* metadata;
        int allocations;
    } rows[] = {
        {"a new payload key", newPayload.get(), nullptr, 2},
        {"a present payload key", samePayload.get(), nullptr, 2},
        {"a new metadata key", nullptr, newMetadata.get(), 2},
        {"a present metadata key", nullptr, sameMetadata.get(), 2},
    };
    for (const auto& row : rows) {
        const std::string before = contentOf(filledObject(0x30003));
        const int failures = failEach([] { return filledObject(0x30003); },
                                      [&](const SysConfig3Ptr& object) {
                                          return row.payload != nullptr
                                                     ? sysConfig3AddPayloadEntry(object.get(), row.payload)
                                                     : sysConfig3AddMetadataEntry(object.get(), row.metadata);
                                      },
                                      [&](const SysConfig3Ptr& object, bool success) {
                                          EXPECT_FALSE(success) << row.what;
                                          EXPECT_EQ(contentOf(object), before) << row.what;
                                      });
        EXPECT_EQ(failures, row.allocations) << row.what;
    }
}

TEST(AllocationFailure, leavesAKeyedObjectAsItWasOrChangedAndStale) {
    const std::string before = contentOf(filledObject(0x30002));
    const auto entry = payloadData(keyWCh0, {9});
    const int failures =
        failEach([] { return filledObject(0x30002); },
                 [&](const SysConfig3Ptr& object) { return sysConfig3AddPayloadEntry(object.get(), entry.get()); },
                 [&](const SysConfig3Ptr& object, bool success) {
                     EXPECT_EQ(contentOf(object) == before, !success);
                     EXPECT_TRUE(success || sysConfig3IsValidHMAC(object.get()));
                     EXPECT_TRUE(sysConfig3UpdateHMAC(object.get()));
                     EXPECT_TRUE(sysConfig3IsValidHMAC(object.get()));
                 });
    // Three validations and two recomputations, each of which asks OpenSSL for memory.
    EXPECT_GE(failures, 2 * 5);
}

TEST(AllocationFailure, makesHMACOperationsFail) {
    const auto prepare = [] { return filledObject(0x30002); };
    // Without some of its memory OpenSSL computes the right value all the same.
    const auto check = [](const SysConfig3Ptr& object, bool success) {
        EXPECT_TRUE(!success || sysConfig3IsValidHMAC(object.get()));
        EXPECT_TRUE(sysConfig3UpdateHMAC(object.get()));
        EXPECT_TRUE(sysConfig3IsValidHMAC(object.get()));
    };
    const auto update = [](const SysConfig3Ptr& object) { return sysConfig3UpdateHMAC(object.get()); };
    const auto validate = [](const SysConfig3Ptr& object) { return sysConfig3IsValidHMAC(object.get()); };
    EXPECT_GE(failEach(prepare, update, check), 2 * 3);
    EXPECT_GE(failEach(prepare, validate, check), 2 * 3);
}

TEST(AllocationFailure, leavesACreatedHMACWithoutData) {
    for (const auto create : {sysConfig3CreatePayloadHMAC, sysConfig3CreateMetadataHMAC, sysConfig3CreateFullHMAC}) {
        struct State {
            SysConfig3Ptr object = filledObject(0x30002);
            sysconfig::BytesPtr bytes;
            std::uint32_t length = 0;
        };
        failEach([] { return State{}; },
                 [=](State& state) {
                     SysConfigData out = {};
                     const bool success = create(state.object.get(), &out);
                     state.bytes.reset(out.data);
                     state.length = out.length;
                     return success;
                 },
                 [](const State& state, bool success) {
                     EXPECT_EQ(state.bytes != nullptr, success);
                     EXPECT_EQ(state.length, 32U);
                 });
    }
}

TEST(AllocationFailure, makesARegisteredKeyAbsent) {
    const int failures = failEach([] { return filledObject(0x30002); },
                                  [](const SysConfig3Ptr& object) { return sysConfig3SetHMACKey(object.get(), key); },
                                  [](const SysConfig3Ptr& object, bool success) {
                                      EXPECT_FALSE(success);
                                      EXPECT_EQ(object->hmacKey.data, nullptr);
                                      EXPECT_EQ(object->hmacKey.length, 0U);
                                  });
    EXPECT_EQ(failures, 1);
}

TEST(AllocationFailure, makesANewObjectNone) {
    struct State {
        SysConfig3Ptr object;
    };
    const int failures = failEach(
        [] { return State{}; },
        [](State& state) {
            state.object.reset(allocSysConfig3WithHMACKey(bCfg, 0x30002, key));
            return state.object != nullptr;
        },
        [](const State& state, bool success) { EXPECT_TRUE(!success || sysConfig3IsValidHMAC(state.object.get())); });
    // The object, two manifests of three HMACs, the key, and the computed HMACs.
    EXPECT_GE(failures, 1 + 2 * 4 + 1 + 3);
}

TEST(AllocationFailure, makesEncodeFailAndLeaveTheResultAlone) {
    static std::uint8_t octet = 9;
    struct State {
        SysConfig3Ptr object;
        SysConfigData out = {&octet, 1};
    };
    for (const SysConfig3Version version : {0x30002U, 0x30003U}) {
        const int failures = failEach([=] { return State{filledObject(version)}; },
                                      [](State& state) {
                                          const bool success = encodeSysConfig3(state.object.get(), &state.out);
                                          const sysconfig::BytesPtr owner(success ? state.out.data : nullptr);
                                          return success;
                                      },
                                      [](const State& state, bool success) {
                                          EXPECT_EQ(state.out.data == &octet && state.out.length == 1, !success);
                                      });
        // The blob itself, and what OpenSSL takes for three validations.
        EXPECT_GE(failures, sysConfig3HMACIsSupported(version) ? 1 + 2 * 3 : 1);
    }
}

TEST(AllocationFailure, isReportedByTheOperationThatMeetsIt) {
    const auto firstLineWhen = [](int failing, auto operation) {
        const Recorder recorder;
        countdown = failing;
        operation();
        countdown = -1;
        return Recorder::lines.empty() ? std::string() : Recorder::lines.front();
    };
    const SysConfig3Ptr object = filledObject(0x30003);
    const auto entry = payloadData(0x41414141, {9});
    const auto add = [&] { return sysConfig3AddPayloadEntry(object.get(), entry.get()); };
    EXPECT_EQ(firstLineWhen(0, add), "_allocSysConfig3PayloadEntryInternal: malloc failed.");
    EXPECT_EQ(firstLineWhen(1, add), "_sysConfig3AddPayloadEntry: malloc failed.");
    EXPECT_EQ(firstLineWhen(0, [&] { return sysConfig3SetHMACKey(object.get(), key); }),
              "sysConfig3SetHMACKey: malloc() returned NULL.");
    EXPECT_EQ(firstLineWhen(0, [] { return newObject(); }), "allocSysConfig3: malloc failed.");
    EXPECT_EQ(firstLineWhen(0, [&] { return encode(object.get()); }), "encodeSysConfig3: malloc failed.");
}

} // namespace

int main(int argc, char** argv) {
    CRYPTO_set_mem_functions(allocateForOpenSSL, reallocateForOpenSSL, releaseForOpenSSL);
    // OpenSSL sets itself up once, which is not what is tested here.
    const SysConfig3Ptr object(allocSysConfig3WithHMACKey(bCfg, 0x30002, key));
    testing::InitGoogleTest(&argc, argv);
    return object != nullptr ? RUN_ALL_TESTS() : 1;
}
