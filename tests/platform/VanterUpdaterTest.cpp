#include "platform/VanterUpdater.h"

#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include <gtest/gtest.h>

#include "tests/support/TemporaryRoot.h"

namespace {

constexpr const char* installedPath = "/var/lib/vanter/firmware.bin";

// As each load of a patch asks.
bool isDone() {
    std::optional<Error> error;
    const bool done = VanterUpdaterIsDone(nullptr, &error);
    EXPECT_FALSE(error);
    return done;
}

// With an updater of its own.
bool install(const Value& options, std::optional<Error>* error = nullptr) {
    const std::unique_ptr<VanterUpdater, decltype(&VanterUpdaterRelease)> updater(
        VanterUpdaterCreate({}, nullptr, "Vanter", nullptr), VanterUpdaterRelease);
    return VanterUpdaterExecCommand(updater.get(), "performNextStage", options, nullptr, error);
}

const Value patch = Value::Dictionary{{"FirmwareData", Value::Data{'p', 'a', 't', 'c', 'h'}}};

class VanterUpdaterTest : public testing::Test {
protected:
    VanterUpdaterTest() {
        root_.write(installedPath, "as delivered");
        root_.write("/path", installedPath);
        describe(R"("firmware": {"$file": "/path", "as": "text"})");
    }

    void describe(const std::string& chip) const { root_.describe(R"({"vanter": {)" + chip + "}}"); }

    TemporaryRoot root_;
};

TEST_F(VanterUpdaterTest, aChipIsDoneForAsLongAsItHasWhatWasInstalled) {
    EXPECT_FALSE(isDone());
    EXPECT_TRUE(install(patch));
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
    EXPECT_TRUE(install(Value::Dictionary{{"FirmwareData", Value::Data{'2'}}}));
    root_.write(installedPath, "patch");
    EXPECT_FALSE(isDone());
    describe(R"("done": true)");
    EXPECT_TRUE(isDone());
}

TEST_F(VanterUpdaterTest, whatCouldNotBeInstalledLeavesTheChipAsItWas) {
    std::optional<Error> error;
    EXPECT_FALSE(install({}, &error));
    EXPECT_EQ(error->domain, "VanterUpdaterErrorDomain");
    for (const char* chip : {R"("firmware": "/missing/directory/firmware.bin")",
                             R"("firmware": "/var/lib/vanter/firmware.bin", "fail": "performNextStage")"}) {
        describe(chip);
        EXPECT_FALSE(install(patch)) << chip;
        EXPECT_FALSE(isDone()) << chip;
    }
    EXPECT_EQ(root_.read(installedPath), "as delivered");
}

} // namespace
