// The remote backend: records and exports on HTTPS servers, plain ones or S3-compatible object stores.
#include <algorithm>
#include <atomic>
#include <chrono>
#include <ctime>
#include <optional>
#include <string_view>
#include <thread>
#include <utility>

#include <nlohmann/json.hpp>

#include "platform/Format.h"
#include "platform/Hexadecimal.h"
#include "platform/ReverseProxy.h"
#include "platform/Utf8.h"
#include "platform/linux/services/http/ClientShelf.h"
#include "platform/linux/services/http/Http.h"
#include "platform/linux/services/store/OrloRemoteSettings.h"
#include "platform/linux/services/store/OrloStoreBackend.h"

namespace {

using std::chrono::milliseconds;

constexpr std::size_t largestRecord = std::size_t{64} << 20;
constexpr std::size_t largestTrustObject = std::size_t{1} << 20;
constexpr std::size_t largestReply = std::size_t{1} << 20; // to a put, where nothing in it matters

// An object store's keys have at most 1024 bytes and servers take header lines of at most 8 KiB, unless told otherwise.
constexpr std::size_t longestName = 512;
constexpr std::size_t longestQuoted = 64;
constexpr std::size_t longestReason = 64;
constexpr std::size_t longestGrants = 8000;

constexpr milliseconds firstBackoff{200};
constexpr milliseconds longestBackoff{2000};

// A number among the session's options: from 1 to `largest`, to which a larger one is cut; anything else is the
// default.
struct NumberOption {
    const char* key;
    std::int64_t byDefault;
    std::int64_t largest;

