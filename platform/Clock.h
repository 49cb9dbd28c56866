// The clock that timers go by.
#pragma once

namespace platform {

/// Seconds on a clock that never jumps; only differences mean something.
using AbsoluteTime = double;

[[nodiscard]] AbsoluteTime AbsoluteTimeGetCurrent();

}  // namespace platform
