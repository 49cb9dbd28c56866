#include "lasd/SharedSynchronizable.h"

#include <gtest/gtest.h>

#include "platform/sim/Sim.h"

namespace {

class Worker final : public hvu::SharedSynchronizable<Worker> {
public:
    explicit Worker(std::vector<std::string>& journal)
        : SharedSynchronizable("worker"), journal_(journal) {}

    ~Worker() { note(isOnWorkQueue() ? "destroyed on its queue" : "destroyed elsewhere"); }

    void work(const std::string& what) {
        submit([this, what] { note(what + (isOnWorkQueue() ? "" : " elsewhere")); });
    }

    /// Work that submits more work when it is done.
    void workTwice() {
        submit([this] {
            note("first");
            work("second");
        });
    }

private:
    void note(std::string what) const { journal_.push_back(std::move(what)); }

    std::vector<std::string>& journal_;
};

/// One that asks for work when nobody shares it any more.
class LateWorker final : public hvu::SharedSynchronizable<LateWorker> {
public:
    explicit LateWorker(bool& hasThrown) : SharedSynchronizable("late"), hasThrown_(hasThrown) {}

    ~LateWorker() {
        try {
            submit([] {});
        } catch (const std::bad_weak_ptr&) {
            hasThrown_ = true;
        }
    }

private:
    bool& hasThrown_;
};

class SharedSynchronizableTest : public testing::Test {
protected:
    SharedSynchronizableTest() { sim::Reset(); }

    ~SharedSynchronizableTest() override { sim::Settle(); }

    std::vector<std::string> journal;
};

using Journal = std::vector<std::string>;

TEST_F(SharedSynchronizableTest, WorksOnItsQueueInOrder) {
    const auto worker = Worker::create(journal);
    worker->work("a");
    worker->work("b");
    EXPECT_EQ(journal, Journal{});
    sim::Settle();
    EXPECT_EQ(journal, (Journal{"a", "b"}));
}

TEST_F(SharedSynchronizableTest, IsDestroyedBehindItsWork) {
    auto worker = Worker::create(journal);
    worker->work("a");
    worker->workTwice();
    worker = nullptr;
    EXPECT_EQ(journal, Journal{}) << "nothing happens on this thread";
    sim::Settle();
    EXPECT_EQ(journal, (Journal{"a", "first", "second", "destroyed on its queue"}));
}

TEST_F(SharedSynchronizableTest, IsDestroyedByABarrierWithoutWork) {
    Worker::create(journal).reset();
    EXPECT_EQ(sim::JournalCount("SerialQueue.barrierAsync worker"), 1U);
    EXPECT_EQ(journal, Journal{});
    sim::Settle();
    EXPECT_EQ(journal, Journal{"destroyed on its queue"});
}

TEST_F(SharedSynchronizableTest, LivesWhileAnybodySharesIt) {
    auto worker = Worker::create(journal);
    const std::weak_ptr<Worker> watched = worker;
    auto other = worker;
    worker = nullptr;
    sim::Settle();
    EXPECT_FALSE(watched.expired());
    other = nullptr;
    EXPECT_TRUE(watched.expired());
}

TEST_F(SharedSynchronizableTest, TakesNoWorkWhenNobodySharesIt) {
    bool hasThrown = false;
    LateWorker::create(hasThrown).reset();
    sim::Settle();
    EXPECT_TRUE(hasThrown);
}

}  // namespace
