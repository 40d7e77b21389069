#include "platform/linux/services/OrloStoreBackend.h"

const Value& optionOf(const OrloOptions& options, std::string_view key) {
    static const Value nothing;
    const auto found = options.find(key);
    return found == options.end() ? nothing : found->second;
}

std::int64_t dataVersionOf(const OrloOptions& options) {
    return *options.at("DataVersion").integer();
}

std::string ticketDigestOf(const OrloOptions& options) {
    const Value::Data& ticket = *options.at("APTicket").data();
    Value::Data digest(crypto::sha256Size);
    if (!crypto::sha256(ticket.data(), ticket.size(), digest.data()))
        throw OrloStoreFailure(QDOrloErrorStorage, "The AP ticket cannot be digested");
    return *QDOrloCreateInstanceString(digest).text();
}
