// The daemon's main, called as a function in the simulated world.
#include <gtest/gtest.h>

#include "platform/SerialQueue.h"
#include "platform/sim/SimClient.h"
#include "tests/support/RecordingHandlers.h"
#include "tests/support/TestClient.h"

int HelperMain();

namespace {

class Daemon : public testing::Test {
protected:
    Daemon() {
        sim::Reset();
        recording::Reset();
        TestClient::entitleGroup();
    }

    /// A client that keeps the daemon from its first to its second second.
    void scriptOneClient() {
        sim::At(1.0, [this] { client.sendCheckIn(); });
        sim::At(2.0, [this] { client.die(); });
    }

    TestClient client;
};

TEST_F(Daemon, ServesAndLeavesWithStatusZeroWhenItIsIdle) {
    scriptOneClient();
    EXPECT_EQ(HelperMain(), 0);
    EXPECT_EQ(sim::Now(), 12.0);
    EXPECT_TRUE(sim::UnifiedLog().empty());
    EXPECT_EQ(sim::PortNames(), 0U);
    EXPECT_TRUE(sim::JournalHasInOrder({"ProcessSettleIn",
                                        "CanHostBasebandHelperServer",
                                        "bootstrap_check_in",
                                        "SerialQueuesStop"}));
}

TEST_F(Daemon, LeavesWithStatusOneWithoutItsService) {
    sim::HoldServiceElsewhere(kServiceName);
    EXPECT_EQ(HelperMain(), 1);
    const std::vector<sim::LogLine> expected{
        {platform::LogLevel::kError, "unable to create server objects - out of resources"},
        {platform::LogLevel::kError, "unable to startup LinefoldMobileHelper server"}};
    EXPECT_EQ(sim::UnifiedLog(), expected);
}

TEST_F(Daemon, LeavesWithStatusOneWithoutASource) {
    sim::FailCall("MachPortCreateRunLoopSource", 1);
    EXPECT_EQ(HelperMain(), 1);
    EXPECT_EQ(sim::UnifiedLog().size(), 2U);
    EXPECT_EQ(sim::PortNames(), 0U);
}

TEST_F(Daemon, LeavesWithStatusZeroWhenItIsAskedToEnd) {
    sim::At(1.0, [this] { client.sendCheckIn(); });
    sim::At(5.0, [] { sim::RequestTermination(); });
    EXPECT_EQ(HelperMain(), 0);
    EXPECT_EQ(sim::Now(), 5.0);
    EXPECT_TRUE(client.watch.isHungUp());
}

TEST_F(Daemon, LeavesAtOnceWithStatusZeroWhenItsIdleTimerCannotBeMade) {
    sim::FailCall("RunLoopTimer.create", 1);
    scriptOneClient();
    EXPECT_EQ(HelperMain(), 0);
    EXPECT_EQ(sim::Now(), 2.0);
}

TEST_F(Daemon, AsksForNoBasebandServerWhereItMayNotHostOne) {
    scriptOneClient();
    EXPECT_EQ(HelperMain(), 0);
    EXPECT_EQ(sim::JournalCount("BasebandHelperServer"), 0U);
}

TEST_F(Daemon, RunsWithoutABasebandServerThatDeclines) {
    sim::SetBaseband(sim::Baseband::kDeclines);
    scriptOneClient();
    EXPECT_EQ(HelperMain(), 0);
    EXPECT_EQ(sim::JournalCount("BasebandHelperServer.create no log"), 1U);
    EXPECT_EQ(sim::JournalCount("BasebandHelperServer.st"), 0U);
}

TEST_F(Daemon, StartsAndStopsItsBasebandServerAroundItsOwn) {
    sim::SetBaseband(sim::Baseband::kPresent);
    scriptOneClient();
    EXPECT_EQ(HelperMain(), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"BasebandHelperServer.create no log",
                                        "BasebandHelperServer.start",
                                        "bootstrap_check_in",
                                        "BasebandHelperServer.isBusy",
                                        "mach_port_mod_refs",
                                        "BasebandHelperServer.stop",
                                        "BasebandHelperServer.dropped"}));
}

TEST_F(Daemon, StopsItsBasebandServerBeforeItSaysThatItCouldNotStart) {
    sim::SetBaseband(sim::Baseband::kPresent);
    sim::HoldServiceElsewhere(kServiceName);
    EXPECT_EQ(HelperMain(), 1);
    EXPECT_TRUE(sim::JournalHasInOrder({"BasebandHelperServer.start",
                                        "Log error unable to create server objects",
                                        "BasebandHelperServer.stop",
                                        "Log error unable to startup",
                                        "BasebandHelperServer.dropped"}));
}

TEST_F(Daemon, StaysWhileItsBasebandServerIsBusy) {
    sim::SetBaseband(sim::Baseband::kPresent);
    sim::SetBasebandBusy(true);
    scriptOneClient();
    sim::At(35.0, [] { sim::SetBasebandBusy(false); });
    EXPECT_EQ(HelperMain(), 0);
    EXPECT_EQ(sim::Now(), 42.0);
    EXPECT_EQ(sim::JournalCount("BasebandHelperServer.isBusy"), 4U);
}

TEST_F(Daemon, StartsNoTaskOfAQueueFromItsEndOn) {
    bool ran = false;
    const platform::SerialQueue queue("late");
    scriptOneClient();
    EXPECT_EQ(HelperMain(), 0);
    queue.async([&] { ran = true; });
    sim::Settle();
    EXPECT_FALSE(ran);
}

}  // namespace
