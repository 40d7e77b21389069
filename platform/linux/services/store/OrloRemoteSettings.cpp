#include "platform/linux/services/store/OrloRemoteSettings.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <mutex>
#include <string_view>

#include <fcntl.h>
#include <openssl/bio.h>
#include <openssl/pem.h>
#include <sys/stat.h>

#include "platform/DeviceRoot.h"
#include "platform/Files.h"
#include "platform/linux/services/store/OrloStoreBackend.h"
#include "platform/linux/system/OpenSSL.h"

namespace {

constexpr std::size_t largestCaFile = std::size_t{1} << 20;
constexpr std::size_t largestKeyFile = std::size_t{4} << 10;
constexpr std::size_t longestName = 255;
constexpr std::size_t longestRegion = 63; // libcurl signs for no longer one

constexpr std::string_view letters = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
constexpr std::string_view digits = "0123456789";

[[noreturn]] void fail(const std::string& reason) {
    throw OrloStoreFailure(QDOrloErrorStorage, reason);
}

// Whether there is a text of nothing but letters, digits and `others`.
bool isMadeOf(std::string_view text, std::string_view others) {
    const auto allowed = [&](char c) {
        return letters.find(c) != letters.npos || digits.find(c) != digits.npos || others.find(c) != others.npos;
    };
    return !text.empty() && text.size() <= longestName && std::all_of(text.begin(), text.end(), allowed);
}

bool isHost(std::string_view host) {
    if (host.starts_with('['))
        return host.ends_with(']') && isMadeOf(host.substr(1, host.size() - 2), ":.");
    return isMadeOf(host, ".-_");
}

bool isPort(std::string_view port) {
    unsigned number = 0;
    const auto [end, problem] = std::from_chars(port.data(), port.data() + port.size(), number);
    return problem == std::errc() && end == port.data() + port.size() && number >= 1 && number <= 65535;
}

// "host:port"
bool isEndpoint(std::string_view text) {
    const std::size_t colon = text.rfind(':');
    return colon != text.npos && isHost(text.substr(0, colon)) && isPort(text.substr(colon + 1));
}

std::vector<std::string> readConnectTo(const Value& described) {
    if (described.isNothing())
        return {};
    if (!described.dictionary())
        fail("The store's connectTo is no object");
    std::vector<std::string> entries;
    for (const auto& [from, to] : *described.dictionary()) {
        if (!isEndpoint(from) || !to.text() || !isEndpoint(*to.text()))
            fail("The store's connectTo does not map one host:port to another: " + from + " to " + to.description());
        entries.push_back(from + ":" + *to.text());
    }
    return entries;
}

// Whether there are certificates and all of them can be read. That takes longer than all the rest of a session's
// beginning, so what was found good last is known again.
bool hasCertificates(const Value::Data& pem) {
    static std::mutex mutex;                       // guards what follows
    static auto* const lastGood = new Value::Data; // never destroyed: threads may ask until the process is gone
    const std::lock_guard lock(mutex);
    if (pem == *lastGood && !pem.empty())
        return true;
    const openssl::QuietErrors quiet;
    const openssl::Owner<BIO, BIO_free_all> bytes(BIO_new_mem_buf(pem.data(), static_cast<int>(pem.size())));
    bool hasOne = false;
    while (bytes && openssl::Owner<X509, X509_free>(PEM_read_bio_X509(bytes.get(), nullptr, nullptr, nullptr)))
        hasOne = true;
    // The end of the file, and not a certificate that cannot be read.
    if (!hasOne || ERR_GET_REASON(ERR_peek_last_error()) != PEM_R_NO_START_LINE)
        return false;
    *lastGood = pem;
    return true;
}

std::string readAuthorities(const Value& path) {
    if (path.isNothing())
        return {};
    std::optional<Error> error;
    const auto pem = path.text() ? files::readWhole(*path.text(), largestCaFile, &error) : std::nullopt;
    if (!pem)
        fail("The store's caFile " + path.description() +
             " cannot be read: " + (error ? error->text : "it is no path"));
    if (!hasCertificates(*pem))
        fail("The store's caFile " + path.description() + " holds no PEM certificate, or one that cannot be read");
    return {pem->begin(), pem->end()};
}

std::string readSecretFile(const std::string& path) {
    const auto failWithErrno = [&] {
        fail("The store's accessKeyFile " + path + " cannot be read: " + std::strerror(errno));
    };
    const FileDescriptor file = openInRoot(path, O_RDONLY);
    struct stat status = {};
    if (!file || ::fstat(file.get(), &status) != 0)
        failWithErrno();
    if ((status.st_mode & (S_IRWXG | S_IRWXO)) != 0)
        fail("The store's accessKeyFile " + path + " is open to others than its owner; it has to have mode 0600");
    const auto contents = readRegularFile(file, largestKeyFile);
    if (!contents)
        failWithErrno();
    return {contents->begin(), contents->end()};
}

// Takes the first line, without blanks at its end, off `text`.
std::string takeLine(std::string& text) {
    const std::size_t end = std::min(text.find('\n'), text.size());
    std::string line = text.substr(0, end);
    text.erase(0, end + 1);
    line.erase(line.find_last_not_of(" \t\r") + 1);
    return line;
}

bool isVisible(std::string_view text) {
    return !text.empty() && std::all_of(text.begin(), text.end(), [](char c) { return c > ' ' && c < '\x7F'; });
}

OrloRemoteSettings::ObjectStore readObjectStore(const Value& described) {
    const std::string *region = described["region"].text(), *bucket = described["bucket"].text(),
                      *keyFile = described["accessKeyFile"].text();
    if (!region || !isMadeOf(*region, "-_") || region->size() > longestRegion)
        fail("The store's s3 has no region");
    if (!bucket || !isMadeOf(*bucket, ".-_") || bucket->front() == '.')
        fail("The store's s3 has no bucket");
    if (!keyFile)
        fail("The store's s3 has no accessKeyFile");
    const Value& conditional = described["conditional"];
    if (!conditional.isNothing() && !conditional.isBoolean())
        fail("The store's s3 has a conditional that is neither true nor false");
    std::string contents = readSecretFile(*keyFile);
    OrloRemoteSettings::ObjectStore store{
        *bucket, {*region, takeLine(contents), takeLine(contents)}, conditional.boolean().value_or(true)};
    const bool hasMore = contents.find_first_not_of(" \t\r\n") != contents.npos;
    if (hasMore || !isVisible(store.signature.accessKey) || !isVisible(store.signature.secret))
        fail("The store's accessKeyFile " + *keyFile + " does not have two lines, the access key and its secret");
    return store;
}

} // namespace

OrloRemoteSettings readRemoteSettings(const Value& store) {
    OrloRemoteSettings settings;
    settings.way = {readAuthorities(store["caFile"]), readConnectTo(store["connectTo"])};
    if (!store["s3"].isNothing())
        settings.objectStore = readObjectStore(store["s3"]);
    return settings;
}
