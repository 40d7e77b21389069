#include "orlo/OrloSession.h"

#include "platform/Crypto.h"
#include "platform/Files.h"

namespace {

std::string identityText(const Value& identity) {
    if (const std::string* text = identity.text())
        return *text;
    const Value text = identity.data() ? QDOrloCreateInstanceString(identity) : Value();
    return text.isNothing() ? identity.description() : "<" + *text.text() + ">";
}

bool isCollection(const Value& value) {
    return value.array() || value.dictionary();
}

} // namespace

Value joinedInstance(const Value& first, const Value& second) {
    if (isCollection(first) || isCollection(second))
        return {};
    return identityText(first) + "-" + identityText(second);
}

std::optional<Value::Data> readApTicket(const LogSource& log) {
    std::optional<Error> error;
    const Value path =
        KelvoDataAccessor::sharedDataAccessor().copyPathForPersonalizedData(KelvoDataAccessor::apTicketKind, &error);
    if (error)
        log.info("KelvoDataAccessor error: %@", error);
    log.info("Getting Apticket Path from KelvoDataAccessor : %@", path);
    std::optional<Value::Data> ticket;
    if (path.text())
        ticket = files::readWhole(*path.text());
    if (!ticket)
        log.error("Could not read AP ticket: %@", path);
    return ticket;
}

std::optional<Error> setTrustObjectOptions(const LogSource& log, std::string_view domain, __QDOrlo* session,
                                           const Value::Data& trustObject, OrloErrorHere noDigest,
                                           OrloErrorHere noMemory) {
    QDOrloSetOption(session, "TrustObject", trustObject);
    std::uint8_t digest[crypto::sha256Size];
    const std::int32_t status =
        QDSupportDigestSha256(trustObject.data(), static_cast<std::uint32_t>(trustObject.size()), digest);
    if (status != 0)
        return makeOrloError(log, domain, noDigest, status);
    std::optional<Value::Data> value =
        madeIfMemorySuffices([&] { return Value::Data(std::begin(digest), std::end(digest)); });
    if (!value)
        return makeOrloError(log, domain, noMemory);
    QDOrloSetOption(session, "TrustObjectDigest", std::move(*value));
    return std::nullopt;
}
