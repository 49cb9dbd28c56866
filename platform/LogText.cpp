#include "platform/LogText.h"

#include <array>
#include <cstddef>
#include <cstdio>

#include "platform/Utf8.h"

namespace platform {
namespace {

constexpr std::string_view kLengthModifiers = "lhzjtL";

/// A printf conversion: from the percent sign through the letter.
struct Conversion {
    std::string text;
    char letter = '\0';
    int longs = 0;
    bool isSize = false;
};

Conversion ReadConversion(const char*& at) {
    Conversion conversion{.text = "%"};
    for (++at; *at != '\0'; ++at) {
        conversion.text += *at;
        conversion.longs += *at == 'l' ? 1 : 0;
        conversion.isSize |= *at == 'z';
        const bool goesOn =
            std::string_view("0123456789.-+ #").find(*at) != std::string_view::npos ||
            kLengthModifiers.find(*at) != std::string_view::npos;
        if (!goesOn) {
            conversion.letter = *at++;
            break;
        }
    }
    return conversion;
}

template <typename T>
std::string Print(const Conversion& conversion, T value) {
    std::array<char, 64> buffer{};
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
#pragma GCC diagnostic ignored "-Wformat-security"
    const int length = std::snprintf(buffer.data(), buffer.size(), conversion.text.c_str(), value);
#pragma GCC diagnostic pop
    return length < 0 ? std::string() : std::string(buffer.data());
}

}  // namespace

std::string EscapeLogArgument(std::string_view text) {
    std::string escaped;
    escaped.reserve(text.size());
    while (!text.empty()) {
        const std::size_t length = Utf8SequenceLength(text);
        const auto lead = static_cast<unsigned char>(text.front());
        if (length == 0 || lead < 0x20 || lead == 0x7F) {
            constexpr std::string_view kDigits = "0123456789abcdef";
            escaped += {'\\', 'x', kDigits[lead >> 4], kDigits[lead & 15]};
            text.remove_prefix(1);
        } else {
            escaped += text.substr(0, length);
            text.remove_prefix(length);
        }
    }
    return escaped;
}

std::string FormatLogText(const char* format, std::va_list arguments) {
    std::string text;
    for (const char* at = format; *at != '\0';) {
        if (*at != '%') {
            text += *at++;
            continue;
        }
        const Conversion conversion = ReadConversion(at);
        switch (conversion.letter) {
            case '%':
                text += '%';
                break;
            case 's': {
                const char* argument = va_arg(arguments, const char*);
                text += EscapeLogArgument(argument == nullptr ? "(null)" : argument);
                break;
            }
            case 'p':
                text += Print(conversion, va_arg(arguments, void*));
                break;
            case 'c':
                text += EscapeLogArgument(Print(conversion, va_arg(arguments, int)));
                break;
            default:
                if (conversion.longs > 0 || conversion.isSize) {
                    static_assert(sizeof(long) == sizeof(long long) &&
                                  sizeof(long) == sizeof(std::size_t));
                    text += Print(conversion, va_arg(arguments, long));
                } else {
                    text += Print(conversion, va_arg(arguments, int));
                }
        }
    }
    return text;
}

}  // namespace platform
