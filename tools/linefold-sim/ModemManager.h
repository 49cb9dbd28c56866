// The modem manager, which switches the radios' logging.
#pragma once

#include <span>
#include <string_view>

namespace simulator {

inline constexpr std::string_view kModemManagerHelp =
    "modem-manager [--bus PATH]\n"
    "Owns the modem manager's name on the system bus, or on the bus at PATH, and prints a line "
    "for\n"
    "each level that SetLogging asks for: the caller's user as the bus knows it a moment later\n"
    "(root, somebody, or nobody when the caller is gone by then), and the level. The first line "
    "is\n"
    "\"ready\". It ends with the bus or by SIGTERM.\n";

[[nodiscard]] int PlayModemManager(std::span<const std::string_view> words);

}  // namespace simulator
