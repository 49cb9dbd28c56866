#include "platform/SerialQueue.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <vector>

#include "platform/Clock.h"
#include "tests/contract/Meeting.h"
#include "tests/contract/Twin.h"

using namespace platform;

namespace {

class SerialQueueContract : public testing::Test {
protected:
    SerialQueueContract() { twin::Reset(); }

    const SerialQueue queue{"com.vendra.contract"};
    std::vector<int> order;  // on the queue while a meeting waits
};

TEST_F(SerialQueueContract, KeepsItsWholeLabelAndItsService) {
    const SerialQueue other("com.vendra.httpdownloadqueue", QualityOfService::kUtility);
    EXPECT_EQ(queue.label(), "com.vendra.contract");
    EXPECT_EQ(queue.service(), QualityOfService::kDefault);
    EXPECT_EQ(other.label(), "com.vendra.httpdownloadqueue");
    EXPECT_EQ(other.service(), QualityOfService::kUtility);
}

TEST_F(SerialQueueContract, RunsItsTasksInOrder) {
    Meeting meeting(1);
    for (int i = 0; i < 1000; ++i) {
        queue.async([&, i] { order.push_back(i); });
    }
    queue.async([&] { meeting.arrive(); });
    ASSERT_TRUE(meeting.wait());
    EXPECT_EQ(order.size(), 1000U);
    EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
}

TEST_F(SerialQueueContract, RunsOneTaskAtATime) {
    Meeting meeting(1);
    std::atomic<int> inside = 0;
    std::atomic<int> most = 0;
    for (int i = 0; i < 50; ++i) {
        queue.async([&] {
            most = std::max(most.load(), ++inside);
            --inside;
        });
    }
    queue.async([&] { meeting.arrive(); });
    ASSERT_TRUE(meeting.wait());
    EXPECT_EQ(most, 1);
}

TEST_F(SerialQueueContract, RunsATaskThatATaskHandedOverLater) {
    Meeting meeting(1);
    queue.async([&] {
        queue.async([&] {
            order.push_back(2);
            meeting.arrive();
        });
        order.push_back(1);
    });
    ASSERT_TRUE(meeting.wait());
    EXPECT_EQ(order, (std::vector<int>{1, 2}));
}

TEST_F(SerialQueueContract, RunsDelayedTasksByTheirTime) {
    Meeting meeting(3);
    const auto note = [&](int number) {
        order.push_back(number);
        meeting.arrive();
    };
    queue.after(0.03, [&] { note(3); });
    queue.after(0.01, [&] { note(1); });
    queue.after(0.02, [&] { note(2); });
    ASSERT_TRUE(meeting.wait());
    EXPECT_EQ(order, (std::vector<int>{1, 2, 3}));
}

TEST_F(SerialQueueContract, RunsNoDelayedTaskEarly) {
    Meeting meeting(1);
    const AbsoluteTime start = AbsoluteTimeGetCurrent();
    AbsoluteTime ran = 0;
    queue.after(0.02, [&] {
        ran = AbsoluteTimeGetCurrent();
        meeting.arrive();
    });
    ASSERT_TRUE(meeting.wait());
    EXPECT_GE(ran - start, 0.0199);
}

TEST_F(SerialQueueContract, RunsABarrierBetweenTheTasksBeforeAndAfter) {
    Meeting meeting(1);
    for (int i = 0; i < 10; ++i) {
        queue.async([&] { order.push_back(1); });
    }
    queue.barrierAsync([&] { order.push_back(2); });
    for (int i = 0; i < 10; ++i) {
        queue.async([&] { order.push_back(3); });
    }
    queue.async([&] { meeting.arrive(); });
    ASSERT_TRUE(meeting.wait());
    ASSERT_EQ(order.size(), 21U);
    EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
}

TEST_F(SerialQueueContract, IsCurrentOnItsOwnTasksOnly) {
    Meeting meeting(2);
    const SerialQueue other("other");
    const SerialQueue copy = queue;
    std::atomic<int> wrong = queue.isCurrent() ? 1 : 0;
    queue.async([&] {
        wrong += queue.isCurrent() && copy.isCurrent() && !other.isCurrent() ? 0 : 1;
        meeting.arrive();
    });
    other.async([&] {
        wrong += other.isCurrent() && !queue.isCurrent() ? 0 : 1;
        meeting.arrive();
    });
    ASSERT_TRUE(meeting.wait());
    EXPECT_EQ(wrong, 0);
}

TEST_F(SerialQueueContract, LivesUntilItsLastTaskHasRun) {
    Meeting meeting(2);
    {
        const SerialQueue shortLived("short-lived");
        shortLived.async([&] { meeting.arrive(); });
        shortLived.after(0.01, [&] { meeting.arrive(); });
    }
    EXPECT_TRUE(meeting.wait());
}

TEST_F(SerialQueueContract, MayLoseItsLastHandleInATask) {
    Meeting meeting(1);
    auto last = std::make_unique<SerialQueue>("last");
    const SerialQueue& named = *last;
    named.async([&, kept = std::shared_ptr<SerialQueue>(std::move(last))]() mutable {
        kept = nullptr;
        meeting.arrive();
    });
    EXPECT_TRUE(meeting.wait());
}

TEST_F(SerialQueueContract, RepeatsOnTheQueueUntilCancelled) {
    Meeting meeting(1);
    int fired = 0;
    std::atomic<int> elsewhere = 0;
    std::shared_ptr<SerialQueue::Timer> timer;
    queue.async([&] {
        timer = queue.repeat(0.002, 0.002, 0.001, [&] {
            elsewhere += queue.isCurrent() ? 0 : 1;
            if (++fired == 5) {
                timer->cancel();
                queue.after(0.02, [&] { meeting.arrive(); });
            }
        });
    });
    ASSERT_TRUE(meeting.wait());
    EXPECT_EQ(fired, 5);
    EXPECT_EQ(elsewhere, 0);
}

TEST_F(SerialQueueContract, FiresNoTimerThatAnotherQueueCancelledBefore) {
    Meeting meeting(1);
    const SerialQueue other("other");
    std::atomic<int> fired = 0;
    const auto timer = queue.repeat(0.05, 0.01, 0, [&] { ++fired; });
    ASSERT_NE(timer, nullptr);
    other.async([&] {
        timer->cancel();
        timer->cancel();
        queue.after(0.1, [&] { meeting.arrive(); });
    });
    ASSERT_TRUE(meeting.wait());
    EXPECT_EQ(fired, 0);
}

TEST_F(SerialQueueContract, FiresATimerThatNobodyKeeps) {
    Meeting meeting(1);
    constexpr double kNeverAgain = 1e6;
    (void)queue.repeat(0.001, kNeverAgain, 0, [&] { meeting.arrive(); });
    EXPECT_TRUE(meeting.wait());
}

TEST_F(SerialQueueContract, MergesTheFiringsThatItWasTooBusyFor) {
    Meeting meeting(1);
    std::vector<AbsoluteTime> times;
    std::shared_ptr<SerialQueue::Timer> timer;
    queue.async([&] {
        timer = queue.repeat(0.01, 0.01, 0, [&] {
            times.push_back(AbsoluteTimeGetCurrent());
            if (times.size() == 1) {
                twin::Spend(0.055);
            } else if (times.size() == 5) {
                timer->cancel();
                meeting.arrive();
            }
        });
    });
    ASSERT_TRUE(meeting.wait());
    // One for all five that were missed, and then one each interval.
    EXPECT_GE(times[4] - times[0], 0.07);
}

TEST_F(SerialQueueContract, InvalidatesATimerOfTheMainLoop) {
    Meeting meeting(1);
    RunLoop& loop = RunLoop::current();
    int fired = 0;
    const auto timer = RunLoopTimer::create(AbsoluteTimeGetCurrent() + 30.0, 0, [&] { ++fired; });
    loop.addTimer(timer);
    queue.async([&] {
        timer->invalidate();
        meeting.arrive();
    });
    ASSERT_TRUE(meeting.wait());
    EXPECT_EQ(loop.run(60.0, AfterSource::kGoOn), RunLoopResult::kFinished);
    EXPECT_EQ(fired, 0);
}

TEST_F(SerialQueueContract, ArmsATimerOnTheMainLoop) {
    RunLoop& loop = RunLoop::current();
    const auto guard = RunLoopTimer::create(AbsoluteTimeGetCurrent() + 120.0, 0, [] {});
    loop.addTimer(guard);
    queue.async([&] {
        loop.addTimer(
            RunLoopTimer::create(AbsoluteTimeGetCurrent() + 0.001, 0, [&] { loop.stop(); }));
    });
    EXPECT_EQ(loop.run(60.0, AfterSource::kGoOn), RunLoopResult::kStopped);
    guard->invalidate();
}

TEST_F(SerialQueueContract, StopsTheMainLoop) {
    RunLoop& loop = RunLoop::current();
    const auto guard = RunLoopTimer::create(AbsoluteTimeGetCurrent() + 120.0, 0, [] {});
    loop.addTimer(guard);
    queue.async([&] { loop.stop(); });
    EXPECT_EQ(loop.run(60.0, AfterSource::kGoOn), RunLoopResult::kStopped);
    guard->invalidate();
}

}  // namespace
