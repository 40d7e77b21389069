// The embedded backend: records in an SQLite database below the device root.
#include <cerrno>
#include <cstring>
#include <utility>

#include "platform/DeviceRoot.h"
#include "platform/Format.h"
#include "platform/linux/services/store/OrloDatabase.h"
#include "platform/linux/services/store/OrloStoreBackend.h"
#include "platform/linux/services/store/OrloTrustObject.h"

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
        throw OrloStoreFailure(QDOrloErrorStorage,
                               "The store's folder cannot be opened: " + std::string(std::strerror(errno)));
    return std::make_unique<EmbeddedStore>(std::move(directory), parts->name);
}