    std::int64_t in(const OrloOptions& options) const {
        const Value& value = options[key];
        const std::int64_t number = value.isBoolean() ? 0 : value.integer().value_or(0);
        return number < 1 ? byDefault : std::min(number, largest);
    }
};
constexpr NumberOption timeoutSeconds{"HTTPTimeout", 30, 3600};
constexpr NumberOption attemptsOfOne{"HTTPMaxAttempts", 1, 10};
constexpr NumberOption attemptsOfMany{"MultiRequestMaxAttempts", 1, 10};

// `text` with every octet percent-encoded that `isKept` does not keep.
template <class Kept>
std::string percentEncoded(std::string_view text, Kept isKept) {
    constexpr std::string_view digits = "0123456789ABCDEF";
    std::string encoded;
    for (const char c : text) {
        const auto octet = static_cast<std::uint8_t>(c);
        encoded += isKept(c) ? std::string{c} : std::string{'%', digits[octet >> 4], digits[octet & 0xF]};
    }
    return encoded;
}

// Kept is what RFC 3986 calls unreserved and no more, as the signature asks for.
bool isUnreserved(char c) {
    constexpr std::string_view marks = "-._~";
    return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || marks.find(c) != marks.npos;
}

bool isVisible(char c) {
    return c > ' ' && c < '\x7F';
}

// Whether the name stays below its folder on a server that decodes a path before it looks at its segments, as many do.
bool staysBelow(std::string_view name) {
    for (std::size_t start = 0, end = 0; end < name.size(); start = end + 1) {
        end = std::min(name.find('/', start), name.size());
        const std::string_view step = name.substr(start, end - start);
        if (step.empty() || step == "." || step == "..")
            return false;
    }
    return !name.empty() && name.back() != '/';
}

// Whether an object store's list of its objects, which is XML, can show the name without a trace of it being lost:
// there are no control characters in it and nothing that is no character.
bool canBeListed(std::string_view name) {
    while (!name.empty()) {
        const utf8::Step step = utf8::next(name);
        const bool isControl = step.point < 0x20 || (step.point >= 0x7F && step.point < 0xA0);
        if (step.kind != utf8::Step::Character || isControl || step.point == 0xFFFE || step.point == 0xFFFF)
            return false;
        name.remove_prefix(step.length);
    }
    return true;
}

// The headers by which a server can decide. Of the grants nothing breaks the line or is taken for blanks around it;
// where there are none there is no such header, since one without a value would be signed but not sent.
std::vector<std::string> headersFor(const OrloOptions& options) {
    std::vector<std::string> headers = {"Orlo-Trust-Object-Digest: " +
                                        hexadecimal(*options["TrustObjectDigest"].data())};
    const std::string* grants = options["Permissions"].text();
    if (!grants || grants->empty())
        return headers;
    std::string encoded;
    if (grants->size() <= longestGrants)
        encoded = percentEncoded(*grants, [](char c) { return isVisible(c) && c != '%'; });
    if (encoded.empty() || encoded.size() > longestGrants)
        throw OrloStoreFailure(QDOrloErrorNotPermitted, "The session's grants do not fit into a request");
    headers.push_back("Orlo-Permissions: " + encoded);
    return headers;
}

std::string utcTime(const char* how) {
    const std::time_t now = std::time(nullptr);
    std::tm parts = {};
    char text[32];
    gmtime_r(&now, &parts);
    return {text, std::strftime(text, sizeof text, how, &parts)};
}

std::string randomName() {
    std::uint8_t bytes[8];
    if (!crypto::randomBytes(bytes, sizeof bytes))
        throw OrloStoreFailure(QDOrloErrorStorage, "There is no randomness for the name of an export");
    return hexadecimal(bytes);
}

std::string exportText(const OrloOptions& options, const std::vector<OrloRecordName>& names) {
    nlohmann::ordered_json records = nlohmann::ordered_json::array();
    for (const OrloRecordName& name : names)
        records.push_back({{"class", name.dataClass}, {"instance", name.instance}});
    const nlohmann::ordered_json text = {
        {"dataVersion", dataVersionOf(options)},
        {"ticket", ticketDigestOf(options)},
        {"exportedAt", utcTime("%Y-%m-%dT%H:%M:%SZ")},
        {"records", std::move(records)},
    };
    return text.dump(-1, ' ', false, nlohmann::ordered_json::error_handler_t::replace) + "\n";
}

// The word for the reason that an object store gives in a refusal, or nothing.
std::string_view reasonIn(const http::Answer& answer) {
    constexpr std::string_view open = "<Code>";
    const std::string_view text(reinterpret_cast<const char*>(answer.body.data()), answer.body.size());
    const std::size_t at = text.find(open);
    if (at == text.npos)
        return {};
    const std::string_view rest = text.substr(at + open.size());
    const auto end = std::find_if_not(rest.begin(), rest.end(), isUnreserved);
    return rest.substr(0, std::min(longestReason, static_cast<std::size_t>(end - rest.begin())));
}

[[noreturn]] void failToTransport(const http::Request& request, const std::string& reason) {
    throw OrloStoreFailure(QDOrloErrorTransport, format("%s %s: %s", request.method, request.url, reason));
}

// What a status other than that of success means.
[[noreturn]] void failWith(const http::Request& request, const http::Answer& answer) {
    const std::string_view reason = reasonIn(answer);
    const bool isRecordMissing = answer.status == 404 && !request.body && reason != "NoSuchBucket";
    const bool isRefused = answer.status == 401 || answer.status == 403;
    throw OrloStoreFailure(isRecordMissing ? QDOrloErrorNoSuchRecord
                           : isRefused     ? QDOrloErrorNotPermitted
                                           : QDOrloErrorTransport,
                           format("%s %s: HTTP status %d%s%s", request.method, request.url, answer.status,
                                  reason.empty() ? "" : " ", reason));
}

// Whether a conditional put came too late: its condition does not hold, or another put is under way, or the object that
// it was to replace is gone.
bool isOvertaken(const http::Answer& answer) {
    return answer.status == 412 || answer.status == 409 || (answer.status == 404 && reasonIn(answer) == "NoSuchKey");
}

// Some store compares the tag without the quotes that belong to it (RFC 9110 8.8.3). What was of use last is tried
// first.
std::atomic<bool> tagsAreBare = false;

std::string conditionOn(const http::Answer& found) {
    if (found.status == 404)
        return "If-None-Match: *";
    std::string_view tag = found.tag;
    if (tagsAreBare && tag.size() > 2 && tag.starts_with('"') && tag.ends_with('"'))
        tag = tag.substr(1, tag.size() - 2);
    return "If-Match: " + std::string(tag);
}

// What a session's connections are left on for the next one.
http::ClientShelf& shelf() {
    static http::ClientShelf only(std::chrono::minutes(1), std::chrono::minutes(10));
    return only;
}

class RemoteStore : public OrloStoreBackend {
public:
    explicit RemoteStore(OrloRemoteSettings settings)
        : settings_(std::move(settings)), loan_(shelf().take(std::move(settings_.way))) {}
    ~RemoteStore() override { shelf().put(std::move(loan_)); }

    Value::Data trustObject(const OrloOptions& options, std::string_view url) override {
        measure_.reset(); // a session that begins anew is measured by what the store has now
        return fetchTrustObject(options, std::string(url), "");
    }

    // What `url` of trustObject gave may have come without TLS, and then proves nothing.
    Value::Data trustMeasure(const OrloOptions& options) override {
        if (!measure_)
            measure_ = fetchTrustObject(options, endpoint(options, "CAURL"), "/orlotrustobject");
        return *measure_;
    }

