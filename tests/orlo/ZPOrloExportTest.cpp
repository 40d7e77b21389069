#include "orlo/ZPOrloExport.h"

#include <algorithm>
#include <new>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "tests/platform/DataStoreDouble.h"
#include "tests/platform/ServicesDouble.h"
#include "tests/support/FailingAllocation.h"
#include "tests/support/RecordedLog.h"
#include "tests/support/TemporaryRoot.h"

namespace {

using Lines = std::vector<std::string>;

const Error libraryError{"QDOrloErrorDomain", 5, "the disk is full"};
const Value instances = Value::Dictionary{{"CtCl", "CVG"}, {"pfcl", "MIR"}, {"tcrt", "SCR-TMA"}};
const Value request = Value::Dictionary{{"HTTPTimeout", 60}, {"DataVersion", 9}};

class Export : public testing::Test {
protected:
    Export() { fresh(); }

    void fresh() {
        store_ = {};
        servicesDouble() = {};
        root_.write("/ticket", "ticket");
        recordLog();
    }

    static std::optional<Error> run(const Value& dictionary = instances) {
        return ZPOrloExport::orloExportCommandWithResponse(dictionary, request, nullptr);
    }

    DataStoreDouble& store_ = dataStoreDouble();
    TemporaryRoot root_;
};

TEST_F(Export, handsAllPairsToOneSessionWithTheFixedOptions) {
    Value response = "untouched";
    EXPECT_EQ(ZPOrloExport::orloExportCommandWithResponse(instances, request, &response), std::nullopt);
    EXPECT_EQ(response, Value("untouched"));
    EXPECT_EQ(Value(store_.createdWith), Value(Value::Dictionary{
                                             {"Permissions", "<3 CtCl CVG><3 pfcl MIR><3 tcrt SCR-TMA>"},
                                             {"CAURL", "https://" VELTRA_ORLO_CA_HOST ":8443"},
                                             {"DSURL", "https://" VELTRA_ORLO_DATA_STORE_HOST ":8443"},
                                             {"APTicket", Value::Data{'t', 'i', 'c', 'k', 'e', 't'}},
                                             {"VerifyData", false},
                                             {"StripImg4", true},
                                             {"EnableProxy", true},
                                             {"EnableProxySsl", "ForHttps"},
                                             {"OrganizationalUnit", "Devices - Stations"},
                                             {"DataStore", "Remote"},
                                             {"UseSikDataInstance", false},
                                             {"DataVersion", 1},
                                         }));
    EXPECT_EQ(store_.calls, (Lines{"append 3 CtCl CVG", "append 3 pfcl MIR", "append 3 tcrt SCR-TMA", "path 2",
                                   "create", "trust http://" VELTRA_ORLO_CA_HOST ":8080/orlotrustobject",
                                   "set TrustObject", "set TrustObjectDigest", "export"}));
    EXPECT_EQ(store_.options["TrustObject"], Value(*store_.trustObject));
    EXPECT_EQ(store_.options["TrustObjectDigest"].data()->size(), 32U);
    EXPECT_EQ(Value(store_.classes), Value(Value::Array{"CtCl", "pfcl", "tcrt"}));
    EXPECT_EQ(Value(store_.instances), Value(Value::Array{"CVG", "MIR", "SCR-TMA"}));
    EXPECT_EQ(store_.liveSessions, 0);
}

TEST_F(Export, logsItsSteps) {
    EXPECT_EQ(run(), std::nullopt);
    store_.logHandler(nullptr, "from the library");
    Lines lines = recordedLog();
    for (std::string& line : lines) {
        const std::string traced = "2 [ZPOrloExport] +[ZPOrloExport orloExportCommandWithResponse:options:response:]:";
        if (line.starts_with(traced)) {
            EXPECT_EQ(line.find_first_not_of("0123456789", traced.size()), std::string::npos) << line;
            line = "traced";
        }
    }
    EXPECT_EQ(
        lines,
        (Lines{"2 [ZPOrloExport] Generated data instance dict " + instances.description(), "traced", "traced", "traced",
               "2 [ZPOrloExport]  Exporting with this Permission String: <3 CtCl CVG><3 pfcl MIR><3 tcrt "
               "SCR-TMA> ",
               "2 [ZPOrloExport] Getting Apticket Path from KelvoDataAccessor : /ticket",
               "2 [ZPOrloExport] Adding apTicket Data  : 6",
               "2 [ZPOrloExport] Setting Data Local Encode version to : 1",
               "2 [ZPOrloExport] Classes [3] : [\"CtCl\", \"pfcl\", \"tcrt\"] Instances [3] : [\"CVG\", "
               "\"MIR\", \"SCR-TMA\"]",
               "2 [ZPOrloExport] Orlo Export Attempt #1... ", "2 [ZPOrloExport] Successfully exported Orlo Data",
               "2 [ZPOrloExport] from the library\n"}));
}

struct FailureRow {
    void (*script)(DataStoreDouble&);
    Error error;
    const char* logLine; // the last one, at level 4
    const char* lastCall;
};

const FailureRow failures[] = {
    {[](DataStoreDouble& store) { store.grants = false; },
     {"OrloExport", 2004, "Orlo Export Failed due to - Permissions creation error"},
     "QDOrloCreatePermissionsString failed",
     "append 3 CtCl CVG"},
    {[](DataStoreDouble& store) { store.ticketPath = {}; },
     {"OrloExport", 2006, "ZephyrineExport Upload Failed due to - Orlo Object Create Error"},
     "Could not read AP ticket: (null)",
     "path 2"},
    {[](DataStoreDouble& store) { store.ticketPath = "/missing"; },
     {"OrloExport", 2006, "ZephyrineExport Upload Failed due to - Orlo Object Create Error"},
     "Could not read AP ticket: /missing",
     "path 2"},
    {[](DataStoreDouble& store) { store.makesSessions = false; },
     {"OrloExport", 2006, "ZephyrineExport Upload Failed due to - Orlo Object Create Error"},
     "QDOrloCreateWithOptions failed",
     "create"},
    {[](DataStoreDouble& store) {
         store.trustObject.reset();
         store.trustError = libraryError;
     },
     {"OrloExport", 2007,
      "Orlo Export Failed due to - Trust Object Copy from Server failed with Reason --> the disk is full"},
     "QDOrloDataCopyTrustObject failed",
     "trust http://" VELTRA_ORLO_CA_HOST ":8080/orlotrustobject"},
    {[](DataStoreDouble& store) { store.trustObject.reset(); },
     {"OrloExport", 2007,
      "Orlo Export Failed due to - Trust Object Copy from Server failed with Reason --> Unknown due to unfilled "
      "error"},
     "QDOrloDataCopyTrustObject failed",
     "trust http://" VELTRA_ORLO_CA_HOST ":8080/orlotrustobject"},
    {[](DataStoreDouble& store) { store.digestStatus = -3; },
     {"OrloExport", 2008, "Orlo Export Failed due to - Trust Object Digest Generation failed with Status --> -3"},
     "QDSupportDigestSha256 failed",
     "set TrustObject"},
    {[](DataStoreDouble& store) { store.afterDigest = [] { failAllocation(1); }; },
     {"OrloExport", 2009, "Orlo Export Failed due to - Trust Object Digest Create failed"},
     "KVDataCreate failed",
     "set TrustObject"},
    {[](DataStoreDouble& store) {
         store.exports = false;
         store.exportError = libraryError;
     },
     {"OrloExport", 2012, "Orlo Export Failed due to - Data Upload to server failed with Reason --> the disk is full"},
     "QDOrloDataExport failed",
     "export"},
    {[](DataStoreDouble& store) { store.exports = false; },
     {"OrloExport", 2012,
      "Orlo Export Failed due to - Data Upload to server failed with Reason --> Unknown due to unfilled error for "
      "key (null) and instance (null)"},
     "QDOrloDataExport failed",
     "export"},
};

TEST_F(Export, everyFailureHasItsErrorAndEndsTheExport) {
    for (const FailureRow& row : failures) {
        SCOPED_TRACE(row.error.text);
        fresh();
        row.script(store_);
        EXPECT_EQ(run(), row.error);
        EXPECT_EQ(recordedLog().back(), std::string("4 [ZPOrloExport] ") + row.logLine);
        EXPECT_EQ(store_.calls.back(), row.lastCall);
        EXPECT_EQ(std::count(store_.calls.begin(), store_.calls.end(), "export"),
                  row.lastCall == std::string("export") ? 1 : 0);
        EXPECT_EQ(store_.liveSessions, 0);
        // The only attempt is followed by a rest.
        EXPECT_EQ(servicesDouble().calls, row.error.code == 2012 ? Lines{"pauseFor 10"} : Lines{});
    }
}

TEST_F(Export, withoutDictionaryAsksNobody) {
    EXPECT_EQ(run({}),
              (Error{"OrloExport", 2002, "Orlo Export Failed Not being able to get data instances due to (null)"}));
    EXPECT_EQ(recordedLog(), Lines{"4 [ZPOrloExport] Could not generate data instances"});
    EXPECT_EQ(store_.calls, Lines{});
    EXPECT_NE(store_.logHandler, nullptr);
}

TEST_F(Export, ofAnEmptyDictionaryIsTheLibrarysToDecide) {
    EXPECT_EQ(run(Value::Dictionary{}), std::nullopt);
    EXPECT_EQ(store_.createdWith["Permissions"], Value(""));
    EXPECT_EQ(store_.calls.back(), "export");
    EXPECT_TRUE(store_.classes.empty() && store_.instances.empty());
}

TEST_F(Export, outOfMemoryIsAnErrorOfTheTableAndLeavesNoSession) {
    std::set<std::string> met;
    bool hasFailed = true;
    for (int count = 1; hasFailed; ++count) {
        fresh();
        std::optional<Error> error;
        failAllocation(count);
        try {
            error = run();
        } catch (const std::bad_alloc&) {
            error.reset(); // memory ran out where the frame of the request has to answer
        }
        hasFailed = allocationHasFailed();
        failAllocation(0);
        EXPECT_EQ(store_.liveSessions, 0) << count;
        if (!error)
            continue;
        const Lines lines = recordedLog();
        const bool hasLine = !lines.empty() && lines.back().starts_with('4');
        met.insert(std::to_string(error->code) + error->text + (hasLine ? lines.back() : ""));
    }
    for (const char* expected :
         {"2002Orlo Export Failed due to - DataClass allocation failure4 [ZPOrloExport] DataClass allocation failure",
          "2003Orlo Export Failed due to - Data Instance is NULL4 [ZPOrloExport] Data Instance is NULL",
          "2004Orlo Export Failed due to - Permissions allocation error",
          "2009Orlo Export Failed due to - Trust Object Digest Create failed4 [ZPOrloExport] KVDataCreate failed"})
        EXPECT_TRUE(met.contains(expected)) << expected;
}

} // namespace
