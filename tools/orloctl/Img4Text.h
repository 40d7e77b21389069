#ifndef VELTRA_TOOLS_ORLOCTL_IMG4TEXT_H
#define VELTRA_TOOLS_ORLOCTL_IMG4TEXT_H

#include <string>

#include "tools/orloctl/Report.h"

// The lines for people of what showImg4 found; of many properties and certificates the first.
std::string img4Text(const Report& report);

// The type and value of a property that has a type, "INTEGER 12", with at most so many characters of the value.
std::string img4ValueText(const nlohmann::ordered_json& property, std::size_t most);

#endif
