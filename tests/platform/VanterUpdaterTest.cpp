#include "platform/VanterUpdater.h"

#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "tests/support/TemporaryRoot.h"

namespace {

using UpdaterPtr = std::unique_ptr<VanterUpdater, decltype(&VanterUpdaterRelease)>;

constexpr const char* installedPath = "/var/lib/vanter/firmware.bin";

UpdaterPtr updater() {
    return {VanterUpdaterCreate({}, nullptr, "Vanter", nullptr), VanterUpdaterRelease};
}

// As each load of a patch asks, with an updater of its own.
bool isDone() {
    std::optional<Error> error;
    const bool done = VanterUpdaterIsDone(updater().get(), &error);
    EXPECT_FALSE(error);
    return done;
}

bool install(const std::string& firmware) {
    const Value options = Value::Dictionary{{"FirmwareData", Value::Data(firmware.begin(), firmware.end())}};
    Value output;
    return VanterUpdaterExecCommand(updater().get(), "performNextStage", options, &output, nullptr);
}

class VanterUpdaterTest : public testing::Test {
protected:
    VanterUpdaterTest() {
        root_.write(installedPath, "as delivered");
        root_.write("/path", installedPath);
        describe(R"("firmware": {"$file": "/path", "as": "text"})");
    }

    void describe(const std::string& chip) const {
        root_.write("/etc/veltra/device.json", R"({"vanter": {)" + chip + "}}");
    }

    TemporaryRoot root_;
};

TEST_F(VanterUpdaterTest, aChipIsDoneForAsLongAsItHasWhatWasInstalled) {
    EXPECT_FALSE(isDone());
    EXPECT_TRUE(install("patch"));
    EXPECT_TRUE(isDone());
    const std::pair<const char*, std::function<void()>> rows[] = {
        {"another part", [&] { root_.write(installedPath, "other"); }},
        {"a part without firmware", [&] { std::filesystem::remove(root_.host(installedPath)); }},
        {"a part at another place", [&] { describe(R"("firmware": "/var/lib/vanter/other.bin")"); }},
        {"a chip that names no firmware", [&] { describe(""); }},
    };
    for (const auto& [name, swap] : rows) {
        swap();
        EXPECT_FALSE(isDone()) << name;
        describe(R"("firmware": "/var/lib/vanter/firmware.bin")");
        root_.write(installedPath, "patch");
        EXPECT_TRUE(isDone()) << name;
    }
    EXPECT_TRUE(install("second patch"));
    EXPECT_TRUE(isDone());
    root_.write(installedPath, "patch");
    EXPECT_FALSE(isDone());
}

TEST_F(VanterUpdaterTest, theDescriptionAloneMakesAChipDoneToo) {
    describe(R"("done": true)");
    EXPECT_TRUE(isDone());
    describe(R"("done": "yes")");
    EXPECT_FALSE(isDone());
}

TEST_F(VanterUpdaterTest, whatCouldNotBeInstalledLeavesTheChipAsItWas) {
    std::optional<Error> error;
    EXPECT_FALSE(VanterUpdaterExecCommand(updater().get(), "performNextStage", {}, nullptr, &error));
    EXPECT_EQ(error->domain, "VanterUpdaterErrorDomain");
    describe(R"("firmware": "/missing/directory/firmware.bin")");
    EXPECT_FALSE(install("third patch"));
    EXPECT_FALSE(isDone());
    describe(R"("firmware": "/var/lib/vanter/firmware.bin", "fail": "performNextStage")");
    EXPECT_FALSE(install("third patch"));
    EXPECT_FALSE(isDone());
    EXPECT_EQ(root_.read(installedPath), "as delivered");
}

TEST_F(VanterUpdaterTest, updatersOfSeveralThreadsShareTheChip) {
    std::vector<std::thread> threads(4);
    for (std::thread& thread : threads)
        thread = std::thread([] {
            for (int round = 0; round < 20; ++round) {
                EXPECT_TRUE(install("same patch"));
                EXPECT_TRUE(isDone());
            }
        });
    for (std::thread& thread : threads)
        thread.join();
}

} // namespace
