#include "device/ZPDevice.h"

#include <chrono>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/HardwareRegistry.h"
#include "tests/platform/ServicesDouble.h"
#include "tests/support/RecordedLog.h"

namespace {

using Lines = std::vector<std::string>;
using Completion = ComponentAuthService::Completion;

const std::string relay = "TeskAuthI2CRelayInterface";
const std::string authenticator = "TevariAuthCPAID";
const std::string noService = "4 [ZPDevice] cannot get service";
const Value certificate = Value::Data{0x30, 0x00};

Error error(const char* description) {
    return {"TcrtErrorDomain", 400, description};
}

class ZPDeviceCertificate : public testing::Test {
protected:
    ZPDeviceCertificate() {
        servicesDouble() = {};
        recordLog();
    }
    ~ZPDeviceCertificate() override { EXPECT_TRUE(services_.heldServices.empty()); }

    void answerWith(bool passed) {
        services_.authenticate = [passed](const Value&, const Completion& completion) {
            std::thread(completion, passed, Value(), Value(), !passed, -1).detach();
        };
    }

    ServicesDouble& services_ = servicesDouble();
    ZPDevice& device_ = ZPDevice::sharedSingleton();
};

TEST_F(ZPDeviceCertificate, aServiceIsHandedOutOrAnErrorIsReturnedAndLogged) {
    services_.registry[relay];
    std::uint32_t handle = 0;
    EXPECT_FALSE(device_.getService(relay, &handle));
    EXPECT_EQ(services_.heldServices.at(handle), relay);
    EXPECT_EQ(recordedConsole(), Lines{"-[ZPDevice getService:service:] - Entering for service " + relay});
    EXPECT_EQ(recordedLog(), Lines{});
    HardwareRegistry::releaseService(handle);

    handle = 99;
    EXPECT_EQ(device_.getService(authenticator, &handle), error("cannot get service"));
    services_.unmatchableClasses = {relay};
    EXPECT_EQ(device_.getService(relay, &handle), error("can't create matching dict"));
    EXPECT_EQ(handle, 99U);
    EXPECT_EQ(recordedLog(), (Lines{noService, "4 [ZPDevice] can't create matching dict"}));
}

TEST_F(ZPDeviceCertificate, theCertificateComesFromTheFirstServiceThatIsThere) {
    struct Row {
        const char* what;
        std::map<std::string, std::map<std::string, Value, std::less<>>, std::less<>> registry;
        std::set<std::string, std::less<>> unmatchable;
        std::optional<Error> error;
        Value certificate;
        Lines log;
        Lines console;
    };
    const std::map<std::string, Value, std::less<>> holder{{"AccessoryCertificate", certificate}};
    const Error null = error("tcrt is NULL in IOReg");
    const Lines nullLog{"4 [ZPDevice] tcrt is NULL in IOReg"};
    const std::string operation = "-[ZPDevice getTcrtCertificate:] - ";
    const std::string askedFirst = "-[ZPDevice getService:service:] - Entering for service " + relay;
    const std::string askedSecond = "-[ZPDevice getService:service:] - Entering for service " + authenticator;
    const std::string entering = operation + "Entering";
    const std::string service = operation + "IO Service Found ";
    const std::string property = operation + "tcrt Found in IOReg";
    const Lines foundOnFirst{entering, askedFirst, service, property};
    const Lines serviceOnly{entering, askedFirst, service};
    const Lines nothing{entering, askedFirst, askedSecond};
    const Row rows[] = {
        {"first", {{relay, holder}, {authenticator, {}}}, {}, {}, certificate, {}, foundOnFirst},
        {"second",
         {{authenticator, holder}},
         {},
         {},
         certificate,
         {noService},
         {entering, askedFirst, askedSecond, service, property}},
        {"empty", {{relay, {{"AccessoryCertificate", Value::Data{}}}}}, {}, {}, Value::Data{}, {}, foundOnFirst},
        {"none on the first", {{relay, {}}, {authenticator, holder}}, {}, null, "before", nullLog, serviceOnly},
        {"no data", {{relay, {{"AccessoryCertificate", "text"}}}}, {}, null, "before", nullLog, serviceOnly},
        {"no service",
         {},
         {},
         error("cannot get service"),
         "before",
         {noService, noService, "4 [ZPDevice] cannot get service. Giving up."},
         nothing},
        {"nothing matches the second",
         {},
         {authenticator},
         error("can't create matching dict"),
         "before",
         {noService, "4 [ZPDevice] can't create matching dict", "4 [ZPDevice] cannot get service. Giving up."},
         nothing},
    };
    for (const Row& row : rows) {
        services_ = {};
        services_.registry = row.registry;
        services_.unmatchableClasses = row.unmatchable;
        recordLog();
        Value found = "before";
        EXPECT_EQ(device_.getTcrtCertificate(&found), row.error) << row.what;
        EXPECT_EQ(found, row.certificate) << row.what;
        EXPECT_EQ(recordedLog(), row.log) << row.what;
        EXPECT_EQ(recordedConsole(), row.console) << row.what;
        EXPECT_EQ(device_.getTcrtCertificate(nullptr), row.error) << row.what;
        EXPECT_TRUE(services_.heldServices.empty()) << row.what;
    }
}

TEST_F(ZPDeviceCertificate, theRegistryIsSearchedInOrder) {
    services_.registry[authenticator]["AccessoryCertificate"] = certificate;
    EXPECT_FALSE(device_.getTcrtCertificate(nullptr));
    EXPECT_EQ(services_.calls,
              (Lines{"serviceMatching " + relay, "getMatchingService " + relay, "serviceMatching " + authenticator,
                     "getMatchingService " + authenticator, "searchProperty IOService AccessoryCertificate 1"}));
}

TEST_F(ZPDeviceCertificate, theSerialNumberIsThatOfTheFirstCertificateOrOfTheOnlyOne) {
    const Value::Data message{1}, bare{2}, other{3}, emptyMessage{4}, unreadable{5}, both{6};
    services_.messages = {{message, {other, bare}}, {emptyMessage, {}}, {unreadable, {Value::Data{9}}}, {both, {}}};
    services_.serialNumbers = {{bare, {0x01, 0x0A}}, {other, {0x00, 0xFF}}, {both, {0x42}}};
    const struct {
        Value certificate;
        Value expected;
        const char* data;
    } rows[] = {
        {message, "00ff", "<00ff>"}, {bare, "010a", "<010a>"},          {both, "42", "<42>"},    {emptyMessage, {}, ""},
        {unreadable, {}, ""},        {Value::Data{0x30, 0x80}, {}, ""}, {Value::Data{}, {}, ""}, {Value(), {}, ""},
    };
    for (const auto& row : rows) {
        recordLog();
        EXPECT_EQ(device_.getCertificateSerialNumber(row.certificate), row.expected);
        EXPECT_EQ(recordedLog(), row.expected.isNothing()
                                     ? Lines{"4 [ZPDevice] Unable to read Certificate Serial Number"}
                                     : (Lines{std::string("2 [ZPDevice] Serial Number : ") + row.data,
                                              "2 [ZPDevice] Hex Serial Number : " + *row.expected.text()}));
    }
}

TEST_F(ZPDeviceCertificate, aChallengeHas32BytesAndIsNeverTheSame) {
    const Value first = device_.createChallenge();
    EXPECT_EQ(recordedLog(), Lines{"2 [ZPDevice] Challenge : " + first.description()});
    ASSERT_TRUE(first.data());
    EXPECT_EQ(first.data()->size(), 32U);
    EXPECT_NE(device_.createChallenge(), first);
}

TEST_F(ZPDeviceCertificate, theDisplayIsAuthenticatedOnTheM3FamilyOnly) {
    const struct {
        Value model;
        bool isAuthenticated;
    } rows[] = {{"M3", true},  {"xM3", true}, {"M3x", true}, {"xM3x", true}, {"M4", false},
                {"m3", false}, {"", false},   {{}, false},   {3, false}};
    for (const auto& row : rows)
        for (const bool passed : {true, false}) {
            services_ = {};
            services_.answers["HWModelStr"] = row.model;
            answerWith(passed);
            recordLog();
            EXPECT_EQ(device_.authenticateDisplay(), passed || !row.isAuthenticated);
            const Lines log = recordedLog();
            const std::string model = row.model.description();
            ASSERT_GE(log.size(), 3U);
            EXPECT_TRUE(log[0].starts_with("2 [ZPDevice] Challenge : <"));
            EXPECT_EQ(log[1], "2 [ZPDevice] Hardware Model : " + model);
            EXPECT_EQ(Lines(log.begin() + 2, log.end()),
                      row.isAuthenticated
                          ? (Lines{"2 [ZPDevice] Starting Top Module Auth : " + model,
                                   "2 [ZPDevice] Top Module Auth Passsed : " + std::to_string(passed ? 1 : 0)})
                          : Lines{"2 [ZPDevice] Not Applicable. Auth Passsed : 1"});
            EXPECT_EQ(services_.calls.size(), row.isAuthenticated ? 2U : 1U);
        }
}

TEST_F(ZPDeviceCertificate, anAnswerThatComesTooLateChangesNothing) {
    Completion late;
    Value given;
    services_.answers["HWModelStr"] = "M3";
    services_.authenticate = [&](const Value& challenge, Completion completion) {
        given = challenge;
        late = std::move(completion);
    };
    const auto start = std::chrono::steady_clock::now();
    EXPECT_FALSE(device_.authenticateDisplay());
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::seconds(10));
    const Lines log = recordedLog();
    ASSERT_EQ(log.size(), 5U);
    EXPECT_EQ(log[0], "2 [ZPDevice] Challenge : " + given.description());
    EXPECT_EQ(log[3], "2 [ZPDevice] Display Auth not completed within 10 secs. Timeout has occurred");
    EXPECT_EQ(log[4], "2 [ZPDevice] Top Module Auth Passsed : 0");
    late(true, {}, {}, true, 0); // writes to what it alone still owns, as the address sanitizer would tell
    EXPECT_EQ(recordedLog(), log);
}

} // namespace
