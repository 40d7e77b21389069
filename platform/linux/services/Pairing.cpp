#include "platform/Pairing.h"

#include <memory>
#include <mutex>
#include <new>
#include <string_view>
#include <utility>

#include <curl/curl.h>

#include "platform/Format.h"

namespace {

constexpr std::size_t maximumAnswer = std::size_t{16} << 20;
constexpr long connectSeconds = 30;
constexpr long silenceSeconds = 60;
constexpr long exchangeSeconds = 300;
constexpr std::int64_t patchNotLoaded = -1;

using CurlPtr = std::unique_ptr<CURL, decltype(&curl_easy_cleanup)>;
using UrlPtr = std::unique_ptr<CURLU, decltype(&curl_url_cleanup)>;
using HeadersPtr = std::unique_ptr<curl_slist, decltype(&curl_slist_free_all)>;

bool refuse(std::optional<Error>* error, std::int64_t code, std::string text) {
    if (error)
        *error = Error{"BWCErrorDomain", code, std::move(text)};
    return false;
}

bool refuse(std::optional<Error>* error, CURLcode code, const char* text = "") {
    return refuse(error, static_cast<std::int64_t>(code), std::string(*text ? text : curl_easy_strerror(code)));
}

std::string part(CURLU* url, CURLUPart which) {
    char* text = nullptr;
    if (curl_url_get(url, which, &text, 0) != CURLUE_OK)
        return {};
    const std::unique_ptr<char, decltype(&curl_free)> owner(text, curl_free);
    return text;
}

// The URL of the server with `endpoint` at the end of its path, or null.
UrlPtr endpointOf(const std::string& server, std::string_view endpoint) {
    UrlPtr url(curl_url(), curl_url_cleanup);
    if (!url || server.find('\0') != std::string::npos ||
        curl_url_set(url.get(), CURLUPART_URL, server.c_str(), CURLU_NON_SUPPORT_SCHEME) != CURLUE_OK)
        return {nullptr, curl_url_cleanup};
    std::string path = part(url.get(), CURLUPART_PATH);
    while (path.ends_with('/'))
        path.pop_back();
    if (curl_url_set(url.get(), CURLUPART_PATH, path.append(endpoint).c_str(), 0) != CURLUE_OK)
        return {nullptr, curl_url_cleanup};
    return url;
}

// The proxy for `scheme` as a URL, empty for none; nothing when the description enables one that it does not name.
std::optional<std::string> proxyFor(const std::string& scheme, const Value& description) {
    const std::string prefix = scheme == "https" ? "HTTPS" : "HTTP";
    if (!description[prefix + "Enable"].boolean().value_or(false))
        return "";
    const std::string* host = description[prefix + "Proxy"].text();
    const auto port = description[prefix + "Port"].integer();
    if (!host || host->empty() || !port || *port < 1 || *port > 65535)
        return std::nullopt;
    const bool bare = host->find(':') != std::string::npos && !host->starts_with('['); // an IPv6 address
    return "http://" + (bare ? "[" + *host + "]" : *host) + ":" + std::to_string(*port);
}

struct Answer {
    Value::Data body;
    bool tooLarge = false;
};

// libcurl calls this through C, which no exception may cross.
std::size_t receive(char* bytes, std::size_t, std::size_t count, void* context) try {
    auto& answer = *static_cast<Answer*>(context);
    answer.tooLarge = count > maximumAnswer - answer.body.size();
    if (answer.tooLarge)
        return 0;
    answer.body.insert(answer.body.end(), bytes, bytes + count);
    return count;
} catch (const std::bad_alloc&) {
    return 0;
}

// One POST. The environment's proxy variables have no say, since the proxy description is the way.
class Post {
public:
    Post(CURLU* url, const std::string& proxy, const std::string& body)
        : curl_(curl_easy_init(), curl_easy_cleanup), headers_(nullptr, curl_slist_free_all) {
        for (const char* header : {"Content-Type: application/octet-stream", "Expect:"})
            if (curl_slist* longer = curl_slist_append(headers_.get(), header)) {
                static_cast<void>(headers_.release()); // it is the head of the longer one
                headers_.reset(longer);
            }
        set(CURLOPT_CURLU, url);
        set(CURLOPT_PROTOCOLS_STR, "http,https");
        set(CURLOPT_PROXY, proxy.c_str());
        set(CURLOPT_NOPROXY, "");
        set(CURLOPT_POST, 1L);
        set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body.size()));
        set(CURLOPT_COPYPOSTFIELDS, body.c_str());
        set(CURLOPT_HTTPHEADER, headers_.get());
        set(CURLOPT_WRITEFUNCTION, receive);
        set(CURLOPT_WRITEDATA, &answer_);
        set(CURLOPT_ERRORBUFFER, problem_);
        set(CURLOPT_NOSIGNAL, 1L);
        set(CURLOPT_CONNECTTIMEOUT, connectSeconds);
        set(CURLOPT_LOW_SPEED_LIMIT, 1L);
        set(CURLOPT_LOW_SPEED_TIME, silenceSeconds);
        set(CURLOPT_TIMEOUT, exchangeSeconds);
    }

    bool send(const std::string& path, Value::Data* body, std::optional<Error>* error) {
        if (result_ == CURLE_OK)
            result_ = curl_ ? curl_easy_perform(curl_.get()) : CURLE_FAILED_INIT;
        if (answer_.tooLarge)
            return refuse(error, result_, "The server's answer is larger than 16 MiB");
        if (result_ != CURLE_OK)
            return refuse(error, result_, problem_);
        long status = 0;
        curl_easy_getinfo(curl_.get(), CURLINFO_RESPONSE_CODE, &status);
        if (status < 200 || status > 299)
            return refuse(error, std::int64_t{status},
                          format("POST %s was answered with HTTP status %d", path, status));
        if (body)
            *body = std::move(answer_.body);
        return true;
    }

