// The idle exit: 10 seconds after the last client, and a fraction of a second in the brisk build.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <csignal>
#include <thread>

#include "tests/support/PhoneRoot.h"

namespace {

using namespace std::chrono_literals;

phone::Daemon::Options Brisk() {
    return {.program = phone::ProgramPath("LinefoldMobileHelper-brisk")};
}

TEST(IdleExit, ComesTenSecondsAfterTheLastClientAndNotBefore) {
    phone::Daemon daemon;
    auto first = phone::Client::checkIn();
    auto second = phone::Client::checkIn();
    first.die();
    std::this_thread::sleep_for(11s);
    EXPECT_TRUE(daemon.isRunning()) << "a client is left";
    second.die();
    std::this_thread::sleep_for(9s);
    EXPECT_TRUE(daemon.isRunning()) << "the ten seconds are not over";
    EXPECT_EQ(daemon.waitForExit(), 0);
}

TEST(IdleExit, NeverComesToADaemonWithoutAnyClient) {
    phone::Daemon daemon(Brisk());
    ASSERT_EQ(phone::Client::checkIn(5999).code, 35) << "served, and no client";
    std::this_thread::sleep_for(2s);
    EXPECT_TRUE(daemon.isRunning());
}

TEST(IdleExit, IsCancelledByTheNextClient) {
    phone::Daemon daemon(Brisk());
    phone::Client::checkIn().die();
    auto next = phone::Client::checkIn();
    std::this_thread::sleep_for(2s);
    EXPECT_TRUE(daemon.isRunning());
    next.die();
    EXPECT_EQ(daemon.waitForExit(), 0);
}

TEST(IdleExit, IsCancelledForGoodByAClientThatWasDeadOnArrival) {
    phone::Daemon daemon(Brisk());
    phone::Client::checkIn().die();
    std::array<int, 2> ends{};
    ASSERT_EQ(pipe2(ends.data(), O_CLOEXEC), 0);
    close(ends[0]);
    EXPECT_EQ(
        phone::Connection::toService().call(phone::CheckInMessage(), std::array{ends[1]}).code(),
        5);
    close(ends[1]);
    std::this_thread::sleep_for(2s);
    EXPECT_TRUE(daemon.isRunning()) << "nobody is left, and the timer stays cancelled";
    phone::Client::checkIn().die();
    EXPECT_EQ(daemon.waitForExit(), 0) << "the next client's end arms it again";
}

TEST(IdleExit, LeavesUnacceptedConnectionsToTheNextInstance) {
    phone::Daemon daemon(Brisk());
    phone::Client::checkIn().die();
    ASSERT_EQ(daemon.waitForExit(), 0);
    const auto waiting = phone::Connection::toService();
    std::array<int, 2> ends{};
    ASSERT_EQ(pipe2(ends.data(), O_CLOEXEC), 0);
    ASSERT_TRUE(waiting.send(phone::CheckInMessage(), std::array{ends[1]}));
    daemon.startAgain();
    EXPECT_TRUE(waiting.receive().descriptor.isOpen());
    close(ends[0]);
    close(ends[1]);
}

TEST(IdleExit, SaysNothing) {
    auto journal = phone::LogReader::journal();
    auto systemLog = phone::LogReader::systemLog();
    phone::Daemon daemon(Brisk());
    phone::Client::checkIn().die();
    ASSERT_EQ(daemon.waitForExit(), 0);
    EXPECT_TRUE(journal.take().empty());
    EXPECT_TRUE(systemLog.take().empty());
}

}  // namespace
