#include "platform/SystemLog.h"

#include <gtest/gtest.h>

#include "platform/linux/DatagramReader_test.h"

namespace platform {
namespace {

constexpr const char* kSystemLog = "/dev/log";
constexpr int kMoreThanAnyQueueHolds = 20'000;

/// What stands before the text: "<priority>Mon dd hh:mm:ss identity[pid]: ".
std::string Before(const std::string& priority) {
    return "<" + priority +
           ">[A-Z][a-z][a-z] [ 0-9][0-9] [0-9][0-9]:[0-9][0-9]:[0-9][0-9] LinefoldMobileHelper\\[" +
           std::to_string(getpid()) + "\\]: ";
}

testing::AssertionResult Matches(const std::optional<std::string>& entry,
                                 const std::string& pattern) {
    if (entry && testing::internal::RE::FullMatch(*entry, testing::internal::RE(pattern))) {
        return testing::AssertionSuccess();
    }
    return testing::AssertionFailure()
           << entry.value_or("nothing") << " does not match " << pattern;
}

TEST(SystemLog, AnEntryHasFacilityDaemonAndItsPriority) {
    const DatagramReader log(kSystemLog);
    SystemLog(SystemLogPriority::kNotice, "Removing domain: %s\n", "com.example");
    SystemLog(SystemLogPriority::kError, "of error");
    EXPECT_TRUE(Matches(log.take(), Before("29") + "Removing domain: com.example\n"));
    EXPECT_TRUE(Matches(log.take(), Before("27") + "of error"));
}

TEST(SystemLog, AnArgumentCannotForgeALine) {
    const DatagramReader log(kSystemLog);
    SystemLog(SystemLogPriority::kNotice, "domain: %s", "a\n<0>b");
    EXPECT_TRUE(Matches(log.take(), Before("29") + "domain: a\\\\x0a<0>b"));
}

TEST(SystemLog, WithoutALogTheTextGoesToStandardError) {
    { const DatagramReader last(kSystemLog); }
    testing::internal::CaptureStderr();
    SystemLog(SystemLogPriority::kError, "nobody reads this\n");
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "LinefoldMobileHelper: nobody reads this\n");
}

TEST(SystemLog, AStalledLogIsToldHowMuchItMissed) {
    const DatagramReader log(kSystemLog);
    for (int i = 0; i < kMoreThanAnyQueueHolds; ++i) {
        SystemLog(SystemLogPriority::kNotice, "line");
    }
    ASSERT_LT(log.drain(), kMoreThanAnyQueueHolds);
    SystemLog(SystemLogPriority::kError, "after the stall");
    EXPECT_TRUE(Matches(log.take(), Before("29") + "[0-9]+ lines of the system log were lost"));
    EXPECT_TRUE(Matches(log.take(), Before("27") + "after the stall"));
}

}  // namespace
}  // namespace platform
