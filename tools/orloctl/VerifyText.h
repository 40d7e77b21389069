#ifndef VELTRA_TOOLS_ORLOCTL_VERIFYTEXT_H
#define VELTRA_TOOLS_ORLOCTL_VERIFYTEXT_H

#include <string>

#include "tools/orloctl/Report.h"

// The lines for people of what verifyImg4 found.
std::string verifyText(const Report& report);

#endif
