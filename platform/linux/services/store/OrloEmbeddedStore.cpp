// The embedded backend: records in an SQLite database below the device root.
#include <cerrno>
#include <utility>

#include <fcntl.h>

#include "platform/Crypto.h"
#include "platform/DeviceRoot.h"
#include "platform/Format.h"
#include "platform/linux/services/store/OrloDatabase.h"
#include "platform/linux/services/store/OrloStoreBackend.h"

namespace {

constexpr const char* defaultPath = "/var/lib/orlo/store.db";

constexpr const char* putRecord = R"(
INSERT INTO records (data_version, class, instance, data, put_at)
VALUES (?1, ?2, ?3, ?4, strftime('%Y-%m-%dT%H:%M:%fZ', 'now'))
ON CONFLICT DO UPDATE SET data = excluded.data, put_at = excluded.put_at)";

constexpr const char* copyRecord = "SELECT data FROM records WHERE data_version = ?1 AND class = ?2 AND instance = ?3";

constexpr const char* addExport = R"(
INSERT INTO exports (data_version, ticket, exported_at) VALUES (?1, ?2, strftime('%Y-%m-%dT%H:%M:%fZ', 'now')))";

constexpr const char* addExportPair =
    "INSERT INTO export_pairs (export_id, position, class, instance) VALUES (?1, ?2, ?3, ?4)";

[[noreturn]] void failOfTrustObject(const char* problem) {
    throw OrloStoreFailure(QDOrloErrorStorage, std::string("The trust object ") + problem);
}

void makeTrustObject(const FileDescriptor& directory, const std::string& name) {
    std::uint8_t contents[64];
    if (!crypto::randomBytes(contents, sizeof contents))
        failOfTrustObject("cannot be made: there is no randomness");
    makeStoreFile(directory, name, contents, "The trust object cannot be made");
}

// The trust object, a file beside the database, read now. It is made when it is missing; of two services that do so at
// once, one has its way and both see the same.
Value::Data readTrustObject(const FileDescriptor& directory, const std::string& name) {
    constexpr std::size_t maximumSize = std::size_t{1} << 20;
    FileDescriptor file = openIn(directory, name, O_RDONLY);
    if (!file && errno == ENOENT) {
        makeTrustObject(directory, name);
        file = openIn(directory, name, O_RDONLY);
    }
    if (!file && errno != ENXIO) // what is neither a file nor a link is not opened
        failWithErrno("The trust object cannot be opened");
    std::optional<Value::Data> contents = file ? readRegularFile(file, maximumSize) : std::nullopt;
    if (!contents || contents->empty())
        failOfTrustObject("is damaged: it is empty, no regular file, or larger than 1 MiB");
    return std::move(*contents);
}

class EmbeddedStore : public OrloStoreBackend {
public:
    EmbeddedStore(FileDescriptor directory, const std::string& name)
        : directory_(std::move(directory)),
          trust_(name + ".trust"),
          database_(directory_, name),
          put_(database_.handle(), putRecord),
          copy_(database_.handle(), copyRecord) {}

    Value::Data trustObject(const OrloOptions&, std::string_view) override {
        return readTrustObject(directory_, trust_);
    }

    Value::Data trustMeasure(const OrloOptions&) override { return readTrustObject(directory_, trust_); }

    void put(const OrloOptions& options, const OrloRecordName& name, const Value::Data& data) override {
        bindRecord(put_, options, name).bind(4, data).step();
    }

    Value::Data copy(const OrloOptions& options, const OrloRecordName& name) override {
        if (!bindRecord(copy_, options, name).step())
            throw OrloStoreFailure(QDOrloErrorNoSuchRecord,
                                   format("There is no record %@ of %@", name.dataClass, name.instance));
        // The statement holds on to the state of the database in which it found the row.
        const std::unique_ptr<OrloStatement, void (*)(OrloStatement*)> end(&copy_,
                                                                           [](OrloStatement* s) { s->reset(); });
        return copy_.data(0);
    }

    void multiExport(const OrloOptions& options, const std::vector<OrloRecordName>& names) override {
        const std::string ticket = ticketDigestOf(options);
        OrloTransaction transaction(database_);
        OrloStatement(database_.handle(), addExport).bind(1, dataVersionOf(options)).bind(2, ticket).step();
        OrloStatement pair(database_.handle(), addExportPair);
        pair.bind(1, sqlite3_last_insert_rowid(database_.handle()));
        std::int64_t position = 0;
        for (const OrloRecordName& name : names)
            pair.bind(2, position++).bind(3, name.dataClass).bind(4, name.instance).step();
        transaction.commit();
    }

private:
    static OrloStatement& bindRecord(OrloStatement& statement, const OrloOptions& options, const OrloRecordName& name) {
        return statement.bind(1, dataVersionOf(options)).bind(2, name.dataClass).bind(3, name.instance);
    }

    // In this order: the database reaches its files through the directory, and the statements belong to it.
    FileDescriptor directory_;
    std::string trust_; // the name of its file
    OrloDatabase database_;
    OrloStatement put_;
    OrloStatement copy_;
};

} // namespace

std::unique_ptr<OrloStoreBackend> openEmbeddedStore(const Value& store) {
    const Value path = store["path"].isNothing() ? Value(defaultPath) : store["path"];
    const auto parts = path.text() ? splitDevicePath(*path.text()) : std::nullopt;
    if (!parts)
        throw OrloStoreFailure(QDOrloErrorStorage, "The store's path " + path.description() + " names no file");
    FileDescriptor directory = makeDirectoryInRoot(parts->parent, 0700);
    if (!directory)
        failWithErrno("The store's folder cannot be opened");
    return std::make_unique<EmbeddedStore>(std::move(directory), parts->name);
}
