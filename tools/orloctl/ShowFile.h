#ifndef VELTRA_TOOLS_ORLOCTL_SHOWFILE_H
#define VELTRA_TOOLS_ORLOCTL_SHOWFILE_H

#include <optional>
#include <string>

#include "der/DERTypes.h"
#include "platform/Value.h"
#include "tools/orloctl/Report.h"

// What `file` holds, read as `format`: "bcfg", "img4" or "der". An empty one is found out: what begins as none of the
// others is shown as DER. The JSON says which in "format". With an HMAC key, which is for a configuration blob only,
// that blob's HMACs are checked.
Report showFile(const Value::Data& file, std::string format, const std::optional<Value::Data>& hmacKey);

// A file that is text around DER (RFC 7468): the sentence that says so; empty for any other.
std::string pemProblem(const DERItem& file);

#endif
