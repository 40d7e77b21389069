// The data-store library on a real database, in a device root of its own.
#include "platform/OrloDataStore.h"

#include <csignal>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/Format.h"
#include "tests/support/OwnProcess.h"
#include "tests/support/TemporaryRoot.h"

namespace {

int flushes = 0;

} // namespace

// What SQLite flushes a file with.
extern "C" __attribute__((visibility("default"))) int fdatasync(int descriptor) {
    ++flushes;
    return static_cast<int>(::syscall(SYS_fdatasync, descriptor));
}

namespace {

using Data = Value::Data;

constexpr char storePath[] = "/var/lib/orlo/store.db";
constexpr char trustPath[] = "/var/lib/orlo/store.db.trust";

const Value::Dictionary options = {{"APTicket", Data{'t'}}, {"DataVersion", 1}};

struct Release {
    void operator()(__QDOrlo* session) const { QDSupportSafeRelease(session); }
};
using Session = std::unique_ptr<__QDOrlo, Release>;

Session open(const Value::Dictionary& with = options) {
    return Session(QDOrloCreateWithOptions(with));
}

void trust(const Session& session) {
    Data object;
    Data digest(32);
    ASSERT_TRUE(QDOrloDataCopyTrustObject(session.get(), "http://ca/orlotrustobject", &object, nullptr));
    ASSERT_EQ(QDSupportDigestSha256(object.data(), static_cast<std::uint32_t>(object.size()), digest.data()), 0);
    QDOrloSetOption(session.get(), "TrustObjectDigest", digest);
}

// A session that may do everything with this record.
Session openFor(const Value& dataClass, const Value& instance, const Value::Dictionary& with = options) {
    Session session = open(with);
    if (!session)
        return session;
    trust(session);
    std::string permissions;
    for (const OrloAction action : {OrloActionGet, OrloActionPut, OrloActionExport})
        EXPECT_TRUE(QDOrloAppendPermissionsString(action, dataClass, instance, permissions));
    QDOrloSetOption(session.get(), "Permissions", permissions);
    return session;
}

std::int64_t codeOf(const std::optional<Error>& error) {
    EXPECT_TRUE(!error || (error->domain == "QDOrloErrorDomain" && !error->text.empty()));
    return error ? error->code : 0;
}

std::int64_t put(const Session& session, const Value& dataClass, const Value& instance, const Data& data) {
    std::optional<Error> error;
    const bool stored = QDOrloDataPut(session.get(), dataClass, instance, data, &error);
    EXPECT_EQ(stored, !error);
    return codeOf(error);
}

// The record, or as a number the code of the error.
Value get(const Session& session, const Value& dataClass, const Value& instance) {
    std::optional<Error> error;
    const std::optional<Data> data = QDOrloDataCopy(session.get(), dataClass, instance, &error);
    EXPECT_EQ(data.has_value(), !error);
    return data ? Value(*data) : Value(codeOf(error));
}

std::int64_t exportAll(const Session& session, const Value::Array& classes, const Value::Array& instances) {
    std::optional<Error> error;
    const bool exported = QDOrloDataMultiExport(session.get(), classes, instances, &error);
    EXPECT_EQ(exported, !error);
    return codeOf(error);
}

class OrloDataStore : public testing::Test {
protected:
    OrloDataStore() {
        describeStore("{}");
        logged().clear();
        QDOrloLogSetHandler([](void*, const char* message) { logged().push_back(message); });
    }
    ~OrloDataStore() override { QDOrloLogSetHandler(nullptr); }

    static std::vector<std::string>& logged() {
        static std::vector<std::string> lines;
        return lines;
    }

    void describeStore(const std::string& json) { root_.write("/etc/veltra/device.json", "{\"store\": " + json + "}"); }

