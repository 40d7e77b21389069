// What no command of the plug-in reaches, and where memory ends; the rest stands in tests/plugin/transcripts.
#include "orlo/ZPOrlo.h"

#include <new>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "orlo/ZPOrloExport.h"
#include "tests/support/FailingAllocation.h"
#include "tests/support/RecordedLog.h"
#include "tests/support/ScriptedServices.h"
#include "tests/support/TemporaryRoot.h"

namespace {

using Lines = std::vector<std::string>;

class Orlo : public testing::Test {
protected:
    Orlo() {
        arrangeServices();
        root_.write("/ticket", "ticket");
        recordLog();
    }

    TemporaryRoot root_;
};

TEST_F(Orlo, theOptionsThatAreGivenStandInPlaceOfEqualDefaultsOrBesideThem) {
    const Value::Dictionary first = ZPOrlo::createDefaultOrloOptions(true, false);
    const struct {
        Value given;
        Value::Dictionary differences;
    } rows[] = {
        {Value::Dictionary{{"orlo2Data", 1}}, {{"DataVersion", 7}, {"UseSikDataInstance", true}, {"orlo2Data", 1}}},
        {Value::Dictionary{{"orlo2Data", false}}, {{"orlo2Data", false}}},
        {Value::Dictionary{{"HTTPTimeout", 60}, {"Mine", "x"}}, {{"HTTPTimeout", 60}, {"Mine", "x"}}},
        {Value::Dictionary{{"orlo2Data", true}, {"DataVersion", 3}},
         {{"DataVersion", 3}, {"UseSikDataInstance", true}, {"orlo2Data", true}}},
    };
    for (const auto& row : rows) {
        const ZPOrlo orlo = ZPOrlo::initWithOptions(row.given);
        Value::Dictionary expected = first;
        for (const auto& [key, value] : row.differences)
            expected[key] = value;
        EXPECT_EQ(Value(sessionOptions), Value(expected)) << row.given.description();
    }
    Value::Dictionary local = first;
    local["DataStore"] = "Local";
    EXPECT_EQ(Value(ZPOrlo::createDefaultOrloOptions(false, false)), Value(local));
}

TEST_F(Orlo, eachPutGrantsAndTrustsAnew) {
    ZPOrlo orlo = ZPOrlo::init();
    const auto put = [&orlo] {
        recordLog();
        EXPECT_EQ(orlo.orloPut("tcrt", "S1", {'d'}, nullptr), std::nullopt);
        return recordedBehind("> ");
    };
    const Lines once = put();
    EXPECT_EQ(once.size(), 7U);
    EXPECT_EQ(put(), once);
}

TEST_F(Orlo, anExportWithoutDictionaryAsksNobody) {
    EXPECT_EQ(ZPOrloExport::orloExportCommandWithResponse({}, {}, nullptr),
              (Error{"OrloExport", 2002, "Orlo Export Failed Not being able to get data instances due to (null)"}));
    EXPECT_EQ(recordedLines(), Lines{"4 [ZPOrloExport] Could not generate data instances"});
}

TEST_F(Orlo, anExportThatMemoryDoesNotSufficeForHasAnErrorOfTheTableAndLeavesNoSession) {
    const Value instances = Value::Dictionary{{"CtCl", "CVG"}, {"pfcl", "MIR"}, {"tcrt", "SCR-TMA"}};
    std::set<std::string> met; // nothing where memory ran out elsewhere
    bool hasFailed = true;
    for (int count = 1; hasFailed; ++count) {
        recordLog();
        std::optional<Error> error;
        failAllocation(count);
        try {
            error = ZPOrloExport::orloExportCommandWithResponse(instances, {}, nullptr);
        } catch (const std::bad_alloc&) {
            error.reset();
        }
        hasFailed = allocationHasFailed();
        failAllocation(0);
        EXPECT_EQ(liveSessions, 0) << count;
        const Lines lines = recordedLog();
        if (error)
            met.insert(std::to_string(error->code) + error->text + (lines.back().starts_with('4') ? lines.back() : ""));
    }
    for (const char* expected :
         {"2002Orlo Export Failed due to - DataClass allocation failure4 [ZPOrloExport] DataClass allocation failure",
          "2003Orlo Export Failed due to - Data Instance is NULL4 [ZPOrloExport] Data Instance is NULL",
          "2004Orlo Export Failed due to - Permissions allocation error",
          "2009Orlo Export Failed due to - Trust Object Digest Create failed4 [ZPOrloExport] KVDataCreate failed"})
        EXPECT_TRUE(met.contains(expected)) << expected;
}

} // namespace
