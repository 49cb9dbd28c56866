#include "platform/sim/Sim.h"

#include <gtest/gtest.h>

#include <limits>

#include "platform/Process.h"
#include "platform/ProcessExit.h"
#include "platform/RunLoop.h"
#include "platform/SerialQueue.h"
#include "platform/UserDatabase.h"
#include "platform/VirtualMemory.h"
#include "platform/sim/SimClient.h"

using namespace platform;

namespace {

class SimWorld : public testing::Test {
protected:
    SimWorld() { sim::Reset(); }

    ~SimWorld() override { sim::Reset(); }

    static RunLoopResult run() { return RunLoop::current().run(1e9, AfterSource::kGoOn); }
};

TEST_F(SimWorld, MovesTimeFromEventToEvent) {
    std::vector<double> times;
    sim::At(5.0, [&] { times.push_back(sim::Now()); });
    sim::In(2.0, [&] { times.push_back(AbsoluteTimeGetCurrent()); });
    sim::RunFor(4.0);
    EXPECT_EQ(sim::Now(), 4.0);
    sim::RunFor(4.0);
    EXPECT_EQ(times, (std::vector<double>{2.0, 5.0}));
}

TEST_F(SimWorld, EndsAWaitThatCanNeverEnd) {
    const auto watch = sim::MakeWatchPair();
    mach_port_t name = MACH_PORT_NULL;
    ASSERT_EQ(mach_port_allocate(MachPortRight::kReceive, &name), KERN_SUCCESS);
    ASSERT_EQ(mach_port_insert_right(name, MachMsgType::kMakeSend), KERN_SUCCESS);
    const auto port = MachPort::create(name, nullptr);
    EXPECT_THROW(
        (void)RunLoop::current().run(std::numeric_limits<double>::max(), AfterSource::kGoOn),
        sim::NothingLeftToHappen);
    EXPECT_THROW(sim::RunOthersUntil([] { return false; }), sim::NothingLeftToHappen);
}

TEST_F(SimWorld, EndsAWorldInWhichTimeStandsStill) {
    std::function<void()> again = [&] { RunLoop::current().post(again); };
    again();
    EXPECT_THROW((void)run(), sim::NothingLeftToHappen);
}

/// The order in which two queues and the loop get their turns.
std::string OrderBySeed(std::uint64_t seed) {
    sim::Reset(seed);
    std::string order;
    const SerialQueue one("one");
    const SerialQueue other("other");
    for (int i = 0; i < 8; ++i) {
        one.async([&] { order += '1'; });
        other.async([&] { order += '2'; });
        RunLoop::current().post([&] { order += '0'; });
    }
    sim::Settle();
    return order;
}

TEST_F(SimWorld, OrdersThreadsByTheSeedAlone) {
    EXPECT_EQ(OrderBySeed(7), OrderBySeed(7));
    EXPECT_NE(OrderBySeed(7), OrderBySeed(8));
    EXPECT_EQ(OrderBySeed(9).size(), 24U);
}

TEST_F(SimWorld, FailsTheCallThatWasChosen) {
    void* memory = nullptr;
    sim::FailCall(2);
    ASSERT_EQ(vm_allocate(&memory, 1), KERN_SUCCESS);
    vm_deallocate(memory, 1);
    EXPECT_EQ(RunLoopTimer::create(1.0, 0, [] {}), nullptr);
    EXPECT_EQ(sim::FailedCall(), "RunLoopTimer.create");
    EXPECT_NE(RunLoopTimer::create(1.0, 0, [] {}), nullptr);
}

TEST_F(SimWorld, FailsTheCallOfANameThatWasChosen) {
    void* memory = nullptr;
    sim::FailCall("vm_allocate", 1);
    EXPECT_NE(RunLoopTimer::create(1.0, 0, [] {}), nullptr);
    EXPECT_EQ(vm_allocate(&memory, 1), KERN_NO_SPACE);
    EXPECT_EQ(sim::FailedCall(), "vm_allocate");
}

TEST_F(SimWorld, FindsMemoryThatIsGivenBackWrongly) {
    void* memory = nullptr;
    ASSERT_EQ(vm_allocate(&memory, 10), KERN_SUCCESS);
    EXPECT_EQ(sim::AllocatedMemory(), 10U);
    EXPECT_THROW(vm_deallocate(memory, 9), sim::ContractBroken);
    vm_deallocate(memory, 10);
    EXPECT_THROW(vm_deallocate(memory, 10), sim::ContractBroken);
}

TEST_F(SimWorld, LetsOthersGoOnWhileACalloutIsBlocked) {
    const SerialQueue waiting("waiting");
    const SerialQueue working("working");
    bool isDone = false;
    bool hasWaited = false;
    waiting.async([&] {
        working.after(3.0, [&] { isDone = working.isCurrent() && !waiting.isCurrent(); });
        sim::RunOthersUntil([&] { return isDone; });
        hasWaited = waiting.isCurrent() && sim::Now() == 3.0;
    });
    waiting.async([&] { EXPECT_TRUE(hasWaited); });
    sim::Settle();
    EXPECT_TRUE(hasWaited);
}

TEST_F(SimWorld, TellsOfAProcessThatExitsOnce) {
    sim::StartProcess(9);
    const auto source = ProcessExitSource::create(9);
    ASSERT_NE(source, nullptr);
    int exits = 0;
    int cancels = 0;
    source->setEventHandler([&] { ++exits; });
    source->setCancelHandler([&] { ++cancels; });
    source->activate();
    sim::ExitProcess(9);
    EXPECT_FALSE(source->processLives());
    sim::Settle();
    source->cancel();
    source->cancel();
    sim::Settle();
    EXPECT_EQ(exits, 1);
    EXPECT_EQ(cancels, 1);
}

TEST_F(SimWorld, TellsNobodyWhoCancelledBefore) {
    sim::StartProcess(9);
    const auto source = ProcessExitSource::create(9);
    int exits = 0;
    source->setEventHandler([&] { ++exits; });
    source->activate();
    sim::ExitProcess(9);
    source->cancel();
    sim::Settle();
    EXPECT_EQ(exits, 0);
    EXPECT_EQ(ProcessExitSource::create(9), nullptr);
}

TEST_F(SimWorld, KnowsTheUsersThatItWasTold) {
    EXPECT_EQ(CopyHomeDirectoryForUser("mobile"), "/var/mobile");
    sim::SetUser("guest", 600, 601, std::nullopt);
    EXPECT_EQ(UserRecordByName("guest")->gid, 601U);
    EXPECT_EQ(CopyHomeDirectoryForUser("guest"), std::nullopt);
    sim::RemoveUser("mobile");
    EXPECT_FALSE(UserRecordByName("mobile").has_value());
}

TEST_F(SimWorld, FindsEntriesOfTheJournalInTheirOrder) {
    (void)RunLoopTimer::create(1.0, 0, [] {});
    RunLoop::current().stop();
    EXPECT_TRUE(sim::JournalHasInOrder({"RunLoopTimer.create", "RunLoop.stop"}));
    EXPECT_FALSE(sim::JournalHasInOrder({"RunLoop.stop", "RunLoopTimer.create"}));
    EXPECT_FALSE(sim::JournalHasInOrder({"RunLoop.stop", "RunLoop.stop"}));
    EXPECT_EQ(sim::JournalCount("RunLoop"), 2U);
}

TEST_F(SimWorld, KeepsAConnectionWithTheServiceManagerWhenADaemonEnds) {
    sim::Peer peer = sim::Connect({.pid = 5, .uid = 1, .gid = 2}, "service");
    sim::EndDaemon();
    EXPECT_EQ(sim::WaitingConnections("service"), 1U);
    EXPECT_FALSE(peer.isHungUp());
}

TEST(SimProcessDeathTest, ThatRefusesToStartSaysWhyAndHasStatusOne) {
    EXPECT_EXIT(ProcessRefuseToStart("unable to find %s", "it"),
                testing::ExitedWithCode(1),
                "unable to find it");
}

}  // namespace
