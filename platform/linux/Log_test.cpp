#include "platform/Log.h"

#include <gtest/gtest.h>

#include "platform/linux/DatagramReader_test.h"
#include "platform/linux/PlatformLog.h"

namespace platform {
namespace {

using namespace std::string_literals;

constexpr const char* kJournal = "/run/systemd/journal/socket";
constexpr int kMoreThanAnyQueueHolds = 20'000;

std::string Entry(const std::string& priority,
                  const std::string& message,
                  const std::string& category = "") {
    return "PRIORITY=" + priority +
           "\nSYSLOG_IDENTIFIER=LinefoldMobileHelper\nSUBSYSTEM=com.vendra.linefold\n" + category +
           message;
}

TEST(Log, EachLevelHasItsPriority) {
    const DatagramReader journal(kJournal);
    Log(LogLevel::kDebug, "of debug");
    Log(LogLevel::kInfo, "of info");
    Log(LogLevel::kDefault, "of default");
    Log(LogLevel::kError, "of error %d", 5);
    EXPECT_EQ(journal.take(), Entry("7", "MESSAGE=of debug\n"));
    EXPECT_EQ(journal.take(), Entry("6", "MESSAGE=of info\n"));
    EXPECT_EQ(journal.take(), Entry("5", "MESSAGE=of default\n"));
    EXPECT_EQ(journal.take(), Entry("3", "MESSAGE=of error 5\n"));
}

TEST(Log, ALineOfTheTwinsOwnHasACategory) {
    const DatagramReader journal(kJournal);
    PlatformLog(LogLevel::kError, "mend %s", "this");
    EXPECT_EQ(journal.take(), Entry("3", "MESSAGE=mend this\n", "CATEGORY=platform\n"));
}

TEST(Log, AnArgumentCannotForgeAField) {
    const DatagramReader journal(kJournal);
    Log(LogLevel::kInfo, "path: %s", "a\nPRIORITY=0\x01\x7f\xff");
    EXPECT_EQ(journal.take(), Entry("6", "MESSAGE=path: a\\x0aPRIORITY=0\\x01\\x7f\\xff\n"));
}

TEST(Log, ATextOfSeveralLinesGoesWithItsLength) {
    const DatagramReader journal(kJournal);
    Log(LogLevel::kInfo, "one\nPRIORITY=0\n");
    EXPECT_EQ(journal.take(), Entry("6", "MESSAGE\n\x0f\0\0\0\0\0\0\0one\nPRIORITY=0\n\n"s));
}

TEST(Log, WithoutAJournalTheTextGoesToStandardError) {
    { const DatagramReader last(kJournal); }
    testing::internal::CaptureStderr();
    Log(LogLevel::kError, "nobody reads %s", "this\n");
    EXPECT_EQ(testing::internal::GetCapturedStderr(),
              "LinefoldMobileHelper: nobody reads this\\x0a\n");
}

TEST(Log, AStalledJournalIsToldHowMuchItMissed) {
    const DatagramReader journal(kJournal);
    for (int i = 0; i < kMoreThanAnyQueueHolds; ++i) {
        Log(LogLevel::kInfo, "line");
    }
    const int taken = journal.drain();
    ASSERT_LT(taken, kMoreThanAnyQueueHolds);
    Log(LogLevel::kInfo, "after the stall");
    const auto notice = journal.take();
    ASSERT_TRUE(notice.has_value());
    EXPECT_TRUE(notice->ends_with(" lines of the unified log were lost\n")) << *notice;
    EXPECT_TRUE(notice->starts_with(Entry("5", "MESSAGE=", "CATEGORY=platform\n"))) << *notice;
    EXPECT_EQ(journal.take(), Entry("6", "MESSAGE=after the stall\n"));
}

}  // namespace
}  // namespace platform
