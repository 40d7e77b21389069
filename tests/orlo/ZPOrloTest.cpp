#include "orlo/ZPOrlo.h"

#include <algorithm>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "tests/platform/DataStoreDouble.h"
#include "tests/support/FailingAllocation.h"
#include "tests/support/RecordedLog.h"
#include "tests/support/TemporaryRoot.h"

namespace {

using Lines = std::vector<std::string>;

constexpr const char* trustURL = "trust http://" VELTRA_ORLO_CA_HOST ":8080/orlotrustobject";
const Error libraryError{"QDOrloErrorDomain", 5, "the disk is full"};

class ZPOrloTest : public testing::Test {
protected:
    ZPOrloTest() {
        store_ = {};
        root_.write("/ticket", "ticket");
        recordLog();
    }

    DataStoreDouble& store_ = dataStoreDouble();
    TemporaryRoot root_;
};

Value::Dictionary firstGeneration() {
    return {
        {"DSURL", "https://" VELTRA_ORLO_DATA_STORE_HOST ":8443"},
        {"CAURL", "https://" VELTRA_ORLO_CA_HOST ":8443"},
        {"EnableProxy", true},
        {"EnableProxySsl", "ForHttps"},
        {"VerifyData", false},
        {"APTicket", Value::Data{'t', 'i', 'c', 'k', 'e', 't'}},
        {"OrganizationalUnit", "Devices - Stations"},
        {"DataVersion", 1},
        {"UseSikDataInstance", false},
        {"HTTPTimeout", 30},
        {"HTTPMaxAttempts", 1},
        {"MultiRequestMaxAttempts", 1},
        {"DataStore", "Remote"},
    };
}

Value::Dictionary changed(Value::Dictionary options, const Value::Dictionary& changes) {
    for (const auto& [key, value] : changes)
        options[key] = value;
    return options;
}

TEST_F(ZPOrloTest, eachConstructorHandsTheLibraryItsOptions) {
    const Value::Dictionary second = {{"DataVersion", 7}, {"UseSikDataInstance", true}, {"orlo2Data", true}};
    const struct {
        Value given;
        Value::Dictionary differences;
    } rows[] = {
        {{}, {}},
        {Value::Dictionary{}, {}},
        {Value::Dictionary{{"orlo2Data", true}}, second},
        {Value::Dictionary{{"orlo2Data", 1}}, changed(second, {{"orlo2Data", 1}})},
        {Value::Dictionary{{"orlo2Data", false}}, {{"orlo2Data", false}}},
        {Value::Dictionary{{"HTTPTimeout", 60}, {"Mine", "x"}}, {{"HTTPTimeout", 60}, {"Mine", "x"}}},
        {Value::Dictionary{{"orlo2Data", true}, {"DataVersion", 3}}, changed(second, {{"DataVersion", 3}})},
    };
    for (const auto& row : rows) {
        const ZPOrlo orlo = ZPOrlo::initWithOptions(row.given);
        EXPECT_EQ(Value(store_.createdWith), Value(changed(firstGeneration(), row.differences)))
            << row.given.description();
    }
    EXPECT_EQ(Value(ZPOrlo::createDefaultOrloOptions(false, false)),
              Value(changed(firstGeneration(), {{"DataStore", "Local"}})));
}

TEST_F(ZPOrloTest, initLogsItsStepsAndLeavesASessionThatIsReleased) {
    {
        const ZPOrlo orlo = ZPOrlo::init();
        EXPECT_NE(orlo.orloRef(), nullptr);
        EXPECT_EQ(store_.liveSessions, 1);
        store_.logHandler(nullptr, "from the library");
    }
    EXPECT_EQ(store_.liveSessions, 0);
    EXPECT_EQ(Value(store_.createdWith), Value(firstGeneration()));
    EXPECT_EQ(store_.calls, (Lines{"path 2", "version <7469636b6574>", "create"}));
    EXPECT_EQ(recordedLog(), (Lines{"2 [ZPOrlo] Calling init", "2 [ZPOrlo] Calling initWithOptions : (null)",
                                    "2 [ZPOrlo] Getting Apticket Path from KelvoDataAccessor : /ticket",
                                    "2 [ZPOrlo] Setting Data Local Encode version to : 7",
                                    "2 [ZPOrlo] Default Orlo Options: " + Value(firstGeneration()).description(),
                                    "2 [ZPOrlo] from the library\n"}));
}

TEST_F(ZPOrloTest, aTicketThatCannotBeReadIsReportedAndLeftOut) {
    store_.ticketPathError = Error{"Kelvo", 3, "none kept"};
    for (const Value& path : {Value(), Value("/missing")}) {
        store_.ticketPath = path;
        recordLog();
        EXPECT_EQ(ZPOrlo::createDefaultOrloOptions(true, true).count("APTicket"), 0U);
        const std::string shown = path.description();
        EXPECT_EQ(recordedLog(), (Lines{"2 [ZPOrlo] KelvoDataAccessor error: " + store_.ticketPathError->description(),
                                        "2 [ZPOrlo] Getting Apticket Path from KelvoDataAccessor : " + shown,
                                        "4 [ZPOrlo] Could not read AP ticket: " + shown,
                                        "2 [ZPOrlo] Setting Data Local Encode version to : 7"}));
    }
}

// What a put and a get have in common: the steps before the record.
struct Operation {
    OrloAction action;
    const char* call;
    std::optional<Error> (*run)(ZPOrlo&);
};

Value::Data buffer;

const Operation operations[] = {
    {OrloActionPut, "put psd2 S1 <6461>",
     [](ZPOrlo& orlo) {
         return orlo.orloPut("psd2", "S1", {'d', 'a'}, nullptr);
     }},
    {OrloActionGet, "copy psd2 S1",
     [](ZPOrlo& orlo) {
         buffer = {'o', 'l', 'd', 'e', 'r'};
         return orlo.orloGet("psd2", "S1", buffer, nullptr);
     }},
};

struct PreparationRow {
    const char* name;
    void (*script)(DataStoreDouble&);
    Error error;
    Lines ending;      // of the log
    std::size_t calls; // of permit, set Permissions, trust, set TrustObject, set TrustObjectDigest
};

const PreparationRow preparationRows[] = {
    {"no session",
     [](DataStoreDouble& store) { store.makesSessions = false; },
     {"Orlo Error Domain", 1008, "Permission String nil"},
     {"4 [ZPOrlo] permission string nil", "2 [ZPOrlo] setting up permissions failure"},
     1},
    {"no grant",
     [](DataStoreDouble& store) { store.grants = false; },
     {"Orlo Error Domain", 1008, "Permission String nil"},
     {"4 [ZPOrlo] permission string nil", "2 [ZPOrlo] setting up permissions failure"},
     1},
    {"trust object with an error",
     [](DataStoreDouble& store) {
         store.trustObject.reset();
         store.trustError = libraryError;
     },
     {"Orlo Error Domain", 1008, " Trust Object Copy from Server failed with Reason --> the disk is full"},
     {"2 [ZPOrlo] QDOrloDataCopyTrustObject retVal : 0", "4 [ZPOrlo] QDOrloDataCopyTrustObject failed\n",
      "2 [ZPOrlo] trust object failure"},
     3},
    {"trust object without an error",
     [](DataStoreDouble& store) { store.trustObject.reset(); },
     {"Orlo Error Domain", 1008, " Trust Object Copy from Server failed with Reason --> Unknown due to unfilled error"},
     {"2 [ZPOrlo] QDOrloDataCopyTrustObject retVal : 0", "4 [ZPOrlo] QDOrloDataCopyTrustObject failed\n",
      "2 [ZPOrlo] trust object failure"},
     3},
    {"digest status",
     [](DataStoreDouble& store) { store.digestStatus = -3; },
     {"Orlo Error Domain", 1009, "Trust Object Digest Generation failed with Status --> -3"},
     {"2 [ZPOrlo] QDOrloDataCopyTrustObject retVal : 1", "4 [ZPOrlo] QDSupportDigestSha256 failed\n",
      "2 [ZPOrlo] trust object failure"},
     4},
    {"no memory for the digest",
     [](DataStoreDouble& store) { store.afterDigest = [] { failAllocation(1); }; },
     {"Orlo Error Domain", 1010, " Trust Object Digest Create failed"},
     {"2 [ZPOrlo] QDOrloDataCopyTrustObject retVal : 1", "4 [ZPOrlo] KVDataCreate failed\n",
      "2 [ZPOrlo] trust object failure"},
     4},
};

Lines tail(const Lines& lines, std::size_t count) {
    return Lines(lines.end() - static_cast<std::ptrdiff_t>(std::min(count, lines.size())), lines.end());
}

TEST_F(ZPOrloTest, everyFailureBeforeTheRecordHasItsErrorAndEndsTheOperation) {
    for (const Operation& operation : operations) {
        for (const PreparationRow& row : preparationRows) {
            SCOPED_TRACE(std::string(row.name) + ", " + operation.call);
            store_ = {};
            row.script(store_);
            ZPOrlo orlo = ZPOrlo::init();
            store_.calls.clear();
            recordLog();
            EXPECT_EQ(operation.run(orlo), row.error);
            EXPECT_EQ(tail(recordedLog(), row.ending.size()), row.ending);
            const Lines all = {"permit " + std::to_string(operation.action) + " psd2 S1", "set Permissions", trustURL,
                               "set TrustObject", "set TrustObjectDigest"};
            EXPECT_EQ(store_.calls, Lines(all.begin(), all.begin() + static_cast<std::ptrdiff_t>(row.calls)));
        }
    }
    EXPECT_EQ(buffer, (Value::Data{'o', 'l', 'd', 'e', 'r'}));
}

TEST_F(ZPOrloTest, aPutGrantsTrustsAndStoresAnewEachTime) {
    ZPOrlo orlo = ZPOrlo::init();
    store_.calls.clear();
    recordLog();
    Value response = "untouched";
    EXPECT_EQ(orlo.orloPut("tcrt", "S1", {'d'}, &response), std::nullopt);
    EXPECT_EQ(response, Value("untouched"));
    EXPECT_EQ(recordedLog(), (Lines{"2 [ZPOrlo] setting up permissions", "2 [ZPOrlo] permission string : <1 tcrt S1>",
                                    "2 [ZPOrlo] setting up trust object",
                                    "2 [ZPOrlo] QDOrloDataCopyTrustObject retVal : 1", "2 [ZPOrlo] Performing Orlo Put",
                                    "2 [ZPOrlo] orloPut : 1", "2 [ZPOrlo] Orlo Put was successful : 1"}));
    const Lines once = {"permit 1 tcrt S1", "set Permissions",       trustURL,
                        "set TrustObject",  "set TrustObjectDigest", "put tcrt S1 <64>"};
    EXPECT_EQ(store_.calls, once);
    EXPECT_EQ(store_.options["Permissions"], Value("<1 tcrt S1>"));
    EXPECT_EQ(store_.options["TrustObject"], Value(*store_.trustObject));
    // SHA-256 of "trust".
    EXPECT_EQ(QDOrloCreateInstanceString(store_.options["TrustObjectDigest"]),
              Value("f796e2f28ae5811737ccb8233f34e09f8bb75d2511a135543d1ca37be0199a1d"));

    store_.calls.clear();
    EXPECT_EQ(orlo.orloPut("tcrt", "S1", {'d'}, nullptr), std::nullopt);
    EXPECT_EQ(store_.calls, once);
}

TEST_F(ZPOrloTest, aPutThatIsRefusedDoesNotPassOnTheLibrarysError) {
    store_.puts = false;
    for (const std::optional<Error>& error : {std::optional<Error>(), std::optional(libraryError)}) {
        store_.putError = error;
        ZPOrlo orlo = ZPOrlo::init();
        recordLog();
        EXPECT_EQ(orlo.orloPut("tcrt", "S1", {}, nullptr),
                  (Error{"Orlo Error Domain", 1011, "Unable to upload data error"}));
        EXPECT_EQ(tail(recordedLog(), 3), (Lines{"2 [ZPOrlo] Performing Orlo Put", "2 [ZPOrlo] orloPut : 0",
                                                 "4 [ZPOrlo] Orlo Put failed . returning error"}));
    }
}

TEST_F(ZPOrloTest, aGetReplacesTheBufferOrLeavesItAndPassesOnTheLibrarysError) {
    const struct {
        std::optional<Value::Data> record;
        std::optional<Error> fromLibrary;
        std::optional<Error> error;
        std::string line;
    } rows[] = {
        {Value::Data{'r'}, {}, {}, "2 [ZPOrlo] orloGet  - SUCCESS "},
        {Value::Data{}, {}, {}, "2 [ZPOrlo] orloGet  - SUCCESS "},
        {{}, libraryError, libraryError, "4 [ZPOrlo] orloGet  - Failure : " + libraryError.description()},
        {{},
         {},
         Error{"Orlo Error Domain", 1012, "Unable to download data error"},
         "4 [ZPOrlo] orloGet  - Failure : (null)"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.line);
        store_.record = row.record;
        store_.getError = row.fromLibrary;
        ZPOrlo orlo = ZPOrlo::init();
        recordLog();
        Value::Data data = {'o', 'l', 'd'};
        Value response = "untouched";
        EXPECT_EQ(orlo.orloGet("psd2", {}, data, &response), row.error);
        EXPECT_EQ(data, row.record.value_or(Value::Data{'o', 'l', 'd'}));
        EXPECT_EQ(response, Value("untouched"));
        EXPECT_EQ(tail(recordedLog(), 4), (Lines{"2 [ZPOrlo] Performing Orlo Get", "2 [ZPOrlo] dataClass : psd2",
                                                 "2 [ZPOrlo] dataInstance : (null)", row.line}));
    }
}

} // namespace
