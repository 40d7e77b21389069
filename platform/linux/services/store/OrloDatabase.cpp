#include "platform/linux/services/store/OrloDatabase.h"

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>

#include <fcntl.h>
#include <sys/stat.h>

#include "platform/Files.h"
#include "platform/linux/services/store/OrloStoreBackend.h"
#include "platform/linux/system/NewFile.h"

namespace {

constexpr int busyMilliseconds = 10'000;
constexpr int schemaVersion = 1;

// Longer texts and blobs are refused, so that a hostile database cannot ask for more memory than a file could. A row
// is longer than the record in it.
constexpr int longestValue = static_cast<int>(files::maximumSize) + (1 << 20);

// What a statement may take while the schema is read and judged: nothing near it is needed for the service's own, and a
// schema of a million tables, or a table of a million columns, holds nobody up.
constexpr int mostInstructions = 100'000;
constexpr int longestStatement = 10'000;

// A record belongs to the data version under which it was put. An export is one row with its pairs beside it.
constexpr std::string_view tables[] = {
    R"(CREATE TABLE records (
    data_version INTEGER NOT NULL,
    class        TEXT NOT NULL,
    instance     TEXT NOT NULL,
    data         BLOB NOT NULL,
    put_at       TEXT NOT NULL,
    PRIMARY KEY (class, instance, data_version)
))",
    R"(CREATE TABLE exports (
    id           INTEGER PRIMARY KEY,
    data_version INTEGER NOT NULL,
    ticket       TEXT NOT NULL, -- SHA-256 of the device's boot ticket
    exported_at  TEXT NOT NULL
))",
    R"(CREATE TABLE export_pairs (
    export_id    INTEGER NOT NULL REFERENCES exports (id),
    position     INTEGER NOT NULL,
    class        TEXT NOT NULL,
    instance     TEXT NOT NULL,
    PRIMARY KEY (export_id, position)
) WITHOUT ROWID)",
};

// What there is beside tables of statistics, which a site may want.
constexpr const char* ownSchema = R"(
SELECT sql FROM sqlite_master WHERE sql IS NOT NULL AND sql NOT GLOB 'CREATE TABLE sqlite_stat?(*' ORDER BY rowid)";

// The database may have been put there by anyone, so nothing in it is run or trusted.
constexpr struct {
    int option;
    int value;
} settings[] = {
    {SQLITE_DBCONFIG_DEFENSIVE, 1},
    {SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0},
    {SQLITE_DBCONFIG_ENABLE_TRIGGER, 0},
    {SQLITE_DBCONFIG_ENABLE_VIEW, 0},
};

constexpr const char* pragmas = "PRAGMA synchronous = FULL; PRAGMA temp_store = MEMORY; PRAGMA cell_size_check = ON;";

int pathAsItIs(sqlite3_vfs*, const char* path, int size, char* out) {
    const int length = std::snprintf(out, static_cast<std::size_t>(size), "%s", path);
    return length >= 0 && length < size ? SQLITE_OK : SQLITE_CANTOPEN;
}

const sqlite3_vfs& defaultAccess() {
    static const sqlite3_vfs& access = *sqlite3_vfs_find("unix");
    return access;
}

// A rollback journal may name a super-journal, any file of the machine, which SQLite reads and then deletes. No
// database here has one, so a journal with one was put there by somebody else.
int openNoSuperJournal(sqlite3_vfs* access, sqlite3_filename path, sqlite3_file* file, int flags, int* outFlags) {
    if ((flags & SQLITE_OPEN_SUPER_JOURNAL) == 0)
        return defaultAccess().xOpen(access, path, file, flags, outFlags);
    file->pMethods = nullptr;
    return SQLITE_CANTOPEN;
}

