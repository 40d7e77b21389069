#include "platform/SystemLog.h"

#include <string>
#include <vector>

#include <sys/uio.h>

#include <gtest/gtest.h>

namespace {

std::vector<std::string> entry;

} // namespace

// In place of the journal.
extern "C" int sd_journal_sendv(const iovec* fields, int count) {
    entry.clear();
    for (int i = 0; i < count; ++i)
        entry.emplace_back(static_cast<const char*>(fields[i].iov_base), fields[i].iov_len);
    return 0;
}

namespace {

TEST(SystemLog, anEntryHasItsMessageItsPriorityAndWhoseItIs) {
    SystemLog* const log = systemLogCreate("com.tevari.test", "device");
    const struct {
        SystemLog* log;
        SystemLogType type;
        const char *message, *identifier, *category, *priority;
    } rows[] = {
        {log, SystemLogType::Default, "a\nb", "com.tevari.test", "device", "5"},
        {log, SystemLogType::Info, "", "com.tevari.test", "device", "6"},
        {log, SystemLogType::Debug, "Gerät", "com.tevari.test", "device", "7"},
        {systemLogDefault(), SystemLogType::Error, "a", "VeltraOrloServices", "default", "3"},
    };
    for (const auto& row : rows) {
        systemLogWrite(row.log, row.type, std::string(row.message) + "\n");
        EXPECT_EQ(entry, (std::vector<std::string>{std::string("MESSAGE=") + row.message,
                                                   std::string("PRIORITY=") + row.priority,
                                                   std::string("SYSLOG_IDENTIFIER=") + row.identifier,
                                                   std::string("VELTRA_CATEGORY=") + row.category}));
    }
    entry.clear();
    systemLogWrite(nullptr, SystemLogType::Error, "nobody's");
    EXPECT_TRUE(entry.empty());
    EXPECT_TRUE(systemLogTypeEnabled(log, SystemLogType::Debug));
    EXPECT_FALSE(systemLogTypeEnabled(nullptr, SystemLogType::Error));
}

} // namespace
