// What the data-store library costs on top of its database: puts and gets of records through a session, with its checks
// of permission and trust object, beside the same statements on bare SQLite with the same durability.
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string>

#include <benchmark/benchmark.h>
#include <sqlite3.h>

#include "platform/OrloDataStore.h"

namespace {

constexpr const char* dataClass = "psd2";
constexpr const char* instance = "VAN0001";

[[noreturn]] void fail(const char* what) {
    std::fprintf(stderr, "bench-orlo-store: %s\n", what);
    std::exit(EXIT_FAILURE);
}

void require(bool holds, const char* what) {
    if (!holds)
        fail(what);
}

Value::Data recordOf(const benchmark::State& state, std::uint8_t fill) {
    return Value::Data(static_cast<std::size_t>(state.range(0)), fill);
}

// A session that may put and get the record.
class Library {
public:
    Library() : session_(QDOrloCreateWithOptions(Value::Dictionary{{"APTicket", Value::Data{1}}, {"DataVersion", 1}})) {
        require(session_, "no session");
        Value::Data object;
        Value::Data digest(32);
        require(QDOrloDataCopyTrustObject(session_, "", &object, nullptr), "no trust object");
        QDSupportDigestSha256(object.data(), static_cast<std::uint32_t>(object.size()), digest.data());
        QDOrloSetOption(session_, "TrustObjectDigest", digest);
        std::string permissions;
        for (const OrloAction action : {OrloActionGet, OrloActionPut})
            QDOrloAppendPermissionsString(action, dataClass, instance, permissions);
        QDOrloSetOption(session_, "Permissions", permissions);
    }
    ~Library() { QDSupportSafeRelease(session_); }
    Library(const Library&) = delete;
    Library& operator=(const Library&) = delete;

    void put(const Value::Data& record) {
        require(QDOrloDataPut(session_, dataClass, instance, record, nullptr), "put");
    }
    Value::Data get() {
        auto record = QDOrloDataCopy(session_, dataClass, instance, nullptr);
        require(record.has_value(), "get");
        return std::move(*record);
    }

private:
    __QDOrlo* session_;
};

class BareSQLite {
public:
    BareSQLite() {
        const std::string path = std::string(std::getenv("VELTRA_DEVICE_ROOT")) + "/bare.db";
        require(sqlite3_open_v2(path.c_str(), &database_,
                                SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX, nullptr) == SQLITE_OK,
                "bare database");
        run("PRAGMA journal_mode = WAL; PRAGMA synchronous = FULL;"
            "CREATE TABLE IF NOT EXISTS records (data_version INTEGER NOT NULL, class TEXT NOT NULL,"
            " instance TEXT NOT NULL, data BLOB NOT NULL, put_at TEXT NOT NULL,"
            " PRIMARY KEY (class, instance, data_version));");
        put_ = prepare("INSERT INTO records (data_version, class, instance, data, put_at) VALUES (?1, ?2, ?3, ?4,"
                       " strftime('%Y-%m-%dT%H:%M:%fZ', 'now'))"
                       " ON CONFLICT DO UPDATE SET data = excluded.data, put_at = excluded.put_at");
        get_ = prepare("SELECT data FROM records WHERE data_version = ?1 AND class = ?2 AND instance = ?3");
    }
    ~BareSQLite() {
        sqlite3_finalize(put_);
        sqlite3_finalize(get_);
        sqlite3_close(database_);
    }
    BareSQLite(const BareSQLite&) = delete;
    BareSQLite& operator=(const BareSQLite&) = delete;

    void put(const Value::Data& record) {
        bindName(put_);
        sqlite3_bind_blob64(put_, 4, record.data(), record.size(), SQLITE_STATIC);
        require(sqlite3_step(put_) == SQLITE_DONE, "bare put");
        sqlite3_reset(put_);
    }
    Value::Data get() {
        bindName(get_);
        require(sqlite3_step(get_) == SQLITE_ROW, "bare get");
        const auto* bytes = static_cast<const std::uint8_t*>(sqlite3_column_blob(get_, 0));
        Value::Data record(bytes, bytes + sqlite3_column_bytes(get_, 0));
        sqlite3_reset(get_);
        return record;
    }

private:
    void run(const char* sql) { require(sqlite3_exec(database_, sql, nullptr, nullptr, nullptr) == SQLITE_OK, sql); }
    sqlite3_stmt* prepare(const char* sql) {
        sqlite3_stmt* statement = nullptr;
        require(sqlite3_prepare_v2(database_, sql, -1, &statement, nullptr) == SQLITE_OK, sql);
        return statement;
    }
    static void bindName(sqlite3_stmt* statement) {
        sqlite3_bind_int64(statement, 1, 1);
        sqlite3_bind_text(statement, 2, dataClass, -1, SQLITE_STATIC);
        sqlite3_bind_text(statement, 3, instance, -1, SQLITE_STATIC);
    }

    sqlite3* database_ = nullptr;
    sqlite3_stmt* put_ = nullptr;
    sqlite3_stmt* get_ = nullptr;
};

template <class Store>
void put(benchmark::State& state) {
    Store store;
    // Two that differ everywhere, since SQLite does not write what it has.
    const Value::Data records[] = {recordOf(state, 0xA5), recordOf(state, 0x5A)};
    std::size_t which = 0;
    for (auto step : state)
        store.put(records[which ^= 1]);
}

template <class Store>
void get(benchmark::State& state) {
    Store store;
    store.put(recordOf(state, 0xA5));
    for (auto step : state)
        benchmark::DoNotOptimize(store.get());
}

} // namespace

int main(int count, char** arguments) {
    benchmark::Initialize(&count, arguments);
    char folder[] = "/tmp/veltra-bench-XXXXXX";
    require(mkdtemp(folder), "no temporary folder");
    setenv("VELTRA_DEVICE_ROOT", folder, 1);
    benchmark::RegisterBenchmark("store-put/veltra", put<Library>)->Arg(4096)->UseRealTime();
    benchmark::RegisterBenchmark("store-put/sqlite", put<BareSQLite>)->Arg(4096)->UseRealTime();
    benchmark::RegisterBenchmark("store-get/veltra", get<Library>)->Arg(4096)->UseRealTime();
    benchmark::RegisterBenchmark("store-get/sqlite", get<BareSQLite>)->Arg(4096)->UseRealTime();
    benchmark::RunSpecifiedBenchmarks();
    std::filesystem::remove_all(folder);
    return 0;
}