    // The one line of the log that says why no session can be made.
    static std::string refusal(const Value::Dictionary& with = options) {
        logged().clear();
        EXPECT_EQ(open(with), nullptr);
        EXPECT_EQ(logged().size(), 1U);
        return logged().empty() ? "" : logged()[0];
    }

    // Runs statements on the database as anyone could; the rows' columns, joined by "|".
    std::vector<std::string> sql(const std::string& statements) const {
        std::vector<std::string> rows;
        sqlite3* database = nullptr;
        EXPECT_EQ(sqlite3_open(root_.host(storePath).c_str(), &database), SQLITE_OK);
        const auto onRow = [](void* context, int count, char** columns, char**) {
            std::string row;
            for (int i = 0; i < count; ++i)
                (row += i == 0 ? "" : "|") += columns[i] ? columns[i] : "NULL";
            static_cast<std::vector<std::string>*>(context)->push_back(row);
            return 0;
        };
        EXPECT_EQ(sqlite3_exec(database, statements.c_str(), onRow, &rows, nullptr), SQLITE_OK)
            << sqlite3_errmsg(database);
        sqlite3_close(database);
        return rows;
    }

    TemporaryRoot root_;
};

TEST_F(OrloDataStore, grantsNameAnActionAndARecordAndCannotBeForged) {
    const Session session = open();
    const struct {
        std::int32_t action;
        Value dataClass, instance, grant;
    } rows[] = {
        {OrloActionPut, "psd2", "S1", "1:psd2:S1"},
        {OrloActionGet, "psd2", "a:b", "0:psd2:a:b"},
        {-7, "c", "(null)-é", "-7:c:(null)-é"},
        {OrloActionPut, {}, "S1", {}},
        {OrloActionPut, "psd2", {}, {}},
        {OrloActionPut, "", "S1", {}},
        {OrloActionPut, "psd2", "", {}},
        {OrloActionPut, "psd2", 17, {}},
        {OrloActionPut, "psd2", Data{'S'}, {}},
        {OrloActionPut, "ps:2", "S1", {}},
        {OrloActionPut, "psd2", "S1;1:psd2:S2", {}},
    };
    std::string all = "first";
    for (const auto& row : rows) {
        SCOPED_TRACE(row.grant.description());
        EXPECT_EQ(QDOrloDataCreatePermissionsString(session.get(), row.action, row.dataClass, row.instance), row.grant);
        EXPECT_EQ(QDOrloDataCreatePermissionsString(nullptr, row.action, row.dataClass, row.instance), Value());
        const std::string before = all;
        EXPECT_EQ(QDOrloAppendPermissionsString(row.action, row.dataClass, row.instance, all), !row.grant.isNothing());
        EXPECT_EQ(all, row.grant.text() ? before + ";" + *row.grant.text() : before);
    }
}

TEST_F(OrloDataStore, refusesWhatTheSessionHasNoGrantForOrDoesNotTrust) {
    const Session session = openFor("psd2", "S1");
    ASSERT_EQ(put(session, "psd2", "S1", {'r'}), 0);
    const struct {
        Value permissions, digest;
        std::int64_t code;
    } rows[] = {
        {{}, {}, 1},
        {"", {}, 1},
        {"1:psd2:S2;0:psd2:S2;3:psd2:S2", {}, 1},
        {"1:psd2:S11;x0:psd2:S1;3:psd2:S1 ", {}, 1},
        {"11:psd2:S1;10:psd2:S1; 3:psd2:S1", {}, 1},
        {Data{'1'}, {}, 1},
        {"0:psd2:S1;1:psd2:S1;3:psd2:S1", {}, 2},
        {"0:psd2:S1;1:psd2:S1;3:psd2:S1", Data(32), 2},
        {"0:psd2:S1;1:psd2:S1;3:psd2:S1", Data{}, 2},
        {"0:psd2:S1;1:psd2:S1;3:psd2:S1", "text", 2},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.permissions.description() + row.digest.description());
        QDOrloSetOption(session.get(), "Permissions", row.permissions);
        QDOrloSetOption(session.get(), "TrustObjectDigest", row.digest);
        EXPECT_EQ(put(session, "psd2", "S1", {'x'}), row.code);
        EXPECT_EQ(get(session, "psd2", "S1"), Value(row.code));
        EXPECT_EQ(exportAll(session, {"psd2"}, {"S1"}), row.code);
    }
    EXPECT_EQ(get(openFor("psd2", "S1"), "psd2", "S1"), Value(Data{'r'}));
    EXPECT_EQ(sql("SELECT count(*) FROM exports"), std::vector<std::string>{"0"});

