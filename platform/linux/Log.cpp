// The unified log: native journal datagrams (systemd.io/JOURNAL_NATIVE_PROTOCOL).
#include "platform/Log.h"

#include <cstdarg>
#include <cstddef>
#include <string>
#include <string_view>

#include "platform/LogText.h"
#include "platform/linux/LogSocket.h"
#include "platform/linux/PlatformLog.h"

namespace platform {
namespace {

constexpr std::string_view kSubsystem = "com.vendra.linefold";

LogSocket& Journal() {
    static auto* const journal = new LogSocket("/run/systemd/journal/socket");
    return *journal;
}

std::string_view PriorityOf(LogLevel level) {
    switch (level) {
        case LogLevel::kDebug:
            return "7";
        case LogLevel::kInfo:
            return "6";
        case LogLevel::kDefault:
            return "5";
        case LogLevel::kError:
            break;
    }
    return "3";
}

/// A text with a newline goes with its length, so that nobody can forge another field with it.
void AppendField(std::string& entry, std::string_view name, std::string_view value) {
    entry += name;
    if (value.find('\n') == std::string_view::npos) {
        entry += '=';
    } else {
        entry += '\n';
        for (unsigned shift = 0; shift < 64; shift += 8) {
            entry += static_cast<char>(value.size() >> shift & 0xFF);
        }
    }
    entry += value;
    entry += '\n';
}

std::string JournalEntry(LogLevel level, std::string_view category, std::string_view text) {
    std::string entry;
    entry.reserve(text.size() + 160);
    AppendField(entry, "PRIORITY", PriorityOf(level));
    AppendField(entry, "SYSLOG_IDENTIFIER", kLogIdentity);
    AppendField(entry, "SUBSYSTEM", kSubsystem);
    if (!category.empty()) {
        AppendField(entry, "CATEGORY", category);
    }
    AppendField(entry, "MESSAGE", text);
    return entry;
}

void WriteEntry(LogLevel level, std::string_view category, const std::string& text) {
    if (const auto dropped = Journal().takeDroppedCount(); dropped != 0) {
        Journal().send(
            JournalEntry(LogLevel::kDefault,
                         kPlatformCategory,
                         std::to_string(dropped) + " lines of the unified log were lost"));
    }
    if (Journal().send(JournalEntry(level, category, text)) == LogSocket::Outcome::kAbsent) {
        WriteToStandardError(text);
    }
}

}  // namespace

void Log(LogLevel level, const char* format, ...) {
    std::va_list arguments;
    va_start(arguments, format);
    WriteEntry(level, {}, FormatLogText(format, arguments));
    va_end(arguments);
}

void PlatformLog(LogLevel level, const char* format, ...) {
    std::va_list arguments;
    va_start(arguments, format);
    WriteEntry(level, kPlatformCategory, FormatLogText(format, arguments));
    va_end(arguments);
}

}  // namespace platform
