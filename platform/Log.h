// The unified log: the default handle, four levels.
#pragma once

#include <cstdint>

namespace platform {

enum class LogLevel : std::uint8_t { kDebug, kInfo, kDefault, kError };

/// Writes one line. The format is of the printf family (%s %d %i %u %x %c %p %%, with l, ll or z)
/// and goes out as it stands; in %s arguments bytes below 0x20, 0x7f and what is not UTF-8 become
/// \xNN. Never blocks and never fails: a line that the log cannot take is counted and dropped.
void Log(LogLevel level, const char* format, ...) __attribute__((format(printf, 2, 3)));

}  // namespace platform
