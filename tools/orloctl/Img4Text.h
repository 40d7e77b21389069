#ifndef VELTRA_TOOLS_ORLOCTL_IMG4TEXT_H
#define VELTRA_TOOLS_ORLOCTL_IMG4TEXT_H

#include <string>

#include <nlohmann/json.hpp>

// The lines for people of what showImg4 found.
std::string img4Text(const nlohmann::ordered_json& json);

// The lines of properties alone, as PropertyReader describes them, indented for `depth` dictionaries around them; and
// the type and value of one that has a type, "INTEGER 12".
std::string img4PropertiesText(const nlohmann::ordered_json& properties, unsigned depth);
std::string img4ValueText(const nlohmann::ordered_json& property);

#endif
