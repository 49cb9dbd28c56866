// The telephony daemon's part: it owns its ports and prints what arrives.
#pragma once

#include <span>
#include <string_view>

namespace simulator {

inline constexpr std::string_view kTelephonyHelp =
    "telephony [OPTIONS]\n"
    "Owns the ports com.vendra.linefold.server and com.vendra.Linefold.lasd in the telephony\n"
    "daemon's place and prints one line for each report and each notification that arrives, after\n"
    "a first line \"ready\". Plays until SIGTERM.\n"
    "\n"
    "  --error NUMBER      refuse each report with this error (default: 0, a success)\n"
    "  --domain NUMBER     the domain of that error (default: 2)\n"
    "  --delay SECONDS     answer each report so much later\n"
    "  --silent            never answer a report\n"
    "  --notify TEXT       before each answer, send a notification with this text\n"
    "  --only PORT         own one of the ports, \"server\" or \"lasd\", and be away from the "
    "other\n"
    "\n"
    "Example:\n"
    "  linefold-sim telephony --delay 1 --error 5\n";

[[nodiscard]] int PlayTelephony(std::span<const std::string_view> words);

}  // namespace simulator
