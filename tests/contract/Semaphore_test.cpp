#include "platform/Semaphore.h"

#include <gtest/gtest.h>

#include "platform/SerialQueue.h"
#include "tests/contract/Twin.h"

namespace {

using platform::Semaphore;
using platform::SerialQueue;

class SemaphoreContract : public testing::Test {
protected:
    SemaphoreContract() { twin::Reset(); }
};

TEST_F(SemaphoreContract, WaitsUntilAnotherThreadSignals) {
    const auto semaphore = Semaphore::create();
    const SerialQueue queue("signals");
    bool isDone = false;
    queue.after(0.02, [&] {
        isDone = true;
        semaphore->signal();
    });
    semaphore->wait();
    EXPECT_TRUE(isDone);
}

TEST_F(SemaphoreContract, CountsSignalsThatComeFirst) {
    const auto semaphore = Semaphore::create();
    semaphore->signal();
    semaphore->signal();
    semaphore->wait();
    semaphore->wait();
    const SerialQueue queue("signals");
    queue.async([&] { semaphore->signal(); });
    semaphore->wait();
}

TEST_F(SemaphoreContract, LetsAQueueWaitForAnother) {
    const auto inner = Semaphore::create();
    const auto outer = Semaphore::create();
    const SerialQueue waiting("waits");
    const SerialQueue signalling("signals");
    int order = 0;
    waiting.async([&] {
        signalling.async([&] {
            order = order * 10 + 1;
            inner->signal();
        });
        inner->wait();
        order = order * 10 + 2;
        outer->signal();
    });
    outer->wait();
    EXPECT_EQ(order, 12);
}

}  // namespace
