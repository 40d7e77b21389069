// The SQLite database of the embedded store: opened below the device root, with its tables, ready for transactions.
#ifndef VELTRA_PLATFORM_LINUX_ORLO_DATABASE_H
#define VELTRA_PLATFORM_LINUX_ORLO_DATABASE_H

#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>

#include <sqlite3.h>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"

// Raise OrloStoreFailure (QDOrloErrorStorage) with the reason in errno, and with SQLite's.
[[noreturn]] void failWithErrno(const std::string& what);
[[noreturn]] void failWithReasonOf(sqlite3* database);

// Makes the file `name` in `directory`, with mode 0600, unless somebody else is faster. Raises OrloStoreFailure with
// `problem` and the reason.
void makeStoreFile(const FileDescriptor& directory, const std::string& name, std::span<const std::uint8_t> contents,
                   const char* problem);

// A prepared statement. Every operation raises OrloStoreFailure on failure.
class OrloStatement {
public:
    OrloStatement(sqlite3* database, const char* sql);

    // Sets the parameter `index`, which counts from 1. Texts and data are not copied and must outlive the step.
    OrloStatement& bind(int index, std::int64_t number);
    OrloStatement& bind(int index, std::string_view text);
    OrloStatement& bind(int index, const Value::Data& data);

    // Whether there is a row. After the last one, and after a failure, the statement is ready to be used again.
    bool step();

    // Ends the statement before its last row.
    void reset() { sqlite3_reset(statement_.get()); }

    std::int64_t number(int column) const { return sqlite3_column_int64(statement_.get(), column); }
    std::string_view text(int column) const;
    Value::Data data(int column) const;

private:
    void check(int result);

    std::unique_ptr<sqlite3_stmt, decltype(&sqlite3_finalize)> statement_;
};

class OrloDatabase {
public:
    // Opens the database file `name` in `directory`, and makes it, with mode 0600, when it is missing. No symbolic link
    // is followed, neither for the file nor for those that SQLite keeps beside it. `directory` must outlive this.
    // Raises OrloStoreFailure when it cannot be used, and for one with other tables, indexes, triggers or views than
    // this service makes.
    OrloDatabase(const FileDescriptor& directory, const std::string& name);

    sqlite3* handle() const { return handle_.get(); }

    // Runs statements that have neither parameters nor rows that matter.
    void run(const char* sql);

private:
    void configure();
    void makeTables();
    void requireOwnTables();

    std::unique_ptr<sqlite3, decltype(&sqlite3_close)> handle_;
};

// Statements between construction and commit take effect together, or not at all.
class OrloTransaction {
public:
    explicit OrloTransaction(OrloDatabase& database) : database_(database) { database_.run("BEGIN IMMEDIATE"); }
    OrloTransaction(const OrloTransaction&) = delete;
    OrloTransaction& operator=(const OrloTransaction&) = delete;
    ~OrloTransaction() {
        if (sqlite3_get_autocommit(database_.handle()) == 0)
            sqlite3_exec(database_.handle(), "ROLLBACK", nullptr, nullptr, nullptr);
    }

    void commit() { database_.run("COMMIT"); }

private:
    OrloDatabase& database_;
};

#endif
