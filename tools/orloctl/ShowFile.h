// The offline readers of file formats. Each is safe on any octets, shows what can be read even when something is wrong,
// and gives a report whose lists look into the file.
#ifndef VELTRA_TOOLS_ORLOCTL_SHOWFILE_H
#define VELTRA_TOOLS_ORLOCTL_SHOWFILE_H

#include <optional>
#include <string>

#include "platform/Value.h"
#include "tools/orloctl/Findings.h"

// What `file` holds, read as `format`: "bcfg", "img4" or "der". An empty one is found out: what begins as none of the
// others is shown as DER. The JSON says which in "format". With an HMAC key, which is for a configuration blob only,
// that blob's HMACs are checked.
Report showFile(const Value::Data& file, std::string format, const std::optional<Value::Data>& hmacKey);

// The items in the file as a tree, each with its place, lengths, tag and value, and where and why the encoding is no
// strict DER. The items may follow one another at the top. A header that cannot be read ends the items around it; a
// content that breaks a rule of its type does not, and the first fault is the problem reported. Items deeper than 64
// levels are refused.
Report showDer(const DERItem& file);

// What an Img4 container, bare payload or bare manifest holds: every section, object and property with its type and
// value, the digests of payload and manifest, and what is wrong where. The report is ok when the Img4 decoder takes the
// file and every property in it is sound; it says nothing of the signature.
Report showImg4(const DERItem& file);

// The entries, comments and HMAC state of a configuration blob, or what is wrong with it. With a key that is not empty
// the HMACs are checked. Of the library's messages the report has the first ones and the number of the others. Uses the
// SysConfig3 library's log hook while it runs, so it must not run on two threads at once.
Report showBcfg(const Value::Data& blob, const Value::Data& hmacKey);

// The properties in the content of a SET or SEQUENCE, which `where` names in the words of a fault. A value that holds
// properties itself is a dictionary too, to a depth that nobody exceeds. What is wrong goes into `findings` at once.
Elements readProperties(const DERItem& content, const std::string& where, Findings& findings);

// Whether the file is text around DER (RFC 7468), which is a fault.
bool isPem(Findings& findings);

#endif
