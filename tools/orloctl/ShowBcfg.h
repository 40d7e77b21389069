#ifndef VELTRA_TOOLS_ORLOCTL_SHOW_BCFG_H
#define VELTRA_TOOLS_ORLOCTL_SHOW_BCFG_H

#include "platform/Value.h"
#include "tools/orloctl/Report.h"

// The entries, comments and HMAC state of the configuration blob in `blob`, or what is wrong with it. With a key that
// is not empty the HMACs are checked. Of the library's messages the report has the first ones and the number of the
// others. Safe on any bytes. Uses the SysConfig3 library's log hook while it runs,
// so it must not run on two threads at once.
Report showBcfg(const Value::Data& blob, const Value::Data& hmacKey);

#endif
