#include "platform/SystemLog.h"

#include <string>

#include <sys/uio.h>

#include <gtest/gtest.h>

namespace {

std::string entry; // its fields, each behind a "|"

} // namespace

// In place of the journal.
extern "C" int sd_journal_sendv(const iovec* fields, int count) {
    entry.clear();
    for (int i = 0; i < count; ++i)
        entry.append("|").append(static_cast<const char*>(fields[i].iov_base), fields[i].iov_len);
    return 0;
}

namespace {

TEST(SystemLog, anEntryHasItsMessageItsPriorityAndWhoseItIs) {
    SystemLog* const log = systemLogCreate("com.tevari.test", "device");
    const std::string ours = "|SYSLOG_IDENTIFIER=com.tevari.test|VELTRA_CATEGORY=device";
    const struct {
        SystemLog* log;
        SystemLogType type;
        const char* message;
        std::string entry;
    } rows[] = {
        {log, SystemLogType::Default, "a\nb\n", "|MESSAGE=a\nb|PRIORITY=5" + ours},
        {log, SystemLogType::Info, "", "|MESSAGE=|PRIORITY=6" + ours},
        {log, SystemLogType::Debug, "Gerät", "|MESSAGE=Gerät|PRIORITY=7" + ours},
        {systemLogDefault(), SystemLogType::Error, "a",
         "|MESSAGE=a|PRIORITY=3|SYSLOG_IDENTIFIER=VeltraOrloServices|VELTRA_CATEGORY=default"},
        {nullptr, SystemLogType::Error, "nobody's", ""},
    };
    for (const auto& row : rows) {
        entry.clear();
        systemLogWrite(row.log, row.type, row.message);
        EXPECT_EQ(entry, row.entry);
    }
    EXPECT_TRUE(systemLogTypeEnabled(log, SystemLogType::Debug));
    EXPECT_FALSE(systemLogTypeEnabled(nullptr, SystemLogType::Error));
}

} // namespace