    // Another trust object ends the trust of a session that has the digest of the one before, and that at once.
    const Session before = openFor("psd2", "S1");
    root_.write(trustPath, "another");
    EXPECT_EQ(put(before, "psd2", "S1", {'x'}), 2);
    Data object;
    ASSERT_TRUE(QDOrloDataCopyTrustObject(before.get(), "", &object, nullptr));
    EXPECT_EQ(object, (Data{'a', 'n', 'o', 't', 'h', 'e', 'r'}));
    EXPECT_EQ(put(before, "psd2", "S1", {'x'}), 2);
    trust(before);
    EXPECT_EQ(put(before, "psd2", "S1", {'x'}), 0);
    EXPECT_EQ(put(nullptr, "psd2", "S1", {'x'}), 1);
    EXPECT_EQ(put(before, "psd2", "S\n1", {'x'}), 1);
    EXPECT_EQ(logged().back(), "Put: The session has no grant for action 1 on psd2 of S\\n1");
    QDOrloSetOption(nullptr, "Permissions", "");
}

TEST_F(OrloDataStore, keepsRecordsByClassInstanceAndDataVersion) {
    const Data large(100'000, 0xA5);
    for (const Data& data : {Data{}, Data{0}, large, Data{1, 0, 2}}) {
        EXPECT_EQ(put(openFor("psd2", "S1"), "psd2", "S1", data), 0);
        EXPECT_EQ(get(openFor("psd2", "S1"), "psd2", "S1"), Value(data));
    }
    EXPECT_EQ(get(openFor("psd2", "S2"), "psd2", "S2"), Value(3));
    EXPECT_EQ(get(openFor("psd1", "S1"), "psd1", "S1"), Value(3));
    Value::Dictionary second = options;
    second["DataVersion"] = 2;
    EXPECT_EQ(get(openFor("psd2", "S1", second), "psd2", "S1"), Value(3));
    EXPECT_EQ(put(openFor("psd2", "S1", second), "psd2", "S1", {'2'}), 0);
    EXPECT_EQ(get(openFor("psd2", "S1"), "psd2", "S1"), Value(Data{1, 0, 2}));
    EXPECT_EQ(sql("SELECT data_version, class, instance, hex(data) FROM records ORDER BY 1"),
              (std::vector<std::string>{"1|psd2|S1|010002", "2|psd2|S1|32"}));
    EXPECT_EQ(std::filesystem::status(root_.host(storePath)).permissions(), std::filesystem::perms(0600));
    EXPECT_EQ(root_.read(trustPath).size(), 64U);
}

TEST_F(OrloDataStore, flushesWhatItHasAcknowledged) {
    const Session session = openFor("psd2", "S1");
    for (const char data : {'a', 'b', 'c'}) {
        flushes = 0;
        EXPECT_EQ(put(session, "psd2", "S1", Data{static_cast<std::uint8_t>(data)}), 0);
        EXPECT_GE(flushes, 1);
        flushes = 0;
        EXPECT_EQ(exportAll(session, {"psd2"}, {"S1"}), 0);
        EXPECT_GE(flushes, 1);
    }
}

TEST_F(OrloDataStore, exportsAllPairsOrNone) {
    const Session session = openFor("psd2", "S1");
    EXPECT_EQ(exportAll(session, {"psd2", "tcrt"}, {"S1", "T1"}), 1);
    EXPECT_EQ(exportAll(session, {"psd2"}, {"S1", "T1"}), 1);
    QDOrloSetOption(session.get(), "Permissions", "3:psd2:S1;3:tcrt:T1");
    EXPECT_EQ(exportAll(session, {"tcrt", "psd2"}, {"T1", "S1"}), 0);
    EXPECT_EQ(exportAll(session, {}, {}), 0);
    // SHA-256 of the ticket "t".
    EXPECT_EQ(sql("SELECT id, data_version, ticket FROM exports"),
              (std::vector<std::string>{"1|1|e3b98a4da31a127d4bde6e43033f66ba274cab0eb7eb1c70ec41402bf6273dd8",
                                        "2|1|e3b98a4da31a127d4bde6e43033f66ba274cab0eb7eb1c70ec41402bf6273dd8"}));
    const std::vector<std::string> pairs = {"1|0|tcrt|T1", "1|1|psd2|S1"};
    EXPECT_EQ(sql("SELECT * FROM export_pairs"), pairs);

    // A pair that cannot be written takes the ones before it along.
    sql("CREATE UNIQUE INDEX one ON export_pairs (class) WHERE export_id > 2");
    EXPECT_EQ(exportAll(session, {"psd2", "psd2"}, {"S1", "S1"}), 5);
    EXPECT_EQ(sql("SELECT count(*) FROM exports"), std::vector<std::string>{"2"});
    EXPECT_EQ(sql("SELECT * FROM export_pairs"), pairs);
}

TEST_F(OrloDataStore, makesNoSessionWithoutATicketOrADataVersion) {
    const Value::Dictionary rows[] = {
        {},
        {{"DataVersion", 1}},
        {{"DataVersion", 1}, {"APTicket", Data{}}},
        {{"DataVersion", 1}, {"APTicket", "text"}},
        {{"APTicket", Data{'t'}}},
        {{"DataVersion", -1}, {"APTicket", Data{'t'}}},
        {{"DataVersion", std::int64_t{1} << 32}, {"APTicket", Data{'t'}}},
    };
    for (const Value::Dictionary& with : rows)
        EXPECT_TRUE(refusal(with).starts_with("Session: There is no ")) << Value(with).description();
}

TEST_F(OrloDataStore, makesNoSessionOnAStoreThatCannotBeUsedAndSaysWhy) {
    root_.makeDirectory("/folder");
    root_.write("/file", "this is no database, however long one reads it");
    ASSERT_EQ(::mkfifo(root_.host("/fifo").c_str(), 0600), 0);
    std::filesystem::create_symlink(root_.around() / "outside", root_.host("/link"));
    std::filesystem::create_symlink("file", root_.host("/inside"));
    const std::pair<const char*, std::string> keys[] = {
        {"/key", "id\nsecret\r\n\n"},      {"/short", "id\n"},
        {"/blank", "id\nsec ret\n"},       {"/long", "id\nsecret\nmore\n"},
        {"/huge", std::string(5000, 'x')}, {"/open", "id\nsecret\n"},
    };
    for (const auto& [path, contents] : keys) {
        root_.write(path, contents);
        std::filesystem::permissions(root_.host(path), std::filesystem::perms(path == keys[5].first ? 0640 : 0600));
    }
    root_.write("/text", "-----BEGIN CERTIFICATE-----\nAAAA\n-----END CERTIFICATE-----\n");
    const std::string remote = R"("backend": "remote", )";
    const std::string s3 = remote + R"("s3": {"region": "eu", "bucket": )";
    const std::string key = s3 + R"("b", "accessKeyFile": ")";
    std::vector<std::pair<std::string, std::string>> rows = {
        {R"("backend": "paper")", "no backend paper"},
        {R"("backend": 7)", "no backend 7"},
        {R"("path": 7)", "path 7 names no file"},
        {R"("path": "")", "path  names no file"},
        {R"("path": "/folder")", "no regular file"},
        {R"("path": "/folder/")", "path /folder/ names no file"},
        {R"("path": "/file")", "cannot be used"},
        {R"("path": "/file/store")", "folder cannot be opened"},
        {R"("path": "/fifo")", "no regular file"},
        {R"("path": "/link")", "no regular file"},
        {R"("path": "/link/store")", "folder cannot be opened"},
        {R"("path": "/inside")", "no regular file"},
        {remote + R"("caFile": 7)", "caFile 7 cannot be read"},
        {remote + R"("caFile": "/missing")", "caFile /missing cannot be read"},
        {remote + R"("caFile": "/")", "caFile / cannot be read"},
        {remote + R"("caFile": "/text")", "caFile /text holds no PEM certificate"},
        {remote + R"("connectTo": [])", "connectTo is no object"},
        {remote + R"("connectTo": {"a:1": 7})", "a:1 to 7"},
        {remote + R"("s3": "bucket")", "region"},
        {s3 + R"("a/b", "accessKeyFile": "/key"})", "bucket"},
        {s3 + R"("..", "accessKeyFile": "/key"})", "bucket"},
        {s3 + R"(7, "accessKeyFile": "/key"})", "bucket"},
        {s3 + R"("b"})", "accessKeyFile"},
        {key + R"(/key", "conditional": 1})", "conditional"},
        {key + R"(/missing"})", "/missing cannot be read"},
        {key + R"(/open"})", "mode 0600"},
        {key + R"(/short"})", "two lines"},
        {key + R"(/blank"})", "two lines"},
        {key + R"(/long"})", "two lines"},
        {key + R"(/huge"})", "cannot be read"},
    };
    for (const char* no : {"b", ":1", "b:0", "b:65536", "b:1x", "b:", "b:c:1", "[::1:1"}) {
        rows.emplace_back(remote + format(R"("connectTo": {"a:1": "%s"})", no), format("a:1 to %s", no));
        rows.emplace_back(remote + format(R"("connectTo": {"%s": "b:1"})", no), format("%s to b:1", no));
    }
    for (const std::string& region : {std::string("eu:s3"), std::string(64, 'e')})
        rows.emplace_back(remote + format(R"("s3": {"region": "%s", "bucket": "b", "accessKeyFile": "/key"})", region),
                          "region");
    for (const auto& [store, reason] : rows) {
        describeStore("{" + store + "}");
        const std::string line = refusal();
        EXPECT_NE(line.find(reason), std::string::npos) << store << line;
        EXPECT_EQ(line.find("sec ret"), std::string::npos);
    }
    EXPECT_EQ(root_.read("/file"), "this is no database, however long one reads it");
    describeStore(R"({"path": "/new/folder/my.db"})");
    EXPECT_NE(open(), nullptr);
    describeStore(R"({"backend": "remote", "connectTo": {"a-1.example:1": "[::1]:65535"},
                      "s3": {"region": "eu-1", "bucket": "a.b_c-d", "accessKeyFile": "/key"}})");
    EXPECT_NE(open(), nullptr);
    EXPECT_EQ(root_.contents().count("/new/folder/my.db"), 1U);
}

