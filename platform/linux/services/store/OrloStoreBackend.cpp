#include "platform/linux/services/store/OrloStoreBackend.h"

#include "platform/Hexadecimal.h"

std::int64_t dataVersionOf(const OrloOptions& options) {
    return *options["DataVersion"].integer();
}

std::string ticketDigestOf(const OrloOptions& options) {
    const Value::Data& ticket = *options["APTicket"].data();
    std::uint8_t digest[crypto::sha256Size];
    if (!crypto::sha256(ticket.data(), ticket.size(), digest))
        throw OrloStoreFailure(QDOrloErrorStorage, "The AP ticket cannot be digested");
    return hexadecimal(digest);
}
