#include "platform/RunLoop.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <vector>

#include "platform/MachCarriage.h"
#include "platform/MachPort.h"
#include "tests/contract/Twin.h"

using namespace platform;

namespace {

class RunLoopContract : public testing::Test {
protected:
    RunLoopContract() { twin::Reset(); }

    std::shared_ptr<RunLoopTimer> addTimer(double delay,
                                           double interval,
                                           std::function<void()> callout) {
        auto timer =
            RunLoopTimer::create(AbsoluteTimeGetCurrent() + delay, interval, std::move(callout));
        loop.addTimer(timer);
        return timer;
    }

    RunLoopResult run(double seconds = 60.0) { return loop.run(seconds, AfterSource::kGoOn); }

    RunLoop& loop = RunLoop::current();
};

TEST_F(RunLoopContract, IsFinishedWhenNothingIsLeft) {
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    int fired = 0;
    addTimer(0.001, 0, [&] { ++fired; });
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    EXPECT_EQ(fired, 1);
}

TEST_F(RunLoopContract, IsTimedOutWhenNothingHappens) {
    const auto timer = addTimer(1000.0, 0, [] {});
    const AbsoluteTime start = AbsoluteTimeGetCurrent();
    EXPECT_EQ(run(0.02), RunLoopResult::kTimedOut);
    EXPECT_GE(AbsoluteTimeGetCurrent() - start, 0.02);
    timer->invalidate();
}

TEST_F(RunLoopContract, IsStoppedFromACallout) {
    const auto guard = addTimer(1000.0, 0, [] {});
    addTimer(0.001, 0, [&] { loop.stop(); });
    EXPECT_EQ(run(), RunLoopResult::kStopped);
    guard->invalidate();
    EXPECT_EQ(run(), RunLoopResult::kFinished);
}

TEST_F(RunLoopContract, IsStoppedBeforeItBegins) {
    int ran = 0;
    loop.stop();
    loop.post([&] { ++ran; });
    EXPECT_EQ(run(), RunLoopResult::kStopped);
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    EXPECT_EQ(ran, 1);
}

TEST_F(RunLoopContract, ServesNothingMoreOfABatchAfterAStop) {
    int ran = 0;
    for (int i = 0; i < 3; ++i) {
        loop.post([&] {
            ++ran;
            loop.stop();
        });
    }
    EXPECT_EQ(run(), RunLoopResult::kStopped);
    EXPECT_EQ(ran, 1);
    EXPECT_EQ(run(), RunLoopResult::kStopped);
    EXPECT_EQ(run(), RunLoopResult::kStopped);
    EXPECT_EQ(ran, 3);
}

TEST_F(RunLoopContract, FiresNoMoreTimersOfABatchAfterAStop) {
    int fired = 0;
    const AbsoluteTime due = AbsoluteTimeGetCurrent() + 0.005;
    for (int i = 0; i < 2; ++i) {
        loop.addTimer(RunLoopTimer::create(due, 0, [&] {
            ++fired;
            loop.stop();
        }));
    }
    EXPECT_EQ(run(), RunLoopResult::kStopped);
    EXPECT_EQ(fired, 1);
    EXPECT_EQ(run(), RunLoopResult::kStopped);
    EXPECT_EQ(fired, 2);
}

TEST_F(RunLoopContract, NeverFiresATimerThatWasCancelledInItsBatch) {
    int fired = 0;
    std::vector<std::shared_ptr<RunLoopTimer>> timers;
    const AbsoluteTime due = AbsoluteTimeGetCurrent() + 0.005;
    for (int i = 0; i < 10; ++i) {
        timers.push_back(RunLoopTimer::create(due, 0, [&] {
            ++fired;
            for (const auto& timer : timers) {
                timer->invalidate();
            }
        }));
        loop.addTimer(timers.back());
    }
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    EXPECT_EQ(fired, 1);
}

TEST_F(RunLoopContract, NeverFiresATimerThatWasInvalidWhenItCame) {
    int fired = 0;
    const auto timer = RunLoopTimer::create(AbsoluteTimeGetCurrent(), 0, [&] { ++fired; });
    timer->invalidate();
    timer->invalidate();
    loop.addTimer(timer);
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    EXPECT_EQ(fired, 0);
}

TEST_F(RunLoopContract, RepeatsATimerUntilItIsInvalid) {
    int fired = 0;
    std::shared_ptr<RunLoopTimer> timer;
    timer = addTimer(0.002, 0.002, [&] {
        if (++fired == 5) {
            timer->invalidate();
        }
    });
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    EXPECT_EQ(fired, 5);
}

TEST_F(RunLoopContract, FiresNoTimerBeforeItsTime) {
    const AbsoluteTime start = AbsoluteTimeGetCurrent();
    std::vector<AbsoluteTime> times;
    std::shared_ptr<RunLoopTimer> timer;
    timer = addTimer(0.01, 0.01, [&] {
        times.push_back(AbsoluteTimeGetCurrent());
        if (times.size() == 3) {
            timer->invalidate();
        }
    });
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    for (std::size_t i = 0; i < times.size(); ++i) {
        EXPECT_GE(times[i] - start, 0.0099 * static_cast<double>(i + 1));
    }
}

TEST_F(RunLoopContract, KeepsATimerThatNobodyElseKeeps) {
    bool fired = false;
    addTimer(0.001, 0, [&] { fired = true; });
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    EXPECT_TRUE(fired);
}

TEST_F(RunLoopContract, RunsPostedTasksInOrder) {
    std::vector<int> order;
    for (int i = 0; i < 100; ++i) {
        loop.post([&, i] { order.push_back(i); });
    }
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    ASSERT_EQ(order.size(), 100U);
    EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
}

TEST_F(RunLoopContract, RunsATaskThatATaskPosted) {
    std::vector<int> order;
    loop.post([&] {
        order.push_back(1);
        loop.post([&] { order.push_back(3); });
    });
    loop.post([&] { order.push_back(2); });
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    EXPECT_EQ(order, (std::vector<int>{1, 2, 3}));
}

TEST_F(RunLoopContract, RunsDelayedTasksByTheirTime) {
    std::vector<int> order;
    loop.after(0.03, [&] { order.push_back(3); });
    loop.after(0.01, [&] { order.push_back(1); });
    loop.after(0.02, [&] { order.push_back(2); });
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    EXPECT_EQ(order, (std::vector<int>{1, 2, 3}));
}

TEST_F(RunLoopContract, RunsNoDelayedTaskEarly) {
    const AbsoluteTime start = AbsoluteTimeGetCurrent();
    AbsoluteTime ran = 0;
    loop.after(0.02, [&] { ran = AbsoluteTimeGetCurrent(); });
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    EXPECT_GE(ran - start, 0.0199);
}

// Sources: a watched port is one.

class RunLoopSources : public RunLoopContract {
protected:
    RunLoopSources() {
        EXPECT_EQ(AdoptPortDescriptor(pair.descriptor, &name), KERN_SUCCESS);
        port = MachPort::create(name, nullptr);
    }

