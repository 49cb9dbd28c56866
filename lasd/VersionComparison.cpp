#include "lasd/VersionComparison.h"

#include <algorithm>
#include <cstddef>

namespace {

bool IsDigit(char c) {
    return c >= '0' && c <= '9';
}

unsigned char Fold(char c) {
    return static_cast<unsigned char>(c >= 'A' && c <= 'Z' ? c - 'A' + 'a' : c);
}

/// Takes the digits off the start of a text; zeros in front of them mean nothing.
std::string_view TakeNumber(std::string_view& text) {
    const auto end = std::min(text.find_first_not_of("0123456789"), text.size());
    auto number = text.substr(0, end);
    text.remove_prefix(end);
    number.remove_prefix(std::min(number.find_first_not_of('0'), number.size()));
    return number;
}

std::weak_ordering CompareNumbers(std::string_view a, std::string_view b) {
    return a.size() != b.size() ? a.size() <=> b.size() : a <=> b;
}

}  // namespace

std::weak_ordering CompareVersions(std::string_view a, std::string_view b) {
    while (!a.empty() && !b.empty()) {
        std::weak_ordering order = std::weak_ordering::equivalent;
        if (IsDigit(a.front()) && IsDigit(b.front())) {
            const auto number = TakeNumber(a);
            order = CompareNumbers(number, TakeNumber(b));
        } else {
            // Where only one of them is a digit its value does not matter: other bytes come before
            // all digits or behind all of them.
            order = Fold(a.front()) <=> Fold(b.front());
            a.remove_prefix(1);
            b.remove_prefix(1);
        }
        if (order != 0) {
            return order;
        }
    }
    return a.size() <=> b.size();
}
