#ifndef VELTRA_TOOLS_ORLOCTL_IMG4TEXT_H
#define VELTRA_TOOLS_ORLOCTL_IMG4TEXT_H

#include <string>

#include <nlohmann/json.hpp>

// The lines for people of what showImg4 found.
std::string img4Text(const nlohmann::ordered_json& json);

#endif
