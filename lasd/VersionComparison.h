// Versions of databases, compared as people read them.
#pragma once

#include <compare>
#include <string_view>

/// Runs of digits count by their value, whatever their length, and ASCII letters are the same in
/// either case: "1.10" comes after "1.9", "1.01" is "1.1" and "A" is "a". All else is compared byte
/// by byte.
[[nodiscard]] std::weak_ordering CompareVersions(std::string_view a, std::string_view b);
