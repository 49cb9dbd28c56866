// The groups whose processes may open echo sockets, as the kernel tells them.
#pragma once

#include <charconv>
#include <cstdint>
#include <optional>
#include <string_view>

namespace lfhelper::doctor {

/// Two numbers; none of all groups when the first is the larger one.
struct EchoGroups {
    std::uint32_t first = 1;
    std::uint32_t last = 0;

    [[nodiscard]] bool contain(std::uint32_t group) const {
        return first <= group && group <= last;
    }
};

/// Takes "FIRST LAST" apart, with any white space between and behind.
[[nodiscard]] inline std::optional<EchoGroups> ParseEchoGroups(std::string_view text) {
    EchoGroups groups;
    const char* const end = text.data() + text.size();
    const auto first = std::from_chars(text.data(), end, groups.first);
    const char* second = first.ptr;
    while (second != end && (*second == ' ' || *second == '\t')) {
        ++second;
    }
    const auto last = std::from_chars(second, end, groups.last);
    const bool isWhole = first.ec == std::errc{} && last.ec == std::errc{} && second != first.ptr;
    return isWhole ? std::optional(groups) : std::nullopt;
}

}  // namespace lfhelper::doctor
