// The system log: the datagrams of syslog(3), facility daemon.
#include "platform/SystemLog.h"

#include <unistd.h>

#include <array>
#include <cstdarg>
#include <cstddef>
#include <ctime>
#include <string>

#include "platform/LogText.h"
#include "platform/linux/LogSocket.h"

namespace platform {
namespace {

constexpr unsigned kFacilityDaemon = 3U << 3;

LogSocket& SystemLogSocket() {
    static auto* const socket = new LogSocket("/dev/log");
    return *socket;
}

std::string Entry(SystemLogPriority priority, const std::string& text) {
    const std::time_t now = std::time(nullptr);
    std::tm local{};
    localtime_r(&now, &local);
    std::array<char, 32> stamp{};
    (void)std::strftime(stamp.data(), stamp.size(), "%b %e %H:%M:%S", &local);  // always fits
    std::string entry = "<";
    entry += std::to_string(kFacilityDaemon | static_cast<unsigned>(priority));
    entry.append(">").append(stamp.data()).append(" ").append(kLogIdentity);
    entry.append("[").append(std::to_string(getpid())).append("]: ").append(text);
    return entry;
}

}  // namespace

void SystemLog(SystemLogPriority priority, const char* format, ...) {
    std::va_list arguments;
    va_start(arguments, format);
    const std::string text = FormatLogText(format, arguments);
    va_end(arguments);
    LogSocket& socket = SystemLogSocket();
    if (const auto dropped = socket.takeDroppedCount(); dropped != 0) {
        socket.send(Entry(SystemLogPriority::kNotice,
                          std::to_string(dropped) + " lines of the system log were lost"));
    }
    if (socket.send(Entry(priority, text)) == LogSocket::Outcome::kAbsent) {
        WriteToStandardError(text);
    }
}

}  // namespace platform