    ~RunLoopSources() override {
        port->invalidate();
        mach_port_deallocate(name);
    }

    twin::Pair pair = twin::MakePair();
    mach_port_t name = MACH_PORT_NULL;
    std::shared_ptr<MachPort> port;
};

TEST_F(RunLoopSources, EndARunThatIsToReturnAfterOne) {
    pair.closeOther();
    EXPECT_EQ(loop.run(60.0, AfterSource::kReturn), RunLoopResult::kHandledSource);
    EXPECT_FALSE(port->isValid());
}

TEST_F(RunLoopSources, DoNotEndARunThatIsToGoOn) {
    pair.closeOther();
    bool fired = false;
    addTimer(0.01, 0, [&] { fired = true; });
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    EXPECT_TRUE(fired);
    EXPECT_FALSE(port->isValid());
}

TEST_F(RunLoopSources, KeepARunFromFinishing) {
    EXPECT_EQ(run(0.01), RunLoopResult::kTimedOut);
    port->invalidate();
    EXPECT_EQ(run(), RunLoopResult::kFinished);
    pair.closeOther();
}

TEST_F(RunLoopSources, AreNoTimersAndNoTasks) {
    addTimer(0.001, 0, [] {});
    loop.post([] {});
    EXPECT_EQ(loop.run(0.02, AfterSource::kReturn), RunLoopResult::kTimedOut);
    pair.closeOther();
}

}  // namespace