    void put(const OrloOptions& options, const OrloRecordName& name, const Value::Data& data) override {
        if (data.size() > largestRecord)
            throw OrloStoreFailure(QDOrloErrorStorage, format("A record of %lu bytes is too large", data.size()));
        const bool isConditional = settings_.objectStore && settings_.objectStore->isConditional;
        putBytes(options, recordPath(options, name), data, attemptsOfOne,
                 isConditional ? &RemoteStore::sendIfUnchanged : &RemoteStore::sendOnce);
    }

    Value::Data copy(const OrloOptions& options, const OrloRecordName& name) override {
        http::Request request = dataStoreRequest("GET", options);
        request.maximumAnswer = largestRecord;
        request.endMustBeMarked = true;
        http::Answer answer =
            exchange(options, endpoint(options, "DSURL"), recordPath(options, name), request, attemptsOfOne);
        if (answer.status != 200)
            failWith(request, answer);
        return std::move(answer.body);
    }

    void multiExport(const OrloOptions& options, const std::vector<OrloRecordName>& names) override {
        const std::string text = exportText(options, names);
        const std::string path = versionPath(options) + "/exports/" + ticketDigestOf(options) + "/" +
                                 utcTime("%Y%m%dT%H%M%SZ") + "-" + randomName() + ".json";
        // Nobody else puts an object of this name, so that one which is late overtakes nothing.
        putBytes(options, path, std::span(reinterpret_cast<const std::uint8_t*>(text.data()), text.size()),
                 attemptsOfMany, &RemoteStore::sendAsItIs);
    }

private:
    // Makes one attempt of a request, which takes no longer than its limit. On return and on failure the request is the
    // one that the outcome is about.
    using Send = http::Answer (RemoteStore::*)(http::Request& request);

    http::Answer sendAsItIs(http::Request& request) { return loan_.client->exchange(request); }

    // What is sent twice could be carried out a second time after a later put has been answered.
    http::Answer sendOnce(http::Request& request) {
        request.isSentOnce = true;
        return loan_.client->exchange(request);
    }

    // Puts on condition that the object is still what it was before. A put whose client has given up may be carried out
    // at any time after: its condition does not hold any more once a later one has been answered, unless that one put
    // the very bytes of before, since tags stand for contents.
    http::Answer sendIfUnchanged(http::Request& request) {
        const http::Request put = request;
        const auto end = std::chrono::steady_clock::now() + put.limits.timeout;
        const auto timeLeft = [&] {
            return std::chrono::duration_cast<milliseconds>(end - std::chrono::steady_clock::now());
        };
        const auto send = [&](const char* method, const std::string& condition) {
            request = put;
            request.method = method;
            request.limits = {.timeout = std::max(timeLeft(), milliseconds(1))};
            if (!condition.empty())
                request.headers.push_back(condition);
            else
                request.body.reset();
            request.maximumAnswer = condition.empty() ? largestRecord : largestReply;
            request.endMustBeMarked = condition.empty();
            return loan_.client->exchange(request);
        };
        http::Answer found = send("HEAD", "");
        for (milliseconds backoff{0};; backoff = nextBackoff(backoff)) {
            if (found.failure || found.status >= 500)
                return found;
            if (found.status != 200 && found.status != 404)
                failWith(request, found);
            if (found.status == 200 && found.tag.empty())
                failToTransport(request, "The answer has no tag, so that no condition can be made of it");
            http::Answer answer = send("PUT", conditionOn(found));
            if (!isOvertaken(answer) || timeLeft() <= backoff)
                return answer;
            std::this_thread::sleep_for(backoff);
            http::Answer now = send("HEAD", "");
            if (now.failure)
                return now;
            if (now.status == found.status && now.tag == found.tag) {
                // Nobody has changed it, so that the store did not understand the tag, unless it was only busy (409).
                if (answer.status == 412 && now.status == 200)
                    tagsAreBare = !tagsAreBare;
            } else {
                now = send("GET", "");
                if (now.status == 200 &&
                    std::equal(now.body.begin(), now.body.end(), put.body->begin(), put.body->end()))
                    return now; // it was this put's own, whose answer got lost, or as good
            }
            found = std::move(now);
        }
    }

    static milliseconds nextBackoff(milliseconds backoff) {
        return std::clamp(2 * backoff, firstBackoff, longestBackoff);
    }

    Value::Data fetchTrustObject(const OrloOptions& options, const std::string& server, std::string_view path) {
        http::Request request = {.method = "GET", .maximumAnswer = largestTrustObject};
        request.endMustBeMarked = true;
        http::Answer answer = exchange(options, server, path, request, attemptsOfOne);
        if (answer.status != 200)
            failToTransport(request, format("HTTP status %d", answer.status));
        if (answer.body.empty())
            failToTransport(request, "The trust object is empty");
        return std::move(answer.body);
    }