// SQLite's own way to files, but for two things: that, and that it would replace each symbolic link in a database's
// path by its target and then open that. Paths here begin with the descriptor of the open directory,
// "/proc/self/fd/<n>/", and have to stay so, since the directory must not be looked up again by name. The last part of
// a path SQLite opens with O_NOFOLLOW.
const char* fileAccess() {
    static sqlite3_vfs access = [] {
        sqlite3_vfs own = defaultAccess();
        own.zName = "veltra";
        own.xFullPathname = pathAsItIs;
        own.xOpen = openNoSuperJournal;
        return own;
    }();
    static const int registered = sqlite3_vfs_register(&access, 0);
    return registered == SQLITE_OK ? access.zName : nullptr;
}

// SQLite would give a new file the mode that the umask leaves of 0644.
void makeFile(const FileDescriptor& directory, const std::string& name) {
    struct stat status;
    if (::fstatat(directory.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
        if (errno != ENOENT)
            failWithErrno("The store cannot be opened");
        makeStoreFile(directory, name, {}, "The store cannot be made");
    } else if (!S_ISREG(status.st_mode)) {
        throw OrloStoreFailure(QDOrloErrorStorage, "The store is no regular file");
    }
}

} // namespace

void failWithErrno(const std::string& what) {
    throw OrloStoreFailure(QDOrloErrorStorage, what + ": " + std::strerror(errno));
}

void makeStoreFile(const FileDescriptor& directory, const std::string& name, std::span<const std::uint8_t> contents,
                   const char* problem) {
    NewFile file(directory);
    if (!file || !file.fill(contents) || (!file.placeAt(name) && errno != EEXIST))
        failWithErrno(problem);
}

void failWithReasonOf(sqlite3* database) {
    throw OrloStoreFailure(QDOrloErrorStorage, std::string("The store cannot be used: ") + sqlite3_errmsg(database) +
                                                   " (" + std::to_string(sqlite3_extended_errcode(database)) + ")");
}

OrloStatement::OrloStatement(sqlite3* database, const char* sql) : statement_(nullptr, sqlite3_finalize) {
    sqlite3_stmt* prepared = nullptr;
    if (sqlite3_prepare_v3(database, sql, -1, SQLITE_PREPARE_PERSISTENT, &prepared, nullptr) != SQLITE_OK)
        failWithReasonOf(database);
    statement_.reset(prepared);
}

OrloStatement& OrloStatement::bind(int index, std::int64_t number) {
    check(sqlite3_bind_int64(statement_.get(), index, number));
    return *this;
}

OrloStatement& OrloStatement::bind(int index, std::string_view text) {
    check(sqlite3_bind_text64(statement_.get(), index, text.data(), text.size(), SQLITE_STATIC, SQLITE_UTF8));
    return *this;
}

OrloStatement& OrloStatement::bind(int index, const Value::Data& data) {
    // A null pointer would be bound as NULL, which is no empty blob.
    const void* bytes = data.empty() ? static_cast<const void*>("") : data.data();
    check(sqlite3_bind_blob64(statement_.get(), index, bytes, data.size(), SQLITE_STATIC));
    return *this;
}

bool OrloStatement::step() {
    const int result = sqlite3_step(statement_.get());
    if (result == SQLITE_ROW)
        return true;
    if (result != SQLITE_DONE)
        check(result);
    reset();
    return false;
}

std::string_view OrloStatement::text(int column) const {
    const auto* bytes = reinterpret_cast<const char*>(sqlite3_column_text(statement_.get(), column));
    return {bytes ? bytes : "", static_cast<std::size_t>(sqlite3_column_bytes(statement_.get(), column))};
}

Value::Data OrloStatement::data(int column) const {
    const auto* bytes = static_cast<const std::uint8_t*>(sqlite3_column_blob(statement_.get(), column));
    const int size = sqlite3_column_bytes(statement_.get(), column);
    if (!bytes && sqlite3_errcode(sqlite3_db_handle(statement_.get())) == SQLITE_NOMEM)
        failWithReasonOf(sqlite3_db_handle(statement_.get()));
    return bytes ? Value::Data(bytes, bytes + size) : Value::Data();
}

