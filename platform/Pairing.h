// The pairing client library: provisions and pairs the secure face sensor (Corvo) with a pairing server.
//
// On Linux it speaks HTTP. Provisioning posts to <url>/provision. Pairing posts to <url>/pair, hands the body of the
// answer to the patch-load callback as the ticket, and posts the callback's result, in decimal, to <url>/pair/result.
// The proxy description decides the way: for an https URL the entries "HTTPSEnable", "HTTPSProxy" and "HTTPSPort", for
// an http URL those with "HTTP"; without them the server is addressed directly. The certificate of an https server is
// always verified, no redirection is followed, and a server that stops answering is given up after a minute. A ticket
// whose length the server does not state ends with the connection: servers should state it.
//
// A failure is an Error of domain "BWCErrorDomain": the HTTP status when it is not 2xx, the transport's code
// (libcurl's) when the exchange fails, and -1 when the callback's result is not 0, which the server is told first.
#ifndef VELTRA_PLATFORM_PAIRING_H
#define VELTRA_PLATFORM_PAIRING_H

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "platform/Error.h"
#include "platform/Value.h"

// Loads the firmware patch that belongs to the ticket; 0 on success. The bytes live for the call only.
using BWCPatchLoad = std::function<std::int32_t(const std::uint8_t* ticket, std::size_t length)>;

// Both return true on success and fill *error on failure; `proxy` is a proxy description or nothing. They block the
// calling thread for the whole exchange. The callback may run on any thread, also more than once.
bool BWCProvisionCorvoWithProxy(const std::string& url, const Value& proxy, std::optional<Error>* error);
bool BWCPairCorvoWithProxy(const std::string& url, const Value& proxy, std::optional<Error>* error,
                           const BWCPatchLoad& loadPatch);

#endif