TEST_F(OrloDataStore, neverFollowsALinkBesideTheDatabase) {
    const std::filesystem::path victim = root_.around() / "victim";
    for (const char* suffix : {"", "-wal", "-shm", ".trust"}) {
        SCOPED_TRACE(suffix);
        std::filesystem::remove_all(root_.host("/var"));
        ASSERT_NE(open(), nullptr);
        const std::string place = std::string(storePath) + suffix;
        std::filesystem::remove(root_.host(place));
        root_.link(place, victim);
        if (const Session session = open()) {
            Data object;
            EXPECT_FALSE(QDOrloDataCopyTrustObject(session.get(), "", &object, nullptr));
            EXPECT_EQ(object, Data{});
        }
        EXPECT_FALSE(std::filesystem::exists(victim));
    }
    // The folder itself may be a link, as long as it stays in the root.
    std::filesystem::remove_all(root_.host("/var"));
    root_.makeDirectory("/private");
    root_.link("/var", "/private");
    EXPECT_EQ(put(openFor("psd2", "S1"), "psd2", "S1", {'r'}), 0);
    EXPECT_EQ(root_.contents().count("/private/lib/orlo/store.db"), 1U);
}

// A rollback journal as a crash would leave it, without pages, that names `super` as the journal above it.
std::string journalBelow(const std::string& super, std::uint32_t pages) {
    const auto number = [](std::uint32_t n) {
        return std::string{static_cast<char>(n >> 24), static_cast<char>(n >> 16), static_cast<char>(n >> 8),
                           static_cast<char>(n)};
    };
    const std::string magic = "\xd9\xd5\x05\xf9\x20\xa1\x63\xd7";
    constexpr std::uint32_t sector = 512;
    constexpr std::uint32_t page = 4096;
    std::string journal = magic + number(0) + number(0) + number(pages) + number(sector) + number(page);
    journal.resize(sector);
    std::uint32_t sum = 0;
    for (const char c : super)
        sum += static_cast<unsigned char>(c);
    return journal + number(0) + super + number(static_cast<std::uint32_t>(super.size())) + number(sum) + magic;
}

