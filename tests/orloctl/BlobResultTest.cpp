#include "tools/orloctl/BlobResult.h"

#include <functional>
#include <initializer_list>
#include <string>

#include <unistd.h>

#include "tests/support/TemporaryRoot.h"
#include "tests/sysconfig/Blob.h"

#include <gtest/gtest.h>

namespace {

std::string textOf(const Bytes& blob) {
    return {blob.begin(), blob.end()};
}

std::string holding(std::initializer_list<std::uint32_t> keys) {
    const sysconfig::SysConfig3Ptr object = newObject();
    for (const std::uint32_t key : keys)
        add(object, payloadData(key, {1}));
    return textOf(encode(object.get()));
}

void makeResult(const TemporaryRoot& root, const std::string& contents) {
    root.write("/tmp/new", contents);
    std::filesystem::rename(root.host("/tmp/new"), root.host(blobResultPath));
}

using Serve = std::function<void(const TemporaryRoot&)>;

Serve results(const std::string& contents) {
    return [contents](const TemporaryRoot& root) { makeResult(root, contents); };
}

const std::string whole = holding({keyWCh0, keyMiGB});

const struct {
    const char* name;
    Serve serve;         // what happens at the device while the request is served
    const char* problem; // empty for a result
    const char* model = "M12x";
    const char* note = "";
    uid_t otherUser = 0; // how far the service's user is from the one who runs the tests
    std::string input = {};
} cases[] = {
    {"new file", results(whole), ""},
    {"model without WCh0", results(holding({keyMiGB})), "", "Banana", "model Banana has no WCh0"},
    {"no WCh0", results(holding({keyMiGB})), "has no WCh0 entry, and model xM11 has one", "xM11"},
    {"no MiGB", results(holding({keyWCh0})), "has no MiGB entry"},
    {"no blob", results("text"), "is no configuration blob."},
    {"no input", results(""), "is empty: /blob is missing on the device"},
    {"input of text", results(""), "is empty: /blob is no configuration blob", "M12x", "", 0, "text"},
    {"protected input", results(""), "is empty: /blob needs a key", "M12x", "", 0,
     textOf(BlobParts{.version = bytes("02 00 03 00")}.whole())},
    {"nothing done", [](auto&) {}, "is that of an earlier request"},
    {"removed", [](auto& root) { std::filesystem::remove(root.host(blobResultPath)); }, "is missing"},
    {"another user's", results(whole), "belongs to another user", "M12x", "", 1},
    {"two names",
     [](auto& root) {
         makeResult(root, whole);
         std::filesystem::create_hard_link(root.host(blobResultPath), root.host("/tmp/other"));
     },
     "has a second name"},
    {"link",
     [](auto& root) {
         std::filesystem::rename(root.host(blobResultPath), root.host("/tmp/other"));
         root.link(blobResultPath, "/tmp/other");
     },
     "is no regular file"},
    {"FIFO",
     [](auto& root) {
         std::filesystem::remove(root.host(blobResultPath));
         ::mkfifo(root.host(blobResultPath).c_str(), 0600);
     },
     "is no regular file"},
};

TEST(BlobResult, isTheRequestsOwnOrAProblemThatSaysWhyNot) {
    for (const auto& row : cases) {
        SCOPED_TRACE(row.name);
        const TemporaryRoot root;
        // A folder on the way may be a link that stays on the device.
        root.makeDirectory("/private/tmp");
        root.link("/tmp", "private/tmp");
        root.describe(std::string(R"({"answers": {"HWModelStr": ")") + row.model + "\"}}");
        makeResult(root, whole);
        const BlobResult result;
        if (!row.input.empty())
            root.write("/blob", row.input);
        row.serve(root);
        const JudgedBlob judged = result.read(::geteuid() + row.otherUser, "/blob");
        EXPECT_NE(judged.problem.find(row.problem), std::string::npos) << judged.problem;
        EXPECT_EQ(judged.problem.empty(), *row.problem == '\0') << judged.problem;
        EXPECT_NE(judged.note.find(row.note), std::string::npos) << judged.note;
        EXPECT_EQ(judged.note.empty(), *row.note == '\0') << judged.note;
    }
}

} // namespace
