// Numbers on the command line.
#pragma once

#include <charconv>
#include <optional>
#include <string_view>
#include <system_error>

namespace lfhelper {

/// A decimal number, or a hexadecimal one behind 0x.
template <typename Number>
[[nodiscard]] std::optional<Number> ParseNumber(std::string_view text) {
    const bool isHex = text.starts_with("0x") || text.starts_with("0X");
    const std::string_view digits = isHex ? text.substr(2) : text;
    Number number{};
    const char* const end = digits.data() + digits.size();
    const auto [rest, error] = std::from_chars(digits.data(), end, number, isHex ? 16 : 10);
    const bool hasSignBehindPrefix = isHex && digits.starts_with('-');
    return error == std::errc{} && rest == end && !hasSignBehindPrefix ? std::optional(number)
                                                                       : std::nullopt;
}

}  // namespace lfhelper
