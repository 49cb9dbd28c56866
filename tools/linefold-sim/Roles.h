// What linefold-sim can play: one row and one function each.
#pragma once

#include <span>
#include <string_view>

namespace simulator {

struct Role {
    std::string_view name;
    std::string_view summary;
    std::string_view help;  ///< behind "usage: linefold-sim ", ending in a newline
    /// Plays it with the words behind its name, until SIGTERM or the end of what was asked for.
    /// Gives the exit status: 0, 1 when it could not play, 2 for wrong words.
    int (*play)(std::span<const std::string_view> words);
};

[[nodiscard]] std::span<const Role> Roles();

}  // namespace simulator
