#include "platform/PropertyListText.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <limits>

#include "platform/Utf8.h"

namespace platform {
namespace {

constexpr std::string_view kBase64Digits =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr std::uint8_t kNoDigit = 0xFF;

constexpr std::array<std::uint8_t, 256> kBase64Values = [] {
    std::array<std::uint8_t, 256> values{};
    values.fill(kNoDigit);
    for (std::uint8_t i = 0; i < kBase64Digits.size(); ++i) {
        values[static_cast<unsigned char>(kBase64Digits[i])] = i;
    }
    return values;
}();

/// Nobody needs more for a number; what is longer is not even looked at.
constexpr std::size_t kLongestNumber = 1024;

constexpr std::chrono::sys_days kEpoch =
    std::chrono::year(2001) / std::chrono::January / std::chrono::day(1);

bool IsSpace(char c) {
    return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

std::string_view Trim(std::string_view text) {
    while (!text.empty() && IsSpace(text.front())) {
        text.remove_prefix(1);
    }
    while (!text.empty() && IsSpace(text.back())) {
        text.remove_suffix(1);
    }
    return text;
}

/// True when there was a minus sign; removes either sign.
bool TakeSign(std::string_view& text) {
    const bool isNegative = text.starts_with('-');
    if (isNegative || text.starts_with('+')) {
        text.remove_prefix(1);
    }
    return isNegative;
}

std::string LowerCase(std::string_view text) {
    std::string lower(text);
    std::ranges::transform(lower, lower.begin(), [](char c) {
        return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
    });
    return lower;
}

template <typename T, typename... Format>
std::optional<T> FromWhole(std::string_view text, Format... format) {
    T value{};
    const char* const end = text.data() + text.size();
    const auto [stop, error] = std::from_chars(text.data(), end, value, format...);
    return error == std::errc() && stop == end ? std::optional(value) : std::nullopt;
}

/// Decimal digits at a fixed place.
std::optional<int> Digits(std::string_view text, std::size_t at, std::size_t count) {
    int value = 0;
    for (const char c : text.substr(at, count)) {
        if (c < '0' || c > '9') {
            return std::nullopt;
        }
        value = value * 10 + (c - '0');
    }
    return value;
}

/// The bits of the group that is complete or padded; none when the padding hides some.
bool FinishBase64(PropertyList::Data& data,
                  std::uint32_t bits,
                  std::size_t digits,
                  std::size_t padding) {
    if (digits == 0) {
        return padding == 0;
    }
    if (digits < 2 || digits + padding != 4) {
        return false;
    }
    const std::uint32_t group = bits << (6 * padding);
    const std::uint32_t hidden = padding == 1 ? 0xFF : 0xFFFF;
    for (std::size_t i = 0; i + 1 < digits; ++i) {
        data.push_back(static_cast<std::byte>(group >> (16 - 8 * i)));
    }
    return (group & hidden) == 0;
}

}  // namespace

bool IsXmlCharacter(std::uint32_t character) {
    return character == '\t' || character == '\n' || character == '\r' ||
           (character >= 0x20 && character < 0xD800) ||
           (character >= 0xE000 && character < 0xFFFE) ||
           (character >= 0x10000 && character <= 0x10FFFF);
}

bool IsXmlText(std::string_view text) {
    while (!text.empty()) {
        const auto lead = static_cast<unsigned char>(text.front());
        if (lead < 0x80) {
            if (!IsXmlCharacter(lead)) {
                return false;
            }
            text.remove_prefix(1);
            continue;
        }
        const std::size_t length = Utf8SequenceLength(text);
        const auto sequence = text.substr(0, length);
        if (length == 0 || sequence == "\xEF\xBF\xBE" || sequence == "\xEF\xBF\xBF") {
            return false;
        }
        text.remove_prefix(length);
    }
    return true;
}

void AppendUtf8(std::string& text, std::uint32_t character) {
    const auto tail = [character](unsigned shift) {
        return static_cast<char>(0x80 | ((character >> shift) & 0x3F));
    };
    if (character < 0x80) {
        text += static_cast<char>(character);
    } else if (character < 0x800) {
        text += {static_cast<char>(0xC0 | (character >> 6)), tail(0)};
    } else if (character < 0x10000) {
        text += {static_cast<char>(0xE0 | (character >> 12)), tail(6), tail(0)};
    } else {
        text += {static_cast<char>(0xF0 | (character >> 18)), tail(12), tail(6), tail(0)};
    }
}

std::optional<std::int64_t> ParseInteger(std::string_view text) {
    text = Trim(text);
    if (text.size() > kLongestNumber) {
        return std::nullopt;
    }
    const bool isNegative = TakeSign(text);
    const bool isHexadecimal = text.starts_with("0x") || text.starts_with("0X");
    const auto size =
        FromWhole<std::uint64_t>(isHexadecimal ? text.substr(2) : text, isHexadecimal ? 16 : 10);
    constexpr std::uint64_t kMax = std::numeric_limits<std::int64_t>::max();
    if (!size || *size > kMax + (isNegative ? 1 : 0)) {
        return std::nullopt;
    }
    return static_cast<std::int64_t>(isNegative ? 0 - *size : *size);
}

std::optional<double> ParseReal(std::string_view text) {
    text = Trim(text);
    if (text.size() > kLongestNumber) {
        return std::nullopt;
    }
    const bool isNegative = TakeSign(text);
    std::optional<double> size;
    if (const auto word = LowerCase(text); word == "nan") {
        return std::numeric_limits<double>::quiet_NaN();
    } else if (word == "inf" || word == "infinity") {
        size = std::numeric_limits<double>::infinity();
    } else if (!text.empty() && (text[0] == '.' || (text[0] >= '0' && text[0] <= '9'))) {
        size = FromWhole<double>(text, std::chars_format::general);
    }
    return size && isNegative ? -*size : size;
}

std::optional<PropertyList::Date> ParseDate(std::string_view text) {
    text = Trim(text);
    constexpr std::string_view kShape = "yyyy-mm-ddThh:mm:ssZ";
    if (text.size() != kShape.size() || text[4] != '-' || text[7] != '-' || text[10] != 'T' ||
        text[13] != ':' || text[16] != ':' || text[19] != 'Z') {
        return std::nullopt;
    }
    const auto year = Digits(text, 0, 4);
    const auto month = Digits(text, 5, 2);
    const auto day = Digits(text, 8, 2);
    const auto hour = Digits(text, 11, 2);
    const auto minute = Digits(text, 14, 2);
    const auto second = Digits(text, 17, 2);
    if (!year || !month || !day || !hour || !minute || !second) {
        return std::nullopt;
    }
    const std::chrono::year_month_day date(std::chrono::year(*year),
                                           std::chrono::month(static_cast<unsigned>(*month)),
                                           std::chrono::day(static_cast<unsigned>(*day)));
    if (*year < 1 || !date.ok() || *hour > 23 || *minute > 59 || *second > 59) {
        return std::nullopt;
    }
    const std::int64_t days = (std::chrono::sys_days(date) - kEpoch).count();
    return PropertyList::Date{.seconds = days * 86'400 + *hour * 3'600 + *minute * 60 + *second};
}

std::optional<PropertyList::Data> ParseBase64(std::string_view text) {
    PropertyList::Data data;
    data.reserve(text.size() / 4 * 3);
    std::uint32_t bits = 0;
    std::size_t digits = 0;
    std::size_t padding = 0;
    for (const char c : text) {
        const std::uint8_t value = kBase64Values[static_cast<unsigned char>(c)];
        if (value != kNoDigit && padding == 0) {
            bits = bits << 6 | value;
            if (++digits == 4) {
                data.push_back(static_cast<std::byte>(bits >> 16));
                data.push_back(static_cast<std::byte>(bits >> 8));
                data.push_back(static_cast<std::byte>(bits));
                bits = 0;
                digits = 0;
            }
        } else if (c == '=') {
            ++padding;
        } else if (!IsSpace(c)) {
            return std::nullopt;
        }
    }
    return FinishBase64(data, bits, digits, padding) ? std::optional(std::move(data))
                                                     : std::nullopt;
}

std::string FormatReal(double value) {
    if (std::isnan(value)) {
        return "nan";
    }
    if (std::isinf(value)) {
        return value < 0 ? "-infinity" : "+infinity";
    }
    std::array<char, 32> text{};
    const auto end = std::to_chars(text.data(), text.data() + text.size(), value).ptr;
    return {text.data(), end};
}

bool IsCalendarDate(PropertyList::Date value) {
    constexpr std::int64_t kFirst = -63'113'904'000;  // 0001-01-01T00:00:00Z
    constexpr std::int64_t kLast = 252'423'993'599;   // 9999-12-31T23:59:59Z
    return value.seconds >= kFirst && value.seconds <= kLast;
}

std::string FormatDate(PropertyList::Date value) {
    const auto moment = kEpoch + std::chrono::seconds(value.seconds);
    const auto midnight = std::chrono::floor<std::chrono::days>(moment);
    const std::chrono::year_month_day date(midnight);
    const std::chrono::hh_mm_ss time(moment - midnight);
    std::array<char, 64> text{};
    const int length = std::snprintf(text.data(),
                                     text.size(),
                                     "%04d-%02u-%02uT%02d:%02d:%02dZ",
                                     static_cast<int>(date.year()),
                                     static_cast<unsigned>(date.month()),
                                     static_cast<unsigned>(date.day()),
                                     static_cast<int>(time.hours().count()),
                                     static_cast<int>(time.minutes().count()),
                                     static_cast<int>(time.seconds().count()));
    return {text.data(), static_cast<std::size_t>(length)};
}

std::string FormatBase64(std::span<const std::byte> bytes) {
    std::uint32_t group = 0;
    for (std::size_t i = 0; i < 3; ++i) {
        group = group << 8 | (i < bytes.size() ? std::to_integer<std::uint32_t>(bytes[i]) : 0);
    }
    std::string text;
    for (std::size_t i = 0; i < 4; ++i) {
        text += i <= bytes.size() ? kBase64Digits[(group >> (18 - 6 * i)) & 0x3F] : '=';
    }
    return text;
}

}  // namespace platform
