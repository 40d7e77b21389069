#include <new>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "orlo/ZPOrloExport.h"
#include "tests/platform/ServicesDouble.h"
#include "tests/support/FailingAllocation.h"
#include "tests/support/RecordedLog.h"

namespace {

using Lines = std::vector<std::string>;

// The keys of the identities; each is answered with a text of its own.
const std::vector<std::pair<std::string, std::string>> answers = {
    {"MiravelSNKey", "MIR"},       {"CoverGlassSNKey", "CVG"},     {"ALSSNKey", "ALS"},
    {"FCAMModuleSNKey", "FCM"},    {"VanterChipIDKey", "VCI"},     {"VanterUIDKey", "VUI"},
    {"LoddenChipIDKey", "LCI"},    {"LoddenUIDKey", "LUI"},        {"ScreenSerialNumber", "SCR"},
    {"VanterSerialNumber", "VAN"}, {"TopModuleAuthChipID", "TMA"},
};

enum IfMissing {
    Stops,
    GoesOn,
    Unchecked
};

// A class: the identities in the order in which they are asked for, and the messages about missing ones.
struct ClassRow {
    const char* dataClass;
    const char* instance;
    Lines keys;
    IfMissing ifMissing;
    Lines messages;
    std::string readingLine = {};
};

std::vector<ClassRow> classRows() {
    std::vector<ClassRow> rows = {
        {"pfcl", "MIR", {"MiravelSNKey"}, Stops, {"Error Reading Miravel SN"}},
        {"HmCl",
         "CVG-ALS",
         {"CoverGlassSNKey", "ALSSNKey"},
         Stops,
         {"Error Reading Cover Glass SN", "Error Reading Ambient Light SN"}},
        {"IfCl", "ALS", {"ALSSNKey"}, Stops, {"Error Reading Ambient Light SN"}},
        {"CtCl", "CVG", {"CoverGlassSNKey"}, Stops, {"Error Reading Cover Glass SN"}},
        {"GpC2", "CVG", {"CoverGlassSNKey"}, Stops, {"Error Reading Cover Glass SN"}},
        {"tcrt", "SCR-TMA", {"TopModuleAuthChipID", "ScreenSerialNumber"}, Unchecked, {}},
        {"dCfg", "CVG", {"CoverGlassSNKey"}, Stops, {"Error Reading Cover Glass SN"}},
        {"bCfg", "BGC", {"BackglassCompassSerialNumber"}, Stops, {"Error Reading Back Glass SN"}},
        {"ycrt",
         "LCI-LUI",
         {"LoddenChipIDKey", "LoddenUIDKey"},
         GoesOn,
         {"Error Reading Lodden Chip ID", "Error Reading Lodden UID"}},
        {"AlsH",
         "CVG-ALS",
         {"CoverGlassSNKey", "ALSSNKey"},
         GoesOn,
         {"Error Reading Cover Glass SN", "Error Reading Ambient Light SN"}},
        {"PxTC",
         "CVG-PRX",
         {"CoverGlassSNKey", "ProxSerialNumber"},
         Stops,
         {"Error Reading Cover Glass SN", "Error Reading Prox SN"}},
        {"pspc",
         "VCI-VUI",
         {"VanterChipIDKey", "VanterUIDKey"},
         Stops,
         {"Error Reading Vanter Chip ID", "Error Reading Vanter UID"}},
        {"FCCl", "FCM", {"FCAMModuleSNKey"}, Stops, {"Error Reading FCAMModule SN"}, "Reading FCAMModule SN for FCCl"},
    };
    for (const char* name : {"pcic", "pcii", "pcvc", "pcvi", "pcve", "pbas", "pmpc", "pdcl", "prf1", "prf2", "psd1",
                             "psd2", "pwcl", "psnv", "psdt", "preg"})
        rows.push_back({name,
                        "VAN",
                        {"VanterSerialNumber"},
                        Stops,
                        {"Error Reading Vanter SN"},
                        std::string("Reading Vanter SN for ") + name});
    return rows;
}

class DataInstances : public testing::Test {
protected:
    DataInstances() { answerAllBut({}); }

