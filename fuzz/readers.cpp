// Any octets to the readers of what comes from files and servers, each of which may hold so many bytes of memory for an
// octet of its input. The first octet says to which reader the others go.
#include <algorithm>
#include <atomic>
#include <chrono>
#include <ostream>
#include <span>
#include <string>
#include <string_view>
#include <thread>

#ifdef VELTRA_FUZZ
#include <sanitizer/allocator_interface.h>
#endif
#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include "Daemon/CrashLogs.h"
#include "fuzz/Fuzz.h"
#include "platform/Base64.h"
#include "platform/CertificateService.h"
#include "platform/Json.h"
#include "platform/KeyedArchive.h"
#include "platform/PropertyList.h"
#include "platform/URL.h"
#include "platform/linux/services/http/Http.h"
#include "platform/linux/services/store/OrloRemoteSettings.h"
#include "platform/linux/services/store/OrloStoreBackend.h"
#include "platform/linux/system/DescriptionCheck.h"
#include "tests/support/TemporaryRoot.h"
#include "tools/orloctl/ShowFile.h"

namespace {

using Octets = std::span<const std::uint8_t>;

std::string_view textOf(Octets octets) {
    return {reinterpret_cast<const char*>(octets.data()), octets.size()};
}

Value::Data dataOf(Octets octets) {
    return {octets.begin(), octets.end()};
}

DERItem itemOf(Octets octets) {
    return {octets.data(), octets.size()};
}

const TemporaryRoot& root() {
    static const TemporaryRoot shared;
    return shared;
}

// As a device description, whose faults are said too.
void readJson(Octets octets) {
    std::string refusal;
    const std::optional<Value> value = jsonToValue(textOf(octets), &refusal);
    FUZZ_REQUIRE(value.has_value() == refusal.empty());
    FUZZ_REQUIRE(!value || descriptionFaults(*value).size() <= 21);
}

void readURL(Octets octets) {
    (void)isWellFormedURL(textOf(octets)); // which need not agree with libcurl
    http::Request request{.method = "GET"};
    (void)http::aim(request, std::string(textOf(octets)), "/records", {});
}

// What is accepted comes back from an encoding of its own. (It need not be this one: the bits of the last character
// that no octet has may be any.)
void readBase64(Octets octets) {
    const std::optional<Value::Data> data = base64Decode(textOf(octets));
    FUZZ_REQUIRE(!data || (data->size() <= octets.size() / 4 * 3 && base64Decode(base64Encode(*data)) == data));
}

// The store's settings, with the octets as one of its files.
void readStoreFile(Octets octets, const char* store) {
    root().write("/file", textOf(octets));
    ::chmod(root().host("/file").c_str(), S_IRUSR);
    try {
        (void)readRemoteSettings(*jsonToValue(store));
    } catch (const OrloStoreFailure&) {
    }
    ::unlink(root().host("/file").c_str());
}

constexpr char accessKeyStore[] = R"({"s3": {"region": "r", "bucket": "b", "accessKeyFile": "/file"}})";

// A folder with one crash log: its name is the first line, its contents are the rest.
void readCrashLogs(Octets octets) {
    const std::string_view text = textOf(octets);
    const std::size_t end = std::min(text.find('\n'), text.size());
    std::string name(text.substr(0, std::min<std::size_t>(end, 200)));
    std::erase_if(name, [](char c) { return c == '/' || c == '\0'; });
    const std::string path = "/private/var/logs/" + (name == "." || name == ".." ? "" : name) + ".log";
    root().write("/System/Library/Quennel/SystemVersion.plist",
                 "<plist><dict><key>ProductBuildVersion</key><string>1</string></dict></plist>");
    root().write(path, text.substr(std::min(end + 1, text.size())));
    Value response;
    FUZZ_REQUIRE(get_ramdisk_logs(&response) == (response["Data"].isNothing() ? 45 : 0));
    ::unlink(root().host(path).c_str());
}

// A server on the loopback interface.
struct Server {
    Server() {
        sockaddr_in address = {};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t length = sizeof address;
        auto* const any = reinterpret_cast<sockaddr*>(&address);
        FUZZ_REQUIRE(::bind(listener, any, length) == 0 && ::listen(listener, 1) == 0 &&
                     ::getsockname(listener, any, &length) == 0);
        url = "http://127.0.0.1:" + std::to_string(ntohs(address.sin_port)) + "/";
    }

