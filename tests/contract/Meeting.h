// Where a test on the main loop waits for what other queues do.
#pragma once

#include <limits>

#include "platform/RunLoop.h"

/// Waits until `arrive` has been called so often; far beyond any real delay it gives up.
class Meeting {
public:
    explicit Meeting(int expected) : missing_(expected) {}

    /// From any thread.
    void arrive() {
        loop_.post([this] {
            if (--missing_ == 0) {
                loop_.stop();
            }
        });
    }

    [[nodiscard]] bool wait() {
        constexpr double kFarBeyond = 60.0;
        const auto guard = platform::RunLoopTimer::create(
            platform::AbsoluteTimeGetCurrent() + 2 * kFarBeyond, 0, [] {});
        loop_.addTimer(guard);
        const auto result = loop_.run(kFarBeyond, platform::AfterSource::kGoOn);
        guard->invalidate();
        return result == platform::RunLoopResult::kStopped && missing_ == 0;
    }

private:
    platform::RunLoop& loop_ = platform::RunLoop::current();
    int missing_;
};
