#include "platform/hvu/Url.h"

#include <algorithm>
#include <charconv>

namespace hvu::Http {
namespace {

constexpr std::size_t kUrlMax = 8192;
constexpr unsigned kPortMax = 65535;
constexpr auto kNone = std::string_view::npos;

bool IsUrlCharacter(char c) {
    return c > 0x20 && c < 0x7f;
}

bool IsLetterOrDigit(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
}

/// The text behind a scheme of ours, or none.
std::string_view BehindScheme(std::string_view url) {
    for (const std::string_view scheme : {"http://", "https://"}) {
        // Setting this bit makes capital letters small and leaves ":" and "/" as they are.
        const auto isSame = [](char have, char wanted) { return (have | 0x20) == wanted; };
        if (url.size() > scheme.size() &&
            std::ranges::equal(url.substr(0, scheme.size()), scheme, isSame)) {
            return url.substr(scheme.size());
        }
    }
    return {};
}

/// An empty port stands for the usual one.
bool IsPort(std::string_view text) {
    unsigned port = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), port);
    return text.empty() || (error == std::errc() && end == text.data() + text.size() && port > 0 &&
                            port <= kPortMax);
}

/// A name, or an IPv4 address.
bool IsHostName(std::string_view host) {
    return !host.empty() && std::ranges::all_of(host, [](char c) {
        return IsLetterOrDigit(c) || std::string_view("-._~%").find(c) != kNone;
    });
}

/// An IPv6 address, with its zone if it has one, in brackets.
bool IsAddress(std::string_view host) {
    return host.size() > 2 && std::ranges::all_of(host.substr(1), [](char c) {
               return IsLetterOrDigit(c) || std::string_view(":.%-_~").find(c) != kNone;
           });
}

bool IsHostAndPort(std::string_view text) {
    if (text.starts_with('[')) {
        const auto bracket = text.find(']');
        return bracket != kNone && IsAddress(text.substr(0, bracket)) &&
               (bracket + 1 == text.size() ||
                (text[bracket + 1] == ':' && IsPort(text.substr(bracket + 2))));
    }
    const auto colon = text.find(':');
    return IsHostName(text.substr(0, colon)) && (colon == kNone || IsPort(text.substr(colon + 1)));
}

}  // namespace

bool IsUsableUrl(std::string_view url) {
    if (url.size() > kUrlMax || !std::ranges::all_of(url, IsUrlCharacter)) {
        return false;
    }
    const auto rest = BehindScheme(url);
    const auto authority = rest.substr(0, rest.find_first_of("/?#\\"));
    const auto user = authority.rfind('@');
    return IsHostAndPort(user == kNone ? authority : authority.substr(user + 1));
}

}  // namespace hvu::Http
