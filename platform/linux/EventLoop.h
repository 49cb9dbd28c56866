// The loop behind run loops and serial queues: one level-triggered epoll set, timers and tasks.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/RunLoop.h"
#include "platform/linux/OwnedFd.h"

namespace platform {

class EventLoop;

/// A descriptor that a loop waits for. Belongs to that loop's thread.
class EventSource : public RunLoopSource {
public:
    virtual ~EventSource() = default;
    EventSource(const EventSource&) = delete;
    EventSource& operator=(const EventSource&) = delete;

    /// Called on the loop's thread with the ready EPOLL bits.
    virtual void ready(std::uint32_t events) = 0;

    void leaveLoop();

    [[nodiscard]] bool isValid() const { return isValid_; }

    [[nodiscard]] int descriptor() const { return descriptor_; }

protected:
    /// `interest` is EPOLLIN, EPOLLOUT, both or nothing.
    EventSource(int descriptor, std::uint16_t interest)
        : descriptor_(descriptor), interest_(interest) {}

    /// Changes the EPOLL bits that are waited for.
    void setInterest(std::uint16_t interest);

private:
    friend class EventLoop;

    // There are two sources a client, so they are kept small: the loop is that of the thread.
    const int descriptor_;
    std::uint16_t interest_;
    bool isValid_ = true;
    bool isAttached_ = false;
};

class EventTimer final : public RunLoopTimer {
public:
    EventTimer(AbsoluteTime fireDate, double interval, std::function<void()> callout)
        : fireDate_(fireDate), interval_(interval), callout_(std::move(callout)) {}

    ~EventTimer() = default;

    void cancel() { state_ = State::kInvalid; }

    [[nodiscard]] bool isArmed() const { return state_ == State::kArmed; }

    [[nodiscard]] AbsoluteTime fireDate() const { return fireDate_; }

    /// On the loop's thread. Returns whether the timer goes on.
    bool fire(AbsoluteTime now);

private:
    enum class State : std::uint8_t { kArmed, kFiring, kInvalid };

    AbsoluteTime fireDate_;
    const double interval_;
    const std::function<void()> callout_;
    std::atomic<State> state_ = State::kArmed;
};

class EventLoop final : public RunLoop {
public:
    enum class WhenEmpty : bool { kFinish, kWait };

    EventLoop();
    ~EventLoop() = default;

    /// The loop of the calling thread, or null while it has none.
    static inline thread_local EventLoop* ofThisThread = nullptr;

    RunLoopResult serve(double seconds, AfterSource afterSource, WhenEmpty whenEmpty);
    void requestStop();
    void attach(const std::shared_ptr<EventSource>& source);
    void detach(EventSource& source);
    void modify(const EventSource& source);
    void attachTimer(std::shared_ptr<EventTimer> timer);
    void enqueue(std::function<void()> task);

private:
    [[nodiscard]] bool isStopped() const { return stopRequested_.load(std::memory_order_acquire); }

    void runTasks();
    void fireTimers();
    void wake();
    [[nodiscard]] double secondsToWait(AbsoluteTime deadline);
    [[nodiscard]] bool isEmpty();
    [[nodiscard]] bool serveSources(double seconds);

    OwnedFd epoll_;
    OwnedFd wake_;                                       // an eventfd
    std::vector<std::shared_ptr<EventSource>> sources_;  // by descriptor; on the loop's thread
    std::vector<int> newcomers_;  // descriptors whose source came since the last wait
    std::uint64_t waitCount_ = 0;
    std::size_t sourceCount_ = 0;
    std::atomic<bool> stopRequested_ = false;
    std::atomic<bool> isWoken_ = false;

    std::mutex lock_;
    std::vector<std::function<void()>> tasks_;         // under lock_
    std::vector<std::shared_ptr<EventTimer>> timers_;  // under lock_
    std::atomic<bool> hasWork_ = false;                // tasks_ or timers_ may hold something
};

}  // namespace platform