TEST_F(OrloDataStore, leavesAFileAloneThatAPlantedJournalNames) {
    const std::filesystem::path victim = root_.around() / "victim";
    ASSERT_EQ(put(openFor("psd2", "S1"), "psd2", "S1", {'r'}), 0);
    const std::string database = root_.read(storePath);
    std::ofstream(victim) << "precious";
    root_.write(std::string(storePath) + "-journal",
                journalBelow(victim, static_cast<std::uint32_t>(database.size() / 4096)));
    (void)refusal();
    EXPECT_TRUE(std::filesystem::exists(victim));

    std::filesystem::remove(root_.host(std::string(storePath) + "-journal"));
    EXPECT_EQ(get(openFor("psd2", "S1"), "psd2", "S1"), Value(Data{'r'}));
}

TEST_F(OrloDataStore, refusesADatabaseOfAnotherKindAndRunsNothingOfIt) {
    ASSERT_EQ(put(openFor("psd2", "S1"), "psd2", "S1", {'r'}), 0);
    sql("ANALYZE");
    EXPECT_EQ(get(openFor("psd2", "S1"), "psd2", "S1"), Value(Data{'r'}));
    const std::string database = root_.read(storePath);
    const struct {
        const char *change, *reason;
    } rows[] = {
        {"CREATE TRIGGER t AFTER UPDATE ON records BEGIN DELETE FROM records; END", "other tables"},
        {"CREATE INDEX i ON records (hex(zeroblob(length(data))))", "other tables"},
        {"CREATE TABLE t (x)", "other tables"},
        {"ALTER TABLE records ADD COLUMN x AS (hex(data))", "other tables"},
        {"DROP TABLE export_pairs", "lacks a table"},
        {"PRAGMA writable_schema = 1; UPDATE sqlite_master SET sql = sql || printf('%10000s', '')", "too big"},
        {"PRAGMA writable_schema = 1; WITH RECURSIVE n (i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n LIMIT 20000) "
         "INSERT INTO sqlite_master SELECT 'view', i, i, 0, 'CREATE VIEW v' || i || ' AS SELECT 1' FROM n",
         "(9)"}, // interrupted
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.change);
        sql(row.change);
        EXPECT_NE(refusal().find(row.reason), std::string::npos) << row.reason;
        root_.write(storePath, database);
        EXPECT_NE(open(), nullptr);
    }
    sql("PRAGMA user_version = 9");
    EXPECT_EQ(open(), nullptr);

    sql("PRAGMA user_version = 0");
    EXPECT_EQ(open(), nullptr);
    for (const char* contents : {"", "x"}) {
        std::filesystem::remove_all(root_.host("/var"));
        root_.write(trustPath, contents);
        const Session session = open();
        Data object;
        EXPECT_EQ(QDOrloDataCopyTrustObject(session.get(), "", &object, nullptr), *contents != 0);
    }
}

