// Lines of the twin's own, where an operator could otherwise not tell what to mend.
#pragma once

#include "platform/Log.h"

namespace platform {

inline constexpr const char* kPlatformCategory = "platform";

/// Like Log, under the category that tells these lines from the daemon's.
void PlatformLog(LogLevel level, const char* format, ...) __attribute__((format(printf, 2, 3)));

}  // namespace platform
