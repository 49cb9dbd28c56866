// The run loop: one thread's wait for sources, timers and posted tasks, and the callouts to them.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "platform/Clock.h"

namespace platform {

/// Why a run of the loop came back. The numbers are part of the server's interface.
enum class RunLoopResult : std::int32_t {
    kNotRun = 0,
    kFinished = 1,  ///< nothing is left to wait for
    kStopped = 2,
    kTimedOut = 3,
    kHandledSource = 4,
};

enum class AfterSource : bool { kGoOn, kReturn };

/// Something that a loop waits for on behalf of another interface. Belongs to one loop's thread.
class RunLoopSource {
public:
    RunLoopSource(const RunLoopSource&) = delete;
    RunLoopSource& operator=(const RunLoopSource&) = delete;

    /// Takes the source out of its loop for good; no callout starts after this. Twice is harmless.
    void invalidate();

protected:
    RunLoopSource() = default;
    ~RunLoopSource() = default;
};

/// Fires once, or again and again, on the loop that it was added to.
class RunLoopTimer {
public:
    /// First at `fireDate`, then every `interval` seconds (0: once). Null when it cannot be made.
    [[nodiscard]] static std::shared_ptr<RunLoopTimer> create(AbsoluteTime fireDate,
                                                              double interval,
                                                              std::function<void()> callout);

    RunLoopTimer(const RunLoopTimer&) = delete;
    RunLoopTimer& operator=(const RunLoopTimer&) = delete;

    /// From any thread. A callout that has not begun never begins. Twice is harmless.
    void invalidate();

protected:
    RunLoopTimer() = default;
    ~RunLoopTimer() = default;
};

class RunLoop {
public:
    /// The loop of the calling thread.
    [[nodiscard]] static RunLoop& current();

    RunLoop(const RunLoop&) = delete;
    RunLoop& operator=(const RunLoop&) = delete;

    /// Serves for `seconds` (any positive number), or until stopped, or until nothing is left, or
    /// (AfterSource::kReturn) until a source was served. On the loop's own thread only.
    RunLoopResult run(double seconds, AfterSource afterSource);

    /// From any thread. Ends the run in progress, or the next one if none is: what else had become
    /// ready in the same batch is not served.
    void stop();

    /// On the loop's own thread only.
    void addSource(const std::shared_ptr<RunLoopSource>& source);

    /// From any thread. The loop keeps the timer until it is invalid.
    void addTimer(const std::shared_ptr<RunLoopTimer>& timer);

    /// Runs a task on the loop's thread, in the order of posting. From any thread.
    void post(std::function<void()> task);

    /// The same, not before `seconds` have passed. From any thread.
    void after(double seconds, std::function<void()> task);

protected:
    RunLoop() = default;
    ~RunLoop() = default;
};

}  // namespace platform
