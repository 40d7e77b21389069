#ifndef VELTRA_TOOLS_ORLOCTL_IMG4PROPERTIES_H
#define VELTRA_TOOLS_ORLOCTL_IMG4PROPERTIES_H

#include "tools/orloctl/Findings.h"

// The properties in the content of a SET or SEQUENCE, which `where` names in the words of a fault. A value that holds
// properties itself is a dictionary too, to a depth that nobody exceeds. What is wrong goes into `findings` at once.
Elements readProperties(const DERItem& content, const std::string& where, Findings& findings);

#endif
