// The text of a log line: printf formats, with arguments that cannot forge a second line.
#pragma once

#include <cstdarg>
#include <string>
#include <string_view>

namespace platform {

/// Formats like vprintf; in %s arguments bytes below 0x20, 0x7f and invalid UTF-8 become \xNN
/// (lower-case hex). The text of the format itself goes out as it stands.
[[nodiscard]] std::string FormatLogText(const char* format, std::va_list arguments)
    __attribute__((format(printf, 1, 0)));

/// The same rule for one text.
[[nodiscard]] std::string EscapeLogArgument(std::string_view text);

}  // namespace platform
