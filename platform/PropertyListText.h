// How the kinds of value are spelled in an XML property list.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/PropertyList.h"

namespace platform {

/// True for UTF-8 of characters that XML 1.0 can hold.
[[nodiscard]] bool IsXmlText(std::string_view text);

/// True for a character that XML 1.0 can hold.
[[nodiscard]] bool IsXmlCharacter(std::uint32_t character);

void AppendUtf8(std::string& text, std::uint32_t character);

// Each of these takes the whole text, white space around it apart, or gives none.

/// Decimal with an optional sign, or hexadecimal behind "0x".
[[nodiscard]] std::optional<std::int64_t> ParseInteger(std::string_view text);

/// Decimal, or one of the words nan, inf and infinity in any case, with an optional sign. Numbers
/// that a double cannot come near are none.
[[nodiscard]] std::optional<double> ParseReal(std::string_view text);

/// As "2001-01-01T00:00:00Z".
[[nodiscard]] std::optional<PropertyList::Date> ParseDate(std::string_view text);

/// Base64 with white space anywhere, padded, without bits that mean nothing.
[[nodiscard]] std::optional<PropertyList::Data> ParseBase64(std::string_view text);

/// The shortest text that parses back to the same bits; every NaN is "nan".
[[nodiscard]] std::string FormatReal(double value);

[[nodiscard]] std::string FormatDate(PropertyList::Date value);

/// False for a date outside the years 1 to 9999.
[[nodiscard]] bool IsCalendarDate(PropertyList::Date value);

/// The characters for up to three bytes.
[[nodiscard]] std::string FormatBase64(std::span<const std::byte> bytes);

}  // namespace platform