void OrloStatement::check(int result) {
    if (result == SQLITE_OK)
        return;
    try {
        failWithReasonOf(sqlite3_db_handle(statement_.get()));
    } catch (...) {
        reset();
        throw;
    }
}

OrloDatabase::OrloDatabase(const FileDescriptor& directory, const std::string& name) : handle_(nullptr, sqlite3_close) {
    makeFile(directory, name);
    const std::string path = "/proc/self/fd/" + std::to_string(directory.get()) + "/" + name;
    constexpr int flags =
        SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX | SQLITE_OPEN_PRIVATECACHE | SQLITE_OPEN_EXRESCODE;
    sqlite3* opened = nullptr;
    const int result = sqlite3_open_v2(path.c_str(), &opened, flags, fileAccess());
    handle_.reset(opened);
    if (result != SQLITE_OK)
        failWithReasonOf(opened);
    sqlite3_progress_handler(
        handle(), mostInstructions, [](void*) { return 1; }, nullptr);
    configure();
    makeTables();
    requireOwnTables();
    sqlite3_progress_handler(handle(), 0, nullptr, nullptr);
}

void OrloDatabase::run(const char* sql) {
    if (sqlite3_exec(handle(), sql, nullptr, nullptr, nullptr) != SQLITE_OK)
        failWithReasonOf(handle());
}

void OrloDatabase::configure() {
    sqlite3_busy_timeout(handle(), busyMilliseconds);
    sqlite3_limit(handle(), SQLITE_LIMIT_LENGTH, longestValue);
    sqlite3_limit(handle(), SQLITE_LIMIT_SQL_LENGTH, longestStatement);
    for (const auto& setting : settings)
        if (sqlite3_db_config(handle(), setting.option, setting.value, nullptr) != SQLITE_OK)
            failWithReasonOf(handle());
    if (sqlite3_db_readonly(handle(), "main") != 0)
        throw OrloStoreFailure(QDOrloErrorStorage, "The store is read-only");
    run(pragmas);

    // The change to the write-ahead log needs the database for itself, and SQLite does not wait for that: another
    // service may be at the same point with the same new database.
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(busyMilliseconds);
    OrloStatement journal(handle(), "PRAGMA journal_mode = WAL");
    while (true) {
        try {
            if (!journal.step() || journal.text(0) != "wal")
                throw OrloStoreFailure(QDOrloErrorStorage, "The store cannot have a write-ahead log");
            return;
        } catch (const OrloStoreFailure&) {
            if ((sqlite3_errcode(handle()) & 0xFF) != SQLITE_BUSY || std::chrono::steady_clock::now() > deadline)
                throw;
        }
        sqlite3_sleep(5);
    }
}

void OrloDatabase::makeTables() {
    const auto version = [this] {
        OrloStatement statement(handle(), "PRAGMA user_version");
        return statement.step() ? statement.number(0) : 0;
    };
    if (version() == 0) {
        OrloTransaction transaction(*this);
        if (version() == 0) { // nobody was faster
            for (const std::string_view table : tables)
                run(table.data());
            run(("PRAGMA user_version = " + std::to_string(schemaVersion)).c_str());
        }
        transaction.commit();
    }
    if (version() != schemaVersion)
        throw OrloStoreFailure(QDOrloErrorStorage, "The store is of version " + std::to_string(version()) +
                                                       ", which this service does not know");
}

// An index, a check or a computed column of somebody else's would be part of every put, however long it takes.
void OrloDatabase::requireOwnTables() {
    OrloStatement schema(handle(), ownSchema);
    const std::string_view* own = std::begin(tables);
    while (schema.step())
        if (own == std::end(tables) || schema.text(0) != *own++)
            throw OrloStoreFailure(QDOrloErrorStorage, "The store has other tables or indexes than this service's");
    if (own != std::end(tables))
        throw OrloStoreFailure(QDOrloErrorStorage, "The store lacks a table");
}
