#include "tools/lfhelper/doctor/ServerAddress.h"

#include <algorithm>
#include <charconv>
#include <cstdint>
#include <system_error>

namespace lfhelper::doctor {
namespace {

bool IsPort(std::string_view text) {
    std::uint16_t port = 0;
    const char* const end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, port);
    return error == std::errc{} && rest == end && port != 0;
}

bool IsHost(std::string_view text) {
    return !text.empty() && std::ranges::all_of(text, [](char character) {
        const bool isLetter =
            (character >= 'a' && character <= 'z') || (character >= 'A' && character <= 'Z');
        const bool isDigit = character >= '0' && character <= '9';
        return isLetter || isDigit || character == '-' || character == '.' || character == '_';
    });
}

bool IsBracketed(std::string_view text) {
    return text.size() > 2 && text.starts_with('[') && text.ends_with(']') &&
           text.substr(1, text.size() - 2).find_first_not_of("0123456789abcdefABCDEF:.%") ==
               std::string_view::npos;
}

}  // namespace

bool IsHostAndPort(std::string_view text) {
    // The colon behind the brackets, or the only one.
    const std::size_t bracket = text.rfind(']');
    const std::size_t colon = text.find(':', bracket == std::string_view::npos ? 0 : bracket);
    const std::string_view host = text.substr(0, colon);
    return (IsHost(host) || IsBracketed(host)) &&
           (colon == std::string_view::npos || IsPort(text.substr(colon + 1)));
}

bool IsHttpUrl(std::string_view text) {
    for (const std::string_view scheme : {"http://", "https://"}) {
        if (text.starts_with(scheme)) {
            const std::string_view rest = text.substr(scheme.size());
            const std::string_view host = rest.substr(0, rest.find_first_of("/?#"));
            // A name and a password may stand in front of the host.
            return IsHostAndPort(host.substr(host.rfind('@') + 1)) &&
                   std::ranges::none_of(text, [](char character) {
                       return static_cast<unsigned char>(character) <= ' ' || character == '\x7F';
                   });
        }
    }
    return false;
}

}  // namespace lfhelper::doctor
