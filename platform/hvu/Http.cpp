// What both twins share of the HTTP client.
#include "platform/hvu/Http.h"

#include <algorithm>
#include <array>

namespace hvu::Http {
namespace {

struct StatusText {
    int code;
    const char* text;
};

/// RFC 9110, section 15.
constexpr std::array kStatusTexts{
    StatusText{0, "no status"},
    StatusText{100, "continue"},
    StatusText{101, "switching protocols"},
    StatusText{200, "OK"},
    StatusText{201, "created"},
    StatusText{202, "accepted"},
    StatusText{203, "non-authoritative information"},
    StatusText{204, "no content"},
    StatusText{205, "reset content"},
    StatusText{206, "partial content"},
    StatusText{300, "multiple choices"},
    StatusText{301, "moved permanently"},
    StatusText{302, "found"},
    StatusText{303, "see other"},
    StatusText{304, "not modified"},
    StatusText{305, "use proxy"},
    StatusText{307, "temporary redirect"},
    StatusText{308, "permanent redirect"},
    StatusText{400, "bad request"},
    StatusText{401, "unauthorized"},
    StatusText{402, "payment required"},
    StatusText{403, "forbidden"},
    StatusText{404, "not found"},
    StatusText{405, "method not allowed"},
    StatusText{406, "not acceptable"},
    StatusText{407, "proxy authentication required"},
    StatusText{408, "request timeout"},
    StatusText{409, "conflict"},
    StatusText{410, "gone"},
    StatusText{411, "length required"},
    StatusText{412, "precondition failed"},
    StatusText{413, "content too large"},
    StatusText{414, "URI too long"},
    StatusText{415, "unsupported media type"},
    StatusText{416, "range not satisfiable"},
    StatusText{417, "expectation failed"},
    StatusText{421, "misdirected request"},
    StatusText{422, "unprocessable content"},
    StatusText{426, "upgrade required"},
    StatusText{429, "too many requests"},
    StatusText{500, "internal server error"},
    StatusText{501, "not implemented"},
    StatusText{502, "bad gateway"},
    StatusText{503, "service unavailable"},
    StatusText{504, "gateway timeout"},
    StatusText{505, "HTTP version not supported"},
};

/// Header names are ASCII, whatever the locale.
char Lower(char c) {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

}  // namespace

const char* asString(ErrorType error) {
    switch (error) {
        case ErrorType::kNone:
            return "no error";
        case ErrorType::kHostNotFound:
            return "host not found";
        case ErrorType::kCannotConnect:
            return "cannot connect";
        case ErrorType::kCellularForbidden:
            return "cellular network forbidden";
        case ErrorType::kTimedOut:
            return "timed out";
        case ErrorType::kNotTrusted:
            return "server not trusted";
        case ErrorType::kConnectionLost:
            return "connection lost";
        case ErrorType::kRedirectRefused:
            return "redirect refused";
        case ErrorType::kBodyTooLarge:
            return "body too large";
        case ErrorType::kBadAnswer:
            return "bad answer";
        case ErrorType::kBadUrl:
            return "bad URL";
        case ErrorType::kUnknown:
            break;
    }
    return "unknown error";
}

const char* asString(int statusCode) {
    const auto found = std::ranges::find(kStatusTexts, statusCode, &StatusText::code);
    return found == kStatusTexts.end() ? "unknown" : found->text;
}

bool case_insensitive_key_comparer::operator()(std::string_view a, std::string_view b) const {
    // strcasecmp compares bytes as unsigned ones.
    return std::ranges::lexicographical_compare(
        a,
        b,
        {},
        [](char c) { return static_cast<unsigned char>(Lower(c)); },
        [](char c) { return static_cast<unsigned char>(Lower(c)); });
}

std::shared_ptr<HttpSession> HttpSession::create() {
    return std::make_shared<HttpSession>();
}

}  // namespace hvu::Http
