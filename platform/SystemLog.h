// The system log of the older routines: two priorities.
#pragma once

#include <cstdint>

namespace platform {

enum class SystemLogPriority : std::uint8_t { kError = 3, kNotice = 5 };

/// Writes one line, under the rules of platform::Log.
void SystemLog(SystemLogPriority priority, const char* format, ...)
    __attribute__((format(printf, 2, 3)));

}  // namespace platform
