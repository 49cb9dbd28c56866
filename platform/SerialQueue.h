// A serial queue: tasks handed over from any thread, run one after the other away from the caller.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

namespace platform {

enum class QualityOfService : std::uint8_t { kDefault, kUtility };

/// A handle; copies name the same queue. The queue lives until the last handle is gone and the
/// last task has run. Its thread starts with the first task.
class SerialQueue {
public:
    class Timer;

    explicit SerialQueue(std::string_view label,
                         QualityOfService service = QualityOfService::kDefault);

    [[nodiscard]] const std::string& label() const;
    [[nodiscard]] QualityOfService service() const;

    /// Runs the task after all that were handed over before it.
    void async(std::function<void()> task) const;

    /// The same, not before `seconds` have passed.
    void after(double seconds, std::function<void()> task) const;

    /// Runs the task when all that were handed over before it are done and before any later one
    /// starts: the place to destroy what tasks of this queue use.
    void barrierAsync(std::function<void()> task) const;

    /// Calls out on the queue after `delay` seconds and then every `interval` seconds, each time up
    /// to `leeway` seconds late. Firings that the queue was too busy for are merged into one.
    /// Null when it cannot be made.
    [[nodiscard]] std::shared_ptr<Timer> repeat(double delay,
                                                double interval,
                                                double leeway,
                                                std::function<void()> callout) const;

    /// True on the queue's own tasks.
    [[nodiscard]] bool isCurrent() const;

private:
    struct State;
    std::shared_ptr<State> state_;
};

/// A repeating timer on a queue; letting go of it does not cancel it.
class SerialQueue::Timer {
public:
    Timer(const Timer&) = delete;
    Timer& operator=(const Timer&) = delete;

    /// From any thread. A callout that has not begun never begins. Twice is harmless.
    void cancel();

protected:
    Timer() = default;
    ~Timer() = default;
};

/// From here on no queue starts a task. Called once, when the process is about to end: what queue
/// threads reach stays in place, and nobody waits for them.
void SerialQueuesStop();

}  // namespace platform
