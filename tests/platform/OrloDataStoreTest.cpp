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
#include <sys/syscall.h>
#include <unistd.h>

#include "platform/Format.h"
#include "platform/Json.h"
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

using Session = std::unique_ptr<__QDOrlo, decltype(&QDSupportSafeRelease)>;

Session open(const Value::Dictionary& with = options) {
    return {QDOrloCreateWithOptions(with), QDSupportSafeRelease};
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

// The code of the error that an operation ends with, 0 for none.
std::int64_t codeOf(bool isDone, const std::optional<Error>& error) {
    EXPECT_EQ(isDone, !error);
    EXPECT_TRUE(!error || (error->domain == "QDOrloErrorDomain" && !error->text.empty()));
    return error ? error->code : 0;
}

std::int64_t put(const Session& session, const Value& dataClass, const Value& instance, const Data& data) {
    std::optional<Error> error;
    return codeOf(QDOrloDataPut(session.get(), dataClass, instance, data, &error), error);
}

// The record, or the code.
Value get(const Session& session, const Value& dataClass, const Value& instance) {
    std::optional<Error> error;
    const std::optional<Data> data = QDOrloDataCopy(session.get(), dataClass, instance, &error);
    const std::int64_t code = codeOf(data.has_value(), error);
    return data ? Value(*data) : Value(code);
}

std::int64_t exportAll(const Session& session, const Value::Array& classes, const Value::Array& instances) {
    std::optional<Error> error;
    return codeOf(QDOrloDataMultiExport(session.get(), classes, instances, &error), error);
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

    void describeStore(const std::string& json) const { root_.describe("{\"store\": " + json + "}"); }

    // The one line of the log that says why no session can be made.
    static std::string refusal(const Value::Dictionary& with = options) {
        logged().clear();
        EXPECT_EQ(open(with), nullptr);
        EXPECT_EQ(logged().size(), 1U);
        return logged().empty() ? "" : logged()[0];
    }

    // Runs statements on the database as anyone could; the rows as lines, their columns joined by "|".
    std::string sql(const std::string& statements) const {
        std::string rows;
        sqlite3* database = nullptr;
        EXPECT_EQ(sqlite3_open(root_.host(storePath).c_str(), &database), SQLITE_OK);
        const auto onRow = [](void* context, int count, char** columns, char**) {
            for (int i = 0; i < count; ++i)
                (*static_cast<std::string*>(context) += columns[i]) += i + 1 < count ? '|' : '\n';
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
        {OrloActionPut, "", "S1", {}},
        {OrloActionPut, "psd2", "", {}},
        {OrloActionPut, "psd2", 17, {}},
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
        {"1:psd2:S11;x0:psd2:S1;3:psd2:S1 ", {}, 1},
        {"11:psd2:S1;10:psd2:S1; 3:psd2:S1", {}, 1},
        {"0:psd2:S1;1:psd2:S1;3:psd2:S1", {}, 2},
        {"0:psd2:S1;1:psd2:S1;3:psd2:S1", Data{}, 2},
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
    EXPECT_EQ(sql("SELECT count(*) FROM exports"), "0\n");

    // Another trust object ends the trust of a session that has the digest of the one before, and that at once.
    const Session before = openFor("psd2", "S1");
    root_.write(trustPath, "another");
    EXPECT_EQ(put(before, "psd2", "S1", {'x'}), 2);
    trust(before);
    EXPECT_EQ(put(before, "psd2", "S1", {'x'}), 0);
    EXPECT_EQ(put({nullptr, QDSupportSafeRelease}, "psd2", "S1", {'x'}), 1);
    EXPECT_EQ(put(before, "psd2", "S\n1", {'x'}), 1);
    EXPECT_EQ(logged().back(), "Put: The session has no grant for action 1 on psd2 of S\\n1");
    QDOrloSetOption(before.get(), "APTicket", {});
    EXPECT_EQ(put(before, "psd2", "S1", {'x'}), 1);
    EXPECT_EQ(logged().back(), "Put: There is no AP ticket");
    QDOrloSetOption(nullptr, "Permissions", "");
}

TEST_F(OrloDataStore, keepsRecordsByClassInstanceAndDataVersion) {
    EXPECT_EQ(put(openFor("psd2", "S1"), "psd2", "S1", {'1'}), 0);
    EXPECT_EQ(get(openFor("psd2", "S2"), "psd2", "S2"), Value(3));
    EXPECT_EQ(get(openFor("psd1", "S1"), "psd1", "S1"), Value(3));
    const Session second = openFor("psd2", "S1", {{"APTicket", Data{'t'}}, {"DataVersion", 2}});
    EXPECT_EQ(get(second, "psd2", "S1"), Value(3));
    EXPECT_EQ(put(second, "psd2", "S1", {'2'}), 0);
    EXPECT_EQ(get(openFor("psd2", "S1"), "psd2", "S1"), Value(Data{'1'}));
    EXPECT_EQ(std::filesystem::status(root_.host(storePath)).permissions(), std::filesystem::perms(0600));
    EXPECT_EQ(root_.read(trustPath).size(), 64U);
}

TEST_F(OrloDataStore, flushesWhatItHasAcknowledged) {
    const Session session = openFor("psd2", "S1");
    for (int round = 0; round < 3; ++round) {
        flushes = 0;
        EXPECT_EQ(put(session, "psd2", "S1", {'r'}), 0);
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
    const std::string row = "|1|e3b98a4da31a127d4bde6e43033f66ba274cab0eb7eb1c70ec41402bf6273dd8\n";
    EXPECT_EQ(sql("SELECT id, data_version, ticket FROM exports"), "1" + row + "2" + row);

    // A pair that cannot be written takes the ones before it along.
    sql("CREATE UNIQUE INDEX one ON export_pairs (class) WHERE export_id > 2");
    EXPECT_EQ(exportAll(session, {"psd2", "psd2"}, {"S1", "S1"}), 5);
    EXPECT_EQ(sql("SELECT count(*) FROM exports; SELECT * FROM export_pairs"), "2\n1|0|tcrt|T1\n1|1|psd2|S1\n");
}

TEST_F(OrloDataStore, aSessionHasATicketAndADataVersionOf32Bits) {
    const std::pair<const char*, std::uint32_t> rows[] = {
        {"5", 5}, {"0", 0}, {"4294967295", 4294967295}, {"-1", 2}, {"4294967296", 2}, {"true", 2}, {"null", 2},
    };
    for (const auto& [described, version] : rows) {
        SCOPED_TRACE(described);
        describeStore(std::string(R"({"dataVersion": )") + described + "}");
        EXPECT_EQ(QDOrloSealingMapGetOrloDataVersionForDevice({}), version);
        const Value::Dictionary with = {{"APTicket", Data{'t'}}, {"DataVersion", *jsonToValue(described)}};
        EXPECT_EQ(open(with) == nullptr, std::to_string(version) != described);
    }
    for (const Value& ticket : {Value(), Value(Data{}), Value("text")})
        EXPECT_EQ(refusal({{"DataVersion", 1}, {"APTicket", ticket}}), "Session: There is no AP ticket");
}

TEST_F(OrloDataStore, makesNoSessionOnAStoreThatCannotBeUsedAndSaysWhy) {
    root_.makeDirectory("/folder");
    root_.write("/file", "this is no database, however long one reads it");
    std::filesystem::create_symlink(root_.around() / "outside", root_.host("/link"));
    const std::pair<const char*, std::string> keys[] = {
        {"/open", "id\nsecret\n"},       {"/key", "id\nsecret\r\n\n"},      {"/blank", "id\nsec ret\n"},
        {"/long", "id\nsecret\nmore\n"}, {"/huge", std::string(5000, 'x')}, {"/short", "id\n"},
    };
    for (const auto& [path, contents] : keys) {
        root_.write(path, contents);
        std::filesystem::permissions(root_.host(path), std::filesystem::perms(path == keys[0].first ? 0640 : 0600));
    }
    root_.write("/text", "-----BEGIN CERTIFICATE-----\nAAAA\n-----END CERTIFICATE-----\n");
    const std::string remote = R"("backend": "remote", )";
    const std::string s3 = remote + R"("s3": {"region": "eu", "bucket": )";
    const std::string key = s3 + R"("b", "accessKeyFile": ")";
    std::vector<std::pair<std::string, std::string>> rows = {
        {R"("backend": "paper")", "no backend paper"},
        {R"("path": 7)", "path 7 names no file"},
        {R"("path": "/folder/")", "path /folder/ names no file"},
        {R"("path": "/file")", "cannot be used"},
        {R"("path": "/file/store")", "folder cannot be opened"},
        {R"("path": "/link")", "no regular file"},
        {remote + R"("caFile": "/missing")", "caFile /missing cannot be read"},
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
    describeStore("{" + remote + R"("connectTo": {"a-1.example:1": "[::1]:65535"}, "s3": {"region": ")" +
                  std::string(62, 'e') + R"(-", "bucket": ")" + std::string(251, 'b') +
                  R"(.c_-", "accessKeyFile": "/key"}})");
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
    for (const char* version : {"9", "0"}) {
        sql(std::string("PRAGMA user_version = ") + version);
        EXPECT_EQ(open(), nullptr);
    }
    root_.write(storePath, database);
    const Session session = open();
    root_.write(trustPath, "");
    Data object;
    EXPECT_FALSE(QDOrloDataCopyTrustObject(session.get(), "", &object, nullptr));
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

TEST_F(OrloDataStore, waitsForWhoeverWritesToANewStoreBeforeItChangesTheJournal) {
    static sqlite3* writer = nullptr;
    static const auto end = [](sqlite3_vfs*, int) { return sqlite3_exec(writer, "COMMIT", nullptr, nullptr, nullptr); };
    EXPECT_NE(open(), nullptr); // from now on SQLite itself waits with another sleep than the store
    root_.write("/new.db", "");
    describeStore(R"({"path": "/new.db"})");
    ASSERT_EQ(sqlite3_open(root_.host("/new.db").c_str(), &writer), SQLITE_OK);
    ASSERT_EQ(sqlite3_exec(writer, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr), SQLITE_OK);
    const auto sleep = std::exchange(sqlite3_vfs_find(nullptr)->xSleep, end);
    EXPECT_NE(open(), nullptr);
    sqlite3_vfs_find(nullptr)->xSleep = sleep;
    sqlite3_close(writer);
}

TEST_F(OrloDataStore, servesSeveralProcessesThatBeginWithANewStoreAtOnce) {
    inProcessesAtOnce([](int process) {
        for (int i = 0; i < 20; ++i) {
            const std::string instance = std::to_string(process) + "-" + std::to_string(i);
            const Session session = openFor("psd2", instance);
            EXPECT_EQ(put(session, "psd2", instance, {'r'}), 0);
            EXPECT_EQ(exportAll(session, {"psd2"}, {instance}), 0);
        }
    });
    EXPECT_EQ(sql("PRAGMA integrity_check; SELECT count(*) FROM records; SELECT count(*) FROM export_pairs"),
              "ok\n120\n120\n");
    const std::filesystem::directory_iterator files(root_.host("/var/lib/orlo"));
    EXPECT_EQ(std::distance(begin(files), end(files)), 2); // the database and the trust object
}

} // namespace
