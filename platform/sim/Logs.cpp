#include <array>
#include <cstdarg>
#include <cstdio>

#include "platform/LogText.h"
#include "platform/sim/World.h"

namespace {

struct Logs {
    std::vector<sim::LogLine> unified;
    std::vector<sim::SystemLogLine> system;
};

Logs& TheLogs() {
    static Logs& logs = *new Logs;
    return logs;
}

constexpr std::array<std::string_view, 4> kLevelNames{"debug", "info", "default", "error"};

std::string_view NameOf(platform::SystemLogPriority priority) {
    return priority == platform::SystemLogPriority::kError ? "error" : "notice";
}

}  // namespace

namespace sim {

const std::vector<LogLine>& UnifiedLog() {
    return TheLogs().unified;
}

const std::vector<SystemLogLine>& SystemLogLines() {
    return TheLogs().system;
}

void ClearLogs() {
    TheLogs().unified.clear();
    TheLogs().system.clear();
}

void ResetLogs() {
    ClearLogs();
}

}  // namespace sim

namespace platform {

void Log(LogLevel level, const char* format, ...) {
    std::va_list arguments;
    va_start(arguments, format);
    auto text = FormatLogText(format, arguments);
    va_end(arguments);
    if (text.starts_with("Assertion failed")) {
        // The process ends with this line: nobody will be left to ask for it.
        (void)std::fprintf(stderr, "%s\n", text.c_str());
    }
    sim::NoteCall("Log", std::string(kLevelNames.at(static_cast<std::size_t>(level))) + " " + text);
    TheLogs().unified.push_back({.level = level, .text = std::move(text)});
}

void SystemLog(SystemLogPriority priority, const char* format, ...) {
    std::va_list arguments;
    va_start(arguments, format);
    auto text = FormatLogText(format, arguments);
    va_end(arguments);
    sim::NoteCall("SystemLog", std::string(NameOf(priority)) + " " + text);
    TheLogs().system.push_back({.priority = priority, .text = std::move(text)});
}

}  // namespace platform
