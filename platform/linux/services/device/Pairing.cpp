#include "platform/Pairing.h"

#include <chrono>
#include <string_view>
#include <utility>

#include "platform/Format.h"
#include "platform/linux/services/http/Http.h"

namespace {

constexpr std::size_t maximumAnswer = std::size_t{16} << 20;
constexpr http::Limits limits{.timeout = std::chrono::minutes(5),
                              .connectTimeout = std::chrono::seconds(30),
                              .idleTimeout = std::chrono::seconds(60)};
constexpr std::int64_t patchNotLoaded = -1;

bool refuse(std::optional<Error>* error, std::int64_t code, std::string text) {
    if (error)
        *error = Error{"BWCErrorDomain", code, std::move(text)};
    return false;
}

// Posts to an endpoint of the server; the body of a 2xx answer goes to *answer.
bool post(const std::string& server, std::string_view endpoint, const Value& proxyDescription, std::string_view body,
          Value::Data* answer, std::optional<Error>* error) {
    http::Request request{.method = "POST", .limits = limits, .maximumAnswer = maximumAnswer};
    request.body = std::span(reinterpret_cast<const std::uint8_t*>(body.data()), body.size());
    http::Answer answered{.failure = http::aim(request, server, endpoint, proxyDescription)};
    if (!answered.failure)
        answered = http::Client().exchange(request);
    if (answered.failure)
        return refuse(error, static_cast<std::int64_t>(answered.failure->code), std::move(answered.failure->reason));
    if (!answered.isSuccess())
        return refuse(error, std::int64_t{answered.status},
                      format("POST %s was answered with HTTP status %d", http::pathOf(request.url), answered.status));
    if (answer)
        *answer = std::move(answered.body);
    return true;
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
