#ifndef VELTRA_TOOLS_ORLOCTL_VERIFYTEXT_H
#define VELTRA_TOOLS_ORLOCTL_VERIFYTEXT_H

#include <string>

#include <nlohmann/json.hpp>

// The lines for people of what verifyImg4 found.
std::string verifyText(const nlohmann::ordered_json& json);

#endif