    void answerAllBut(const Lines& missing) {
        services_ = {};
        for (const auto& [key, answer] : answers)
            services_.answers[key] = answer;
        services_.tansu = {{"ProxSerialNumber", "PRX"}, {"BackglassCompassSerialNumber", "BGC"}};
        for (const std::string& key : missing) {
            services_.answers.erase(key);
            services_.tansu.erase(key);
        }
        recordLog();
        error_ = {};
    }

    Value gather(const Value::Array& list) { return ZPOrloExport::getDataInstances(list, &error_); }

    Lines keysAsked() const {
        Lines keys;
        for (const std::string& call : services_.calls)
            keys.push_back(call.substr(call.find(' ') + 1));
        return keys;
    }

    // The log of the class's own file.
    static Lines exportLog() {
        Lines lines;
        for (const std::string& line : recordedLog())
            if (line.substr(2).starts_with("[ZPOrloExport] "))
                lines.push_back(line);
        return lines;
    }

    ServicesDouble& services_ = servicesDouble();
    Value error_;
};

TEST_F(DataInstances, everyClassReadsItsIdentitiesInTheirOrder) {
    const std::vector<ClassRow> rows = classRows();
    ASSERT_EQ(rows.size(), 29U);
    for (const ClassRow& row : rows) {
        SCOPED_TRACE(row.dataClass);
        answerAllBut({});
        EXPECT_EQ(gather({row.dataClass}), Value(Value::Dictionary{{row.dataClass, row.instance}}));
        EXPECT_EQ(error_, Value());
        EXPECT_EQ(keysAsked(), row.keys);
        Lines log;
        if (!row.readingLine.empty())
            log.push_back("2 [ZPOrloExport] " + row.readingLine);
        log.push_back(std::string("2 [ZPOrloExport] Returning data instances ") + row.dataClass + " ==> " +
                      row.instance + " ");
        EXPECT_EQ(exportLog(), log);
    }
}

TEST_F(DataInstances, aMissingIdentityStopsOrGoesOnAsTheClassHasIt) {
    for (const ClassRow& row : classRows()) {
        // Every set of missing identities: the first, the second, both.
        for (unsigned set = 1; set < (1U << row.keys.size()); ++set) {
            SCOPED_TRACE(std::string(row.dataClass) + " without " + std::to_string(set));
            Lines missing, messages;
            std::string instance = row.instance;
            for (std::size_t i = 0; i < row.keys.size(); ++i) {
                if ((set & (1U << i)) == 0)
                    continue;
                missing.push_back(row.keys[i]);
                if (row.ifMissing != Unchecked)
                    messages.push_back(row.messages[i]);
                const bool isLeading = (row.ifMissing == Unchecked) != (i == 0);
                if (row.keys.size() == 1)
                    continue;
                const std::size_t dash = instance.rfind('-');
                instance = isLeading ? "(null)" + instance.substr(dash) : instance.substr(0, dash + 1) + "(null)";
            }
            answerAllBut(missing);
            const Value gathered = gather({row.dataClass});
            EXPECT_EQ(keysAsked(), row.keys);

            if (row.ifMissing == Stops)
                messages.resize(1);
            EXPECT_EQ(gathered, row.ifMissing == Stops ? Value() : Value(Value::Dictionary{{row.dataClass, instance}}));
            EXPECT_EQ(error_, messages.empty() ? Value() : Value(messages.back()));
            Lines errors;
            for (const std::string& line : exportLog())
                if (line.starts_with('4'))
                    errors.push_back(line.substr(std::string("4 [ZPOrloExport] ").size()));
            EXPECT_EQ(errors, messages);
        }
    }
}

TEST_F(DataInstances, listsMayBeEmptyRepeatClassesAndEndAtAnUnknownOne) {
    EXPECT_EQ(gather({}), Value(Value::Dictionary{}));
    EXPECT_EQ(error_, Value());
    EXPECT_EQ(recordedLog(), Lines{});

    answerAllBut({});
    EXPECT_EQ(gather({"psd2", "preg", "psd2"}), Value(Value::Dictionary{{"preg", "VAN"}, {"psd2", "VAN"}}));
    EXPECT_EQ(keysAsked(), Lines(3, "VanterSerialNumber"));
    EXPECT_EQ(
        exportLog(),
        (Lines{"2 [ZPOrloExport] Reading Vanter SN for psd2", "2 [ZPOrloExport] Reading Vanter SN for preg",
               "2 [ZPOrloExport] Reading Vanter SN for psd2", "2 [ZPOrloExport] Returning data instances preg ==> VAN ",
               "2 [ZPOrloExport] Returning data instances psd2 ==> VAN "}));

    for (const Value& unknown : {Value("xxxx"), Value("hmcl"), Value(""), Value(7), Value(Value::Array{"CtCl"})}) {
        SCOPED_TRACE(unknown.description());
        answerAllBut({});
        EXPECT_EQ(gather({"CtCl", unknown, "pfcl"}), Value());
        EXPECT_EQ(error_, Value("Key doesn't exist - " + unknown.description()));
        EXPECT_EQ(keysAsked(), Lines{"CoverGlassSNKey"});
        EXPECT_EQ(exportLog(), Lines{"4 [ZPOrloExport] Key " + unknown.description() + " doesn't exist"});
    }
}

TEST_F(DataInstances, anInstanceThatMemoryDoesNotSufficeForStops) {
    const std::pair<const char*, const char*> rows[] = {{"tcrt", "Error Reading gpCl SN"},
                                                        {"AlsH", "Error Reading Ambient Light SN"}};
    for (const auto& [dataClass, message] : rows) {
        bool isReported = false;
        bool hasFailed = true;
        for (int count = 1; hasFailed; ++count) {
            answerAllBut({});
            services_.answers["ScreenSerialNumber"] = "a number that no small string holds";
            services_.answers["CoverGlassSNKey"] = "another number that no small string holds";
            const Value::Array list = {dataClass};
            Value gathered;
            failAllocation(count);
            try {
                gathered = gather(list);
            } catch (const std::bad_alloc&) {
                error_ = {}; // memory ran out elsewhere
            }
            hasFailed = allocationHasFailed();
            failAllocation(0);
            if (error_.isNothing())
                continue;
            isReported = true;
            EXPECT_EQ(gathered, Value());
            EXPECT_EQ(error_, Value(message));
            EXPECT_EQ(exportLog(), Lines{std::string("4 [ZPOrloExport] ") + message});
        }
        EXPECT_TRUE(isReported) << dataClass;
    }
}

TEST_F(DataInstances, anIdentityThatIsNoTextIsHandedOnAsItIsAndJoinedWhole) {
    const std::pair<Value, Value> rows[] = {
        {17, "17-ALS"},
        {true, "true-ALS"},
        {Value::Data{}, "<>-ALS"},
        {Value::Data(65, 0xA5), "<" +
                                    [] {
                                        std::string t;
                                        for (int i = 0; i < 65; ++i)
                                            t += "a5";
                                        return t;
                                    }() +
                                    ">-ALS"},
        {"line\n\u202e", "line\n\u202e-ALS"},
        {Value::Array{"CVG"}, {}},
        {Value::Dictionary{}, {}},
    };
    for (const auto& [identity, joined] : rows) {
        SCOPED_TRACE(identity.description());
        services_.answers["CoverGlassSNKey"] = identity;
        EXPECT_EQ(gather({"CtCl"}), Value(Value::Dictionary{{"CtCl", identity}}));
        const Value both = gather({"HmCl"});
        EXPECT_EQ(both["HmCl"], joined);
        EXPECT_EQ(both.isNothing(), joined.isNothing());
    }
}

} // namespace
