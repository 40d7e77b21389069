#include "platform/linux/services/http/Http.h"

#include <algorithm>
#include <mutex>
#include <new>
#include <optional>
#include <string_view>
#include <utility>

#include <openssl/ssl.h>
#include <openssl/x509v3.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <unistd.h>

#include "platform/Crypto.h"
#include "platform/FileDescriptor.h"
#include "platform/Format.h"
#include "platform/Hexadecimal.h"
#include "platform/ShownText.h"
#include "platform/Utf8.h"
#include "platform/linux/system/OpenSSL.h"

namespace http {
namespace {

// Of an answer that is no success only the beginning is of interest, and of no answer more headers than these.
constexpr std::size_t maximumRefusal = std::size_t{16} << 10;
constexpr std::size_t maximumHeaders = std::size_t{64} << 10;
constexpr std::size_t longestTag = 256;

constexpr std::string_view head = "HEAD";

// How many seconds a connection may have been idle when it is used again.
constexpr long longestIdle = 60;
constexpr long longestIdleForOnce = 2;

constexpr CURLcode transientFailures[] = {
    CURLE_COULDNT_RESOLVE_PROXY,
    CURLE_COULDNT_RESOLVE_HOST,
    CURLE_COULDNT_CONNECT,
    CURLE_PARTIAL_FILE,
    CURLE_OPERATION_TIMEDOUT,
    CURLE_SSL_CONNECT_ERROR,
    CURLE_GOT_NOTHING,
    CURLE_SEND_ERROR,
    CURLE_RECV_ERROR,
    CURLE_HTTP2,
    CURLE_HTTP2_STREAM,
};

Failure failure(CURLcode code, const std::string& reason) {
    return {code, withoutUserInfo(reason)};
}

// An answer while it comes in.
struct Incoming {
    CURL* handle;
    std::size_t maximum;
    Answer answer{};
    std::size_t headers = 0;
    bool isTooLarge = false;
    bool isCut = false; // the rest of a refusal is of no interest
    int sendings = 0;   // of a request that is sent once
};

// libcurl calls this through C, which no exception may cross.
std::size_t receive(char* bytes, std::size_t, std::size_t count, void* context) try {
    auto& incoming = *static_cast<Incoming*>(context);
    Answer& answer = incoming.answer;
    curl_easy_getinfo(incoming.handle, CURLINFO_RESPONSE_CODE, &answer.status);
    const std::size_t maximum = answer.isSuccess() ? incoming.maximum : maximumRefusal;
    std::size_t needed = answer.body.size() + count;
    curl_off_t announced = 0;
    if (answer.body.empty() &&
        curl_easy_getinfo(incoming.handle, CURLINFO_CONTENT_LENGTH_DOWNLOAD_T, &announced) == CURLE_OK && announced > 0)
        needed = std::max(needed, static_cast<std::size_t>(announced));
    incoming.isTooLarge = needed > maximum && answer.isSuccess();
    if (incoming.isTooLarge)
        return 0;
    const std::size_t taken = std::min(count, maximum - answer.body.size());
    if (answer.body.empty())
        answer.body.reserve(std::min(needed, maximum));
    answer.body.insert(answer.body.end(), bytes, bytes + taken);
    incoming.isCut = taken < count;
    return taken;
} catch (const std::bad_alloc&) {
    return 0;
}

std::size_t countHeader(char*, std::size_t, std::size_t count, void* context) {
    std::size_t& headers = static_cast<Incoming*>(context)->headers;
    headers += count;
    return headers > maximumHeaders ? 0 : count;
}

// libcurl calls this before it sends a request, and again before it sends the same one anew: when it has had no answer,
// or one that refuses to wait for the body.
int sendOnce(void* context, char*, char*, int, int) {
    constexpr long expectationFailed = 417;
    auto& incoming = *static_cast<Incoming*>(context);
    long status = 0;
    curl_easy_getinfo(incoming.handle, CURLINFO_RESPONSE_CODE, &status);
    if (status != expectationFailed)
        ++incoming.sendings;
    return incoming.sendings <= 1 ? CURL_PREREQFUNC_OK : CURL_PREREQFUNC_ABORT;
}

// The last header with this name of the answer that counts, without blanks around it.
std::optional<std::string_view> headerOf(CURL* handle, const char* name) {
    curl_header* header = nullptr;
    if (curl_easy_header(handle, name, 0, CURLH_HEADER, -1, &header) != CURLHE_OK ||
        curl_easy_header(handle, name, header->amount - 1, CURLH_HEADER, -1, &header) != CURLHE_OK)
        return std::nullopt;
    return header->value;
}

// Whether the answer says where its body ends, to libcurl too: with a length that it can represent, with chunked as the
// last transfer coding (RFC 9112 6.3), or by HTTP/2.
bool hasMarkedEnd(CURL* handle) {
    constexpr std::string_view chunked = "chunked";
    long version = 0;
    curl_off_t length = -1;
    curl_easy_getinfo(handle, CURLINFO_HTTP_VERSION, &version);
    curl_easy_getinfo(handle, CURLINFO_CONTENT_LENGTH_DOWNLOAD_T, &length);
    const std::string_view coding = headerOf(handle, "Transfer-Encoding").value_or("");
    return version >= CURL_HTTP_VERSION_2 || length >= 0 ||
           (coding.size() >= chunked.size() &&
            curl_strequal(coding.substr(coding.size() - chunked.size()).data(), chunked.data()) != 0);
}

bool isTag(std::string_view text) {
    return text.size() <= longestTag && std::ranges::all_of(text, [](char c) { return c > ' ' && c < '\x7F'; });
}

bool namesHosts(const X509* certificate) {
    const openssl::Owner<GENERAL_NAMES, GENERAL_NAMES_free> names(
        static_cast<GENERAL_NAMES*>(X509_get_ext_d2i(certificate, NID_subject_alt_name, nullptr, nullptr)));
    for (int i = 0; names && i < sk_GENERAL_NAME_num(names.get()); ++i)
        if (const int type = sk_GENERAL_NAME_value(names.get(), i)->type; type == GEN_DNS || type == GEN_IPADD)
            return true;
    return false;
}

// Where a certificate has no such names libcurl would turn to its common name, which is no way to name a server any
// more (RFC 9110 4.3.4).
int verifyNames(int isGood, X509_STORE_CTX* context) {
    const bool isServers = X509_STORE_CTX_get_error_depth(context) == 0;
    if (isGood == 0 || !isServers || namesHosts(X509_STORE_CTX_get_current_cert(context)))
        return isGood;
    X509_STORE_CTX_set_error(context, X509_V_ERR_HOSTNAME_MISMATCH);
    return 0;
}

CURLcode prepareTls(CURL*, void* context, void*) {
    SSL_CTX_set_verify(static_cast<SSL_CTX*>(context), SSL_VERIFY_PEER, verifyNames);
    return CURLE_OK;
}

using Url = std::unique_ptr<CURLU, decltype(&curl_url_cleanup)>;

// Null for what is no well-formed absolute URL.
Url parse(const std::string& text) {
    Url url(curl_url(), curl_url_cleanup);
    if (text.find('\0') != std::string::npos ||
        curl_url_set(url.get(), CURLUPART_URL, text.c_str(), CURLU_NON_SUPPORT_SCHEME) != CURLUE_OK)
        url.reset();
    return url;
}

std::string partOf(const std::string& url, CURLUPart which) {
    char* part = nullptr;
    curl_url_get(parse(url).get(), which, &part, 0);
    const std::unique_ptr<char, decltype(&curl_free)> owner(part, curl_free);
    return part ? part : "";
}

using Sockets = std::vector<pollfd>;

// A connection is not for programs that are started meanwhile.
curl_socket_t openSocket(void* sockets, curlsocktype, curl_sockaddr* address) try {
    FileDescriptor opened(::socket(address->family, address->socktype | SOCK_CLOEXEC, address->protocol));
    if (opened)
        static_cast<Sockets*>(sockets)->push_back({opened.get(), POLLIN, 0});
    return opened.release();
} catch (const std::bad_alloc&) {
    return CURL_SOCKET_BAD;
}

int closeSocket(void* sockets, curl_socket_t socket) {
    std::erase_if(*static_cast<Sockets*>(sockets), [socket](const pollfd& open) { return open.fd == socket; });
    return ::close(socket);
}

} // namespace

void prepare() {
    static std::once_flag once;
    std::call_once(once, [] {
        // libcurl would write the keys of every connection to the file that this names.
        ::unsetenv("SSLKEYLOGFILE");
        curl_global_init(CURL_GLOBAL_DEFAULT);
    });
}

bool Failure::isTransient() const {
    return std::ranges::find(transientFailures, code) != std::end(transientFailures);
}

std::optional<Failure> aim(Request& request, const std::string& server, std::string_view path, const Value& proxies) {
    const std::size_t end = std::min(server.find_first_of("?#"), server.size());
    // As given: libcurl would change the case of what is percent-encoded, which a signature covers.
    std::string url = server.substr(0, end);
    while (!path.empty() && url.ends_with('/'))
        url.pop_back();
    url.append(path).append(server, end);
    if (!parse(server) || !parse(url))
        return failure(CURLE_URL_MALFORMAT, curl_easy_strerror(CURLE_URL_MALFORMAT));
    request.url = std::move(url);
    const std::string prefix = partOf(request.url, CURLUPART_SCHEME) == "https" ? "HTTPS" : "HTTP";
    request.proxy.clear();
    if (!proxies[prefix + "Enable"].boolean().value_or(false))
        return std::nullopt;
    const std::string* host = proxies[prefix + "Proxy"].text();
    const auto port = proxies[prefix + "Port"].integer();
    if (!host || host->empty() || host->find('@') != std::string::npos || !port || *port < 1 || *port > 65535)
        return failure(CURLE_COULDNT_RESOLVE_PROXY, "The proxy description names no host and port");
    const bool bare = host->find(':') != std::string::npos && !host->starts_with('['); // an IPv6 address
    request.proxy = "http://" + (bare ? "[" + *host + "]" : *host) + ":" + std::to_string(*port);
    return std::nullopt;
}

std::string pathOf(const std::string& url) {
    return partOf(url, CURLUPART_PATH);
}

Client::Client(Way way) : way_(std::move(way)) {
    prepare();
    for (const std::string& entry : way_.connectTo)
        append(connectTo_, entry);
    handle_.reset(curl_easy_init());
}

Answer Client::exchange(const Request& request) {
    // What came unasked would be taken for the next answer. Or it is the end of a connection.
    // The socket of an attempt that another one was faster than has been closed without a word.
    ::poll(sockets_.data(), sockets_.size(), 0);
    std::erase_if(sockets_, [](const pollfd& socket) { return (socket.revents & POLLNVAL) != 0; });
    if (std::ranges::any_of(sockets_, [](const pollfd& socket) { return socket.revents != 0; })) {
        handle_.reset(curl_easy_init());
        sockets_.clear();
    }
    if (!handle_)
        throw std::bad_alloc();
    // What was set for the exchange before is forgotten; connections, host names and TLS sessions are not.
    curl_easy_reset(handle_.get());
    headers_.reset();
    problem_[0] = '\0';
    result_ = CURLE_OK;
    configure(request);
    Incoming incoming{.handle = handle_.get(), .maximum = request.maximumAnswer};
    set(CURLOPT_WRITEFUNCTION, receive);
    set(CURLOPT_WRITEDATA, &incoming);
    set(CURLOPT_HEADERFUNCTION, countHeader);
    set(CURLOPT_HEADERDATA, &incoming);
    if (request.isSentOnce) {
        set(CURLOPT_PREREQFUNCTION, sendOnce);
        set(CURLOPT_PREREQDATA, &incoming);
    }
    if (result_ == CURLE_OK)
        result_ = curl_easy_perform(handle_.get());
    if (incoming.sendings > 1)
        return {failure(CURLE_GOT_NOTHING, curl_easy_strerror(CURLE_GOT_NOTHING))};
    if (incoming.isTooLarge)
        return {failure(result_, format("The answer is larger than %lu bytes", request.maximumAnswer))};
    if (incoming.headers > maximumHeaders)
        return {failure(result_, "The answer has too many headers")};
    if (result_ != CURLE_OK && !incoming.isCut)
        return {failure(result_, utf8::repaired(*problem_ ? problem_ : curl_easy_strerror(result_)))};
    Answer answer = std::move(incoming.answer);
    curl_easy_getinfo(handle_.get(), CURLINFO_RESPONSE_CODE, &answer.status);
    if (const auto tag = headerOf(handle_.get(), "ETag"); tag && isTag(*tag))
        answer.tag = *tag;
    if (!answer.isSuccess() || request.method == head)
        return answer;
    if (request.endMustBeMarked && !hasMarkedEnd(handle_.get()))
        return {failure(CURLE_WEIRD_SERVER_REPLY, "The answer does not say where it ends")};
    if (headerOf(handle_.get(), "Content-Encoding"))
        return {failure(CURLE_BAD_CONTENT_ENCODING, "The answer has a Content-Encoding")};
    return answer;
}

void Client::append(List& list, const std::string& text) {
    curl_slist* longer = curl_slist_append(list.get(), text.c_str());
    if (!longer)
        throw std::bad_alloc();
    static_cast<void>(list.release()); // it is the head of the longer one
    list.reset(longer);
}

template <class Setting>
void Client::set(CURLoption option, Setting setting) {
    if (result_ == CURLE_OK)
        result_ = curl_easy_setopt(handle_.get(), option, setting);
}

void Client::configure(const Request& request) {
    set(CURLOPT_URL, request.url.c_str());
    // libcurl signs no path that it is to leave as it is. It would only take dot segments out, which those who have a
    // request signed refuse.
    set(CURLOPT_PATH_AS_IS, request.signature ? 0L : 1L);
    set(CURLOPT_PROTOCOLS_STR, "http,https");
    set(CURLOPT_PROXY, request.proxy.c_str());
    set(CURLOPT_NOPROXY, "");
    set(CURLOPT_ERRORBUFFER, problem_);
    set(CURLOPT_OPENSOCKETFUNCTION, openSocket);
    set(CURLOPT_OPENSOCKETDATA, &sockets_);
    set(CURLOPT_CLOSESOCKETFUNCTION, closeSocket);
    set(CURLOPT_CLOSESOCKETDATA, &sockets_);
    set(CURLOPT_NOSIGNAL, 1L);
    set(CURLOPT_QUICK_EXIT, 1L); // a name server that is silent does not outlast the time-out
    set(CURLOPT_CONNECTTIMEOUT_MS, static_cast<long>(request.limits.connectTimeout.count()));
    set(CURLOPT_TIMEOUT_MS, static_cast<long>(request.limits.timeout.count()));
    set(CURLOPT_LOW_SPEED_LIMIT, 1L);
    set(CURLOPT_LOW_SPEED_TIME, static_cast<long>(request.limits.idleTimeout.count()));
    set(CURLOPT_MAXAGE_CONN, request.isSentOnce ? longestIdleForOnce : longestIdle);
    if (connectTo_)
        set(CURLOPT_CONNECT_TO, connectTo_.get());
    configureTrust();
    configureBody(request);
    for (const std::string& header : request.headers)
        append(headers_, header);
    if (request.signature)
        sign(request);
    set(CURLOPT_HTTPHEADER, headers_.get());
}

void Client::configureTrust() {
    set(CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
    set(CURLOPT_SSL_CTX_FUNCTION, prepareTls);
    if (way_.authorities.empty())
        return;
    // These take the place of libcurl's file of authorities but not of its folder, which has the same ones.
    curl_blob blob = {way_.authorities.data(), way_.authorities.size(), CURL_BLOB_NOCOPY};
    set(CURLOPT_CAINFO_BLOB, &blob);
}

void Client::configureBody(const Request& request) {
    set(CURLOPT_NOBODY, request.method == head ? 1L : 0L); // of the answer
    set(CURLOPT_CUSTOMREQUEST, request.method.c_str());
    if (!request.body)
        return;
    // A null pointer would make libcurl ask a callback for the octets.
    set(CURLOPT_POSTFIELDS, request.body->empty() ? "" : reinterpret_cast<const char*>(request.body->data()));
    set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(request.body->size()));
    append(headers_, "Content-Type: application/octet-stream");
}

// libcurl signs every header of the list, and takes the body's digest from this one.
void Client::sign(const Request& request) {
    const Signature& signature = *request.signature;
    std::uint8_t digest[crypto::sha256Size];
    const std::span<const std::uint8_t> body = request.body.value_or(std::span<const std::uint8_t>());
    if (!crypto::sha256(body.data(), body.size(), digest))
        throw std::bad_alloc();
    append(headers_, "x-amz-content-sha256: " + hexadecimal(digest));
    set(CURLOPT_AWS_SIGV4, ("aws:amz:" + signature.region + ":s3").c_str());
    set(CURLOPT_USERNAME, signature.accessKey.c_str());
    set(CURLOPT_PASSWORD, signature.secret.c_str());
}

} // namespace http