TEST_F(OrloDataStore, reportsAWriteThatFailsAndTakesTheNextOne) {
    inOwnProcess([] {
        const Session session = openFor("psd2", "S1");
        ASSERT_EQ(put(session, "psd2", "S1", {'r'}), 0);
        std::signal(SIGXFSZ, SIG_IGN);
        rlimit limit = {};
        ASSERT_EQ(::getrlimit(RLIMIT_FSIZE, &limit), 0);
        const rlimit full = {std::size_t{256} << 10, limit.rlim_max};
        ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &full), 0);
        EXPECT_EQ(put(session, "psd2", "S1", Data(1 << 20)), 5);
        EXPECT_EQ(get(session, "psd2", "S1"), Value(Data{'r'}));
        ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &limit), 0);
        EXPECT_EQ(put(session, "psd2", "S1", Data(1 << 20)), 0);
        EXPECT_EQ(get(openFor("psd2", "S1"), "psd2", "S1"), Value(Data(1 << 20)));
    });
}

TEST_F(OrloDataStore, servesSeveralProcessesThatBeginWithANewStoreAtOnce) {
    inOwnProcess([] {
        for (int child = 0; child < 6; ++child)
            if (::fork() == 0) {
                bool good = true;
                for (int i = 0; i < 20; ++i) {
                    const std::string instance = std::to_string(child) + "-" + std::to_string(i);
                    const Session session = openFor("psd2", instance);
                    good = put(session, "psd2", instance, {'r'}) == 0 &&
                           exportAll(session, {"psd2"}, {instance}) == 0 && good;
                }
                std::_Exit(good && !HasFailure() ? 0 : 1);
            }
        for (int status = 0; ::wait(&status) > 0;)
            EXPECT_EQ(status, 0);
    });
    EXPECT_EQ(sql("PRAGMA integrity_check; SELECT count(*) FROM records; SELECT count(*) FROM export_pairs"),
              (std::vector<std::string>{"ok", "120", "120"}));
    const std::filesystem::directory_iterator files(root_.host("/var/lib/orlo"));
    EXPECT_EQ(std::distance(begin(files), end(files)), 2); // the database and the trust object
}

TEST_F(OrloDataStore, knowsTheDevicesDataVersionAndItsBootTicket) {
    const struct {
        const char* store;
        std::uint32_t version;
    } rows[] = {
        {"{}", 2},
        {R"({"dataVersion": 5})", 5},
        {R"({"dataVersion": 0})", 0},
        {R"({"dataVersion": -1})", 2},
        {R"({"dataVersion": 4294967296})", 2},
        {R"({"dataVersion": "5"})", 2},
        {R"({"dataVersion": true})", 2},
    };
    for (const auto& row : rows) {
        describeStore(row.store);
        EXPECT_EQ(QDOrloSealingMapGetOrloDataVersionForDevice({}), row.version) << row.store;
    }
    std::optional<Error> error;
    const KelvoDataAccessor& accessor = KelvoDataAccessor::sharedDataAccessor();
    EXPECT_EQ(accessor.copyPathForPersonalizedData(2, &error), Value("/System/Library/Caches/apticket.der"));
    EXPECT_EQ(error, std::nullopt);
    EXPECT_EQ(accessor.copyPathForPersonalizedData(1, &error), Value());
    EXPECT_NE(error, std::nullopt);
}

} // namespace
