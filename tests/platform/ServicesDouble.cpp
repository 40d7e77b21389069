#include "tests/platform/ServicesDouble.h"

#include "platform/DeviceAnswers.h"
#include "platform/Error.h"

namespace {

Value look(const std::map<std::string, Value, std::less<>>& answers, const char* operation, std::string_view key) {
    servicesDouble().calls.push_back(operation + std::string(" ") + std::string(key));
    const auto found = answers.find(key);
    return found == answers.end() ? Value() : found->second;
}

} // namespace

ServicesDouble& servicesDouble() {
    static ServicesDouble instance;
    return instance;
}

constexpr std::string_view MiravelSNKey = "MiravelSNKey";
constexpr std::string_view CoverGlassSNKey = "CoverGlassSNKey";
constexpr std::string_view ALSSNKey = "ALSSNKey";
constexpr std::string_view FCAMModuleSNKey = "FCAMModuleSNKey";
constexpr std::string_view VanterChipIDKey = "VanterChipIDKey";
constexpr std::string_view VanterUIDKey = "VanterUIDKey";
constexpr std::string_view LoddenChipIDKey = "LoddenChipIDKey";
constexpr std::string_view LoddenUIDKey = "LoddenUIDKey";

Value KACopyAnswer(std::string_view key, const Value&) {
    return look(servicesDouble().answers, "KACopyAnswer", key);
}

Value KACopyAnswerWithError(std::string_view key, const Value&, Error*) {
    return look(servicesDouble().answers, "KACopyAnswerWithError", key);
}

Value TansuCopyValueWithError(std::string_view key, const Value&, Error*) {
    return look(servicesDouble().tansu, "TansuCopyValueWithError", key);
}
