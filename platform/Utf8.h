// Well-formedness of UTF-8 (RFC 3629).
#pragma once

#include <cstddef>
#include <string_view>

namespace platform {

/// Bytes of the well-formed sequence at the start of a text that is not empty; 0 when there is
/// none: no overlong forms, no surrogates, nothing above U+10FFFF.
[[nodiscard]] std::size_t Utf8SequenceLength(std::string_view text);

[[nodiscard]] bool IsUtf8(std::string_view text);

}  // namespace platform
