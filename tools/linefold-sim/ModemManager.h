// The modem manager, which switches the radios' logging.
#pragma once

#include <span>
#include <string_view>

namespace simulator {

inline constexpr std::string_view kModemManagerHelp =
    "modem-manager [OPTIONS]\n"
    "Owns the modem manager's name on the bus. Prints, after a first line \"ready\", each level "
    "that\n"
    "SetLogging asks for, behind the caller's user as the bus knows it a moment later: root,\n"
    "somebody, or nobody when the caller is gone by then. Plays until SIGTERM or the end of the "
    "bus.\n"
    "\n"
    "  --bus PATH    the socket of the bus (default: /run/dbus/system_bus_socket)\n"
    "\n"
    "Example:\n"
    "  linefold-sim modem-manager --bus /tmp/bus\n";

[[nodiscard]] int PlayModemManager(std::span<const std::string_view> words);

}  // namespace simulator
