// Notice of another process's end.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>

namespace platform {

/// Watches one process. The handlers run on the global queue of default priority; the object
/// belongs to the thread that created it.
class ProcessExitSource {
public:
    /// Null when the process is gone already or cannot be watched. Nothing runs before activate.
    [[nodiscard]] static std::shared_ptr<ProcessExitSource> create(std::int32_t pid);

    ProcessExitSource(const ProcessExitSource&) = delete;
    ProcessExitSource& operator=(const ProcessExitSource&) = delete;

    /// Runs once, when the process has ended, unless cancelled before.
    void setEventHandler(std::function<void()> handler);

    /// Runs once, after the cancellation, when no event handler can start any more.
    void setCancelHandler(std::function<void()> handler);

    void activate();

    /// Twice is harmless.
    void cancel();

    /// Asks the system now: false from the moment that the process has ended.
    [[nodiscard]] bool processLives() const;

protected:
    ProcessExitSource() = default;
    ~ProcessExitSource() = default;
};

}  // namespace platform
