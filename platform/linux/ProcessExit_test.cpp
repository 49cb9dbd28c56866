#include "platform/ProcessExit.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>

#include "platform/RunLoop.h"

namespace platform {
namespace {

/// A process that waits to be ended.
class Child {
public:
    Child() : pid_(fork()) {
        if (pid_ == 0) {
            alarm(60);
            pause();
            _exit(0);
        }
    }

    ~Child() { end(); }

    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;

    [[nodiscard]] pid_t pid() const { return pid_; }

    void signal() const { kill(pid_, SIGKILL); }

    void end() {
        if (!isReaped_) {
            signal();
            waitpid(pid_, nullptr, 0);
            isReaped_ = true;
        }
    }

private:
    const pid_t pid_;
    bool isReaped_ = false;
};

/// Serves the loop until `done`, 20 s at most.
void ServeUntil(const bool& done) {
    for (int i = 0; i < 200 && !done; ++i) {
        (void)RunLoop::current().run(0.1, AfterSource::kReturn);
    }
}

TEST(ProcessExit, IsToldOnce) {
    Child child;
    const auto source = ProcessExitSource::create(child.pid());
    ASSERT_NE(source, nullptr);
    int told = 0;
    bool done = false;
    source->setEventHandler([&] { done = ++told > 0; });
    source->activate();
    child.signal();
    ServeUntil(done);
    (void)RunLoop::current().run(0.05, AfterSource::kGoOn);
    EXPECT_EQ(told, 1);
}

TEST(ProcessExit, IsNotToldBeforeActivation) {
    Child child;
    const auto source = ProcessExitSource::create(child.pid());
    bool told = false;
    source->setEventHandler([&] { told = true; });
    child.end();
    (void)RunLoop::current().run(0.05, AfterSource::kGoOn);
    EXPECT_FALSE(told);
    source->activate();
    ServeUntil(told);
    EXPECT_TRUE(told);
}

TEST(ProcessExit, ACancelledSourceTellsOnlyOfItsCancellation) {
    Child child;
    const auto source = ProcessExitSource::create(child.pid());
    bool told = false;
    int cancelled = 0;
    source->setEventHandler([&] { told = true; });
    source->setCancelHandler([&] { ++cancelled; });
    source->activate();
    source->cancel();
    source->cancel();
    child.end();
    (void)RunLoop::current().run(0.05, AfterSource::kGoOn);
    EXPECT_FALSE(told);
    EXPECT_EQ(cancelled, 1);
}

TEST(ProcessExit, KnowsWhetherTheProcessLives) {
    Child child;
    const auto source = ProcessExitSource::create(child.pid());
    EXPECT_TRUE(source->processLives());
    child.end();
    EXPECT_FALSE(source->processLives());
    source->cancel();
}

TEST(ProcessExit, AProcessThatIsGoneHasNoSource) {
    Child child;
    child.end();
    EXPECT_EQ(ProcessExitSource::create(child.pid()), nullptr);
    EXPECT_EQ(ProcessExitSource::create(0), nullptr);
    EXPECT_EQ(ProcessExitSource::create(-1), nullptr);
}

}  // namespace
}  // namespace platform
