// Bytes in hexadecimal, and a reply with its fields named.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace lfhelper {

using ByteSpan = std::span<const std::byte>;

/// Two digits a byte, nothing between.
[[nodiscard]] std::string ToHex(ByteSpan bytes);

/// Reads pairs of digits; blanks and colons may stand between pairs. Nothing for other text.
[[nodiscard]] std::optional<std::vector<std::byte>> FromHex(std::string_view text);

/// One line for each field of a reply, and lines of 16 bytes for what stands behind the fields.
[[nodiscard]] std::string AnnotatedReply(ByteSpan reply);

/// The return code of a reply: 0 for a complex one, which only a success is. Nothing when it is
/// too short to have one.
[[nodiscard]] std::optional<std::int32_t> ReturnCodeOf(ByteSpan reply);

}  // namespace lfhelper