    void putBytes(const OrloOptions& options, const std::string& path, std::span<const std::uint8_t> bytes,
                  const NumberOption& attempts, Send send) {
        constexpr long stored[] = {200, 201, 204};
        http::Request request = dataStoreRequest("PUT", options);
        request.body = bytes;
        const http::Answer answer = exchange(options, endpoint(options, "DSURL"), path, request, attempts, send);
        if (std::find(std::begin(stored), std::end(stored), answer.status) == std::end(stored))
            failWith(request, answer);
    }

    http::Request dataStoreRequest(const char* method, const OrloOptions& options) const {
        return {
            .method = method,
            .maximumAnswer = largestReply,
            .headers = headersFor(options),
            .signature = settings_.objectStore ? &settings_.objectStore->signature : nullptr,
        };
    }

    std::string versionPath(const OrloOptions& options) const {
        const std::string bucket = settings_.objectStore ? "/" + settings_.objectStore->bucket : "";
        return bucket + "/v" + std::to_string(dataVersionOf(options));
    }

    std::string recordPath(const OrloOptions& options, const OrloRecordName& name) const {
        return versionPath(options) + "/records/" + inPath(name.dataClass, true) + "/" + inPath(name.instance, false);
    }

    // A name as it stands in a path. An object store signs for the path that it gets when it decodes the one it was
    // sent and encodes it again, with its slashes as they are; so a slash is sent as one there, and a class has none,
    // since that would read as another class.
    std::string inPath(std::string_view name, bool isClass) const {
        const bool isObject = settings_.objectStore.has_value();
        const bool isKept = !isObject || (canBeListed(name) && !(isClass && name.find('/') != name.npos));
        if (!isKept || !staysBelow(name) || name.find('\0') != name.npos || name.size() > longestName)
            throw OrloStoreFailure(QDOrloErrorStorage, "A server can keep no record under the name " +
                                                           utf8::quoted(utf8::beginning(name, longestQuoted)));
        return percentEncoded(name, [&](char c) { return isUnreserved(c) || (isObject && c == '/'); });
    }

    // An endpoint of the session's options.
    static std::string endpoint(const OrloOptions& options, const char* key) {
        const std::string* url = options[key].text();
        if (!url || !url->starts_with("https://"))
            throw OrloStoreFailure(QDOrloErrorTransport, format("The session's %s is no https URL", key));
        return *url;
    }

    // The description of the proxies that the session's options want; it is asked for once.
    Value proxiesFor(const OrloOptions& options, const std::string& server) {
        if (!options["EnableProxy"].boolean().value_or(false))
            return {};
        if (!proxies_)
            proxies_ = RPCopyProxyDictionaryWithOptions(server, Value::Dictionary{{"TestReachability", false}});
        Value wanted = *proxies_;
        if (wanted.dictionary() && options["EnableProxySsl"] != Value("ForHttps"))
            wanted.dictionary()->erase("HTTPSEnable");
        return wanted;
    }

    // Sends the request, whose URL becomes that of `path` on `server`, as often as it may be and as is of use.
    http::Answer exchange(const OrloOptions& options, const std::string& server, std::string_view path,
                          http::Request& request, const NumberOption& attempts, Send send = &RemoteStore::sendAsItIs) {
        if (server.find('@') != server.npos)
            throw OrloStoreFailure(QDOrloErrorTransport, "A server's URL has to do without user and password");
        request.url = server + std::string(path);
        if (const auto failure = http::aim(request, server, path, proxiesFor(options, server)))
            failToTransport(request, failure->reason);
        request.limits = {.timeout = std::chrono::seconds(timeoutSeconds.in(options))};
        const http::Request whole = request;
        http::Answer answer = (this->*send)(request);
        milliseconds backoff = firstBackoff;
        for (std::int64_t left = attempts.in(options); left > 1 && mayPass(answer); --left) {
            std::this_thread::sleep_for(backoff);
            backoff = nextBackoff(backoff);
            request = whole;
            answer = (this->*send)(request);
        }
        if (answer.failure)
            failToTransport(request, answer.failure->reason);
        return answer;
    }

    // Whether another attempt may bring a better answer.
    static bool mayPass(const http::Answer& answer) {
        return answer.failure ? answer.failure->isTransient() : answer.status >= 500;
    }

    OrloRemoteSettings settings_;
    http::ClientShelf::Loan loan_;
    std::optional<Value> proxies_;
    std::optional<Value::Data> measure_; // the trust object as it last came over TLS
};

} // namespace

std::unique_ptr<OrloStoreBackend> openRemoteStore(const Value& store) {
    return std::make_unique<RemoteStore>(readRemoteSettings(store));
}