private:
    template <class Setting>
    void set(CURLoption option, Setting setting) {
        if (curl_ && result_ == CURLE_OK)
            result_ = curl_easy_setopt(curl_.get(), option, setting);
    }

    CurlPtr curl_;
    HeadersPtr headers_;
    Answer answer_;
    char problem_[CURL_ERROR_SIZE] = "";
    CURLcode result_ = CURLE_OK;
};

// Posts to an endpoint of the server; the body of a 2xx answer goes to *answer.
bool post(const std::string& server, std::string_view endpoint, const Value& proxyDescription, const std::string& body,
          Value::Data* answer, std::optional<Error>* error) {
    static std::once_flag once;
    std::call_once(once, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
    const UrlPtr url = endpointOf(server, endpoint);
    if (!url)
        return refuse(error, CURLE_URL_MALFORMAT);
    const auto proxy = proxyFor(part(url.get(), CURLUPART_SCHEME), proxyDescription);
    if (!proxy)
        return refuse(error, CURLE_COULDNT_RESOLVE_PROXY, "The proxy description names no host and port");
    return Post(url.get(), *proxy, body).send(part(url.get(), CURLUPART_PATH), answer, error);
}

} // namespace

bool BWCProvisionCorvoWithProxy(const std::string& url, const Value& proxy, std::optional<Error>* error) {
    return post(url, "/provision", proxy, "", nullptr, error);
}

bool BWCPairCorvoWithProxy(const std::string& url, const Value& proxy, std::optional<Error>* error,
                           const BWCPatchLoad& loadPatch) {
    Value::Data ticket;
    if (!post(url, "/pair", proxy, "", &ticket, error))
        return false;
    const std::int32_t result = loadPatch(ticket.data(), ticket.size());
    if (!post(url, "/pair/result", proxy, std::to_string(result), nullptr, error))
        return false;
    if (result != 0)
        return refuse(error, patchNotLoaded, format("The firmware patch was not loaded, result = %d", result));
    return true;
}