    // Answers the next request.
    void answer(Octets octets) const {
        const int connection = ::accept(listener, nullptr, nullptr);
        std::string request;
        char bytes[1024];
        for (ssize_t count = 1; count > 0 && request.find("\r\n\r\n") == std::string::npos;) {
            count = ::recv(connection, bytes, sizeof bytes, 0);
            request.append(bytes, static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
        }
        (void)::send(connection, octets.data(), octets.size(), MSG_NOSIGNAL);
        ::close(connection);
    }

    const int listener = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    std::string url;
};

// An answer that is taken ends where its headers say.
void readHttpAnswer(Octets octets) {
    static const Server server;
    std::thread answering([octets] { server.answer(octets); });
    const std::chrono::milliseconds limit(5000);
    const http::Answer answer = http::Client().exchange({.method = "GET",
                                                         .url = server.url,
                                                         .limits = {limit, limit, std::chrono::seconds(5)},
                                                         .maximumAnswer = 1 << 16,
                                                         .endMustBeMarked = true});
    FUZZ_REQUIRE(answer.body.size() <= octets.size());
    answering.join();
}

// Refused with the one failure, or decoded to a value that comes back equal from an archive of its own.
void readKeyedArchive(Octets octets) {
    Value object;
    try {
        if (const auto decoder = ArchiveDecoder::create(dataOf(octets), nullptr))
            object = decoder->decode("k");
    } catch (const ArchiveFailure&) {
    }
    if (object.isNothing())
        return;
    const auto again = ArchiveDecoder::create(archiveEncode("k", object), nullptr);
    FUZZ_REQUIRE(again && again->decode("k") == object);
    const std::string description = object.description();
    FUZZ_REQUIRE(object.text() || (description.size() <= 8192 && description.find('\n') == std::string::npos));
}

// What is one certificate is no message of certificates. A serial number that comes out stands in the octets as it is,
// and has none that an INTEGER does not need (X.690 8.3.2).
void readCertificates(Octets octets) {
    const auto single = CertificateService::createCertificateWithBytes(octets.data(), octets.size());
    auto list = CertificateService::copyCertificatesFromCertsOnlyMessage(dataOf(octets));
    FUZZ_REQUIRE(!list || !single);
    if (single)
        list = {single};
    for (std::size_t i = 0; list && i < list->size(); ++i) {
        const auto serial = CertificateService::copySerialNumberData((*list)[i], nullptr);
        FUZZ_REQUIRE(serial && !serial->empty());
        FUZZ_REQUIRE(std::search(octets.begin(), octets.end(), serial->begin(), serial->end()) != octets.end());
        const std::uint8_t first = serial->front();
        FUZZ_REQUIRE(serial->size() == 1 || first != ((*serial)[1] < 0x80 ? 0x00 : 0xFF));
    }
}

// A report is ok exactly when it names no problem, and it can be printed.
void checkReport(const Report& report, Octets octets) {
    struct Nowhere : std::streambuf {
        int_type overflow(int_type character) override { return character; }
        std::streamsize xsputn(const char*, std::streamsize count) override { return count; }
    } nowhere;
    std::ostream out(&nowhere);
    FUZZ_REQUIRE(report.ok() == report.problem.empty());
    FUZZ_REQUIRE(report.ok() || report.json["problemOffset"] <= octets.size());
    writeJson(out, report);
    writeText(out, report);
}

constexpr std::size_t kibibyte = 1024, mebibyte = 1024 * kibibyte;

// What a reader may hold beside what its input needs, and for each octet.
constexpr struct Reader {
    std::size_t base;
    std::size_t perOctet;
    void (*read)(Octets);
} readers[] = {
    {64 * kibibyte, 256, [](Octets octets) { (void)propertyListToValue(dataOf(octets)); }},
    {16 * kibibyte, 256, readJson},
    {16 * kibibyte, 16, [](Octets octets) { (void)jsonTextMember(textOf(octets), "os_version"); }},
    {16 * kibibyte, 16, readBase64},
    {16 * kibibyte, 64, readURL},
    {256 * kibibyte, 64, [](Octets octets) { readStoreFile(octets, R"({"caFile": "/file"})"); }},
    {64 * kibibyte, 32, [](Octets octets) { readStoreFile(octets, accessKeyStore); }},
    {256 * kibibyte, 64, readCrashLogs},
    {512 * kibibyte, 64, readHttpAnswer},
    {mebibyte, 1024, readKeyedArchive},
    {mebibyte, 512, readCertificates},
    {4 * mebibyte, 100, [](Octets octets) { checkReport(showBcfg(dataOf(octets), {}), octets); }},
    {4 * mebibyte, 100, [](Octets octets) { checkReport(showDer(itemOf(octets)), octets); }},
    {4 * mebibyte, 100, [](Octets octets) { checkReport(showImg4(itemOf(octets)), octets); }},
};

// Reads the octets and requires that the heap never held more than the reader may on top of what it held before. Only
// Clang's sanitizer tells what is held.
void readInProportion(const Reader& reader, Octets octets) {
#ifdef VELTRA_FUZZ
    static std::atomic<std::size_t> held = 0, most = 0;
    static const int installed = __sanitizer_install_malloc_and_free_hooks(
        [](const volatile void*, std::size_t size) {
            const std::size_t now = held += size;
            for (std::size_t before = most; before < now && !most.compare_exchange_weak(before, now);) {
            }
        },
        [](const volatile void* memory) {
            held -= memory ? __sanitizer_get_allocated_size(const_cast<const void*>(memory)) : 0;
        });
    FUZZ_REQUIRE(installed != 0);
    const std::size_t before = held;
    most = before;
    reader.read(octets);
    FUZZ_REQUIRE(most - before <= reader.base + reader.perOctet * octets.size());
#else
    reader.read(octets);
#endif
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (size == 0)
        return 0;
    readInProportion(readers[data[0] % std::size(readers)], {data + 1, size - 1});
    return 0;
}
