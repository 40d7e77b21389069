// HTTP for the services that speak it: one client, on libcurl, with the same care everywhere. The certificate of a
// server is always verified, and names the server in its subjectAltName; a redirection is an answer and is not
// followed; no scheme but http and https is spoken; the environment's variables for proxies and for a log of keys have
// no say; an answer of success with a content coding is refused, and none takes more memory than the request allows.
#ifndef VELTRA_PLATFORM_LINUX_HTTP_H
#define VELTRA_PLATFORM_LINUX_HTTP_H

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include <curl/curl.h>
#include <poll.h>

#include "platform/Value.h"

namespace http {

// Sets libcurl and its TLS library up. As crypto::prepare does for digests, it spares a process that calls it at its
// start what those do when memory ends in their first use.
void prepare();

// Why an exchange had no answer. The code is libcurl's, the reason says what went wrong, without user and password of a
// URL.
struct Failure {
    CURLcode code;
    std::string reason;

    // Whether the same request may succeed at another time: the network failed, or the server did, but neither the
    // request nor the server's identity was at fault.
    bool isTransient() const;
};

// How long an exchange may take.
struct Limits {
    std::chrono::milliseconds timeout{};
    std::chrono::milliseconds connectTimeout = timeout;
    std::chrono::seconds idleTimeout = {}; // without a byte in either direction; 0 is as long as the whole
};

// AWS signature version 4 for an object store (service "s3"). The region has no colon.
struct Signature {
    std::string region;
    std::string accessKey;
    std::string secret;
};

struct Request {
    std::string method;
    std::string url = {};
    Limits limits = {};
    std::size_t maximumAnswer = 0; // octets in the body of an answer with status 2xx
    std::string proxy = {};        // a URL, empty for none
    // "Name: value", without line break; one without a value would be signed but not sent
    std::vector<std::string> headers = {};
    // What is sent as application/octet-stream; the octets have to outlive the exchange.
    std::optional<std::span<const std::uint8_t>> body = {};
    const Signature* signature = nullptr;
    // Refuses an answer of HTTP/1 that goes on until the connection ends: half of it would look like the whole.
    bool endMustBeMarked = false;
    // A kept connection may end just when it is used again, and nobody knows then whether the server has got the
    // request. It is sent anew once, over a new connection, unless it has to be sent once at most. Then it fails, and
    // to make that rare it uses no connection that has been idle for more than two seconds.
    bool isSentOnce = false;
};

// Aims `request` at the well-formed absolute URL `server` with `path` at the end of the URL's own, which begins with a
// slash and is percent-encoded where it has to be, through the proxy that the description `proxies`
// (RPCopyProxyDictionaryWithOptions) has for it. Fails for any other URL, and for a proxy that is enabled but not
// named.
std::optional<Failure> aim(Request& request, const std::string& server, std::string_view path, const Value& proxies);

// The path of a well-formed URL.
std::string pathOf(const std::string& url);

struct Answer {
    std::optional<Failure> failure = {}; // instead of all the rest
    long status = 0;
    Value::Data body = {}; // of a status other than 2xx its beginning at most
    std::string tag = {};  // the header ETag; empty for none, or one with blanks or of more than 256 octets

    bool isSuccess() const { return status >= 200 && status <= 299; }
};

// What a client goes by on its way to every server.
struct Way {
    std::string authorities = {};            // PEM certificates to trust beside those of the system
    std::vector<std::string> connectTo = {}; // "HOST:PORT:CONNECT-TO-HOST:CONNECT-TO-PORT": where to connect instead

    bool operator==(const Way&) const = default;
};

// Keeps the connections that it made, names and TLS sessions for the exchanges after, until something comes over one of
// them unasked. Serves one thread at a time.
class Client {
public:
    explicit Client(Way way = {});

    const Way& way() const { return way_; }

    // Whether the last exchange, if there was one, has had its answer, so that there is no doubt about the connections.
    bool isSound() const { return handle_ && result_ == CURLE_OK; }

    // Raises only std::bad_alloc.
    Answer exchange(const Request& request);

private:
    struct Release {
        void operator()(CURL* handle) const { curl_easy_cleanup(handle); }
        void operator()(curl_slist* list) const { curl_slist_free_all(list); }
    };
    using List = std::unique_ptr<curl_slist, Release>;
    static void append(List& list, const std::string& text);

    template <class Setting>
    void set(CURLoption option, Setting setting);
    void configure(const Request& request);
    void configureTrust();
    void configureBody(const Request& request);
    void sign(const Request& request);

    Way way_;
    List connectTo_; // before the handle, which refers to it
    List headers_;
    CURLcode result_ = CURLE_OK;
    char problem_[CURL_ERROR_SIZE] = "";
    std::vector<pollfd> sockets_; // that are open
    std::unique_ptr<CURL, Release> handle_;
};

} // namespace http

#endif
