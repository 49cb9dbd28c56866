#include "platform/linux/LogSocket.h"

#include <gtest/gtest.h>

#include "platform/linux/DatagramReader_test.h"

namespace platform {
namespace {

constexpr const char* kPath = "/tmp/log-socket";
constexpr int kMoreThanAnyQueueHolds = 20'000;

using Outcome = LogSocket::Outcome;

/// Sends until nothing more is taken, and tells how many went.
int Fill(LogSocket& log) {
    int sent = 0;
    while (sent < kMoreThanAnyQueueHolds && log.send("an entry") == Outcome::kSent) {
        ++sent;
    }
    return sent;
}

TEST(LogSocket, SendsAnEntryAsOneDatagram) {
    const DatagramReader reader(kPath);
    LogSocket log(kPath);
    EXPECT_EQ(log.send("first\nentry"), Outcome::kSent);
    EXPECT_EQ(log.send("second"), Outcome::kSent);
    EXPECT_EQ(reader.take(), "first\nentry");
    EXPECT_EQ(reader.take(), "second");
    EXPECT_EQ(reader.take(), std::nullopt);
}

TEST(LogSocket, TellsThatNobodyListens) {
    LogSocket log(kPath);
    EXPECT_EQ(log.send("an entry"), Outcome::kAbsent);
    EXPECT_EQ(log.takeDroppedCount(), 0U);
}

TEST(LogSocket, NeitherBlocksNorLosesCountBehindAStalledReader) {
    const DatagramReader reader(kPath);
    LogSocket log(kPath);
    const int sent = Fill(log);
    ASSERT_LT(sent, kMoreThanAnyQueueHolds);
    EXPECT_EQ(log.send("lost"), Outcome::kDropped);
    EXPECT_EQ(log.send("lost"), Outcome::kDropped);
    EXPECT_EQ(log.takeDroppedCount(), 3U);  // with the one that ended the filling
    EXPECT_EQ(log.takeDroppedCount(), 0U);
    EXPECT_EQ(reader.drain(), sent);
}

TEST(LogSocket, GoesOnWhenTheReaderReadsAgain) {
    const DatagramReader reader(kPath);
    LogSocket log(kPath);
    Fill(log);
    reader.drain();
    EXPECT_EQ(log.send("after the stall"), Outcome::kSent);
    EXPECT_EQ(reader.take(), "after the stall");
}

TEST(LogSocket, DropsAnEntryThatNoDatagramCanHold) {
    const DatagramReader reader(kPath);
    LogSocket log(kPath);
    EXPECT_EQ(log.send(std::string(16U << 20, 'x')), Outcome::kDropped);
    EXPECT_EQ(log.takeDroppedCount(), 1U);
    EXPECT_EQ(log.send("small"), Outcome::kSent);
}

TEST(LogSocket, FindsAReaderThatWasStartedAgain) {
    LogSocket log(kPath);
    {
        const DatagramReader first(kPath);
        ASSERT_EQ(log.send("to the first"), Outcome::kSent);
    }
    EXPECT_EQ(log.send("to nobody"), Outcome::kAbsent);
    const DatagramReader second(kPath);
    EXPECT_EQ(log.send("to the second"), Outcome::kSent);
    EXPECT_EQ(second.take(), "to the second");
}

TEST(LogSocket, FindsAReaderThatTookThePlaceOfAnother) {
    LogSocket log(kPath);
    auto first = std::make_unique<DatagramReader>(kPath);
    ASSERT_EQ(log.send("to the first"), Outcome::kSent);
    first.reset();
    const DatagramReader second(kPath);
    EXPECT_EQ(log.send("to the second"), Outcome::kSent);
    EXPECT_EQ(second.take(), "to the second");
}

TEST(LogSocket, StandardErrorGetsOneLineWithoutItsOwnNewline) {
    testing::internal::CaptureStderr();
    WriteToStandardError("with a newline\n");
    WriteToStandardError("without");
    WriteToStandardError("");
    EXPECT_EQ(testing::internal::GetCapturedStderr(),
              "LinefoldMobileHelper: with a newline\n"
              "LinefoldMobileHelper: without\n"
              "LinefoldMobileHelper: \n");
}

}  // namespace
}  // namespace platform
