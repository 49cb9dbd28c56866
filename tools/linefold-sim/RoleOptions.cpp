#include "tools/linefold-sim/RoleOptions.h"

#include <netdb.h>
#include <poll.h>
#include <sys/signalfd.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <memory>

namespace simulator {
namespace {

using platform::OwnedFd;

struct FreeAddresses {
    void operator()(addrinfo* list) const { freeaddrinfo(list); }
};

/// The resolver takes larger numbers, too, and cuts them.
bool IsPort(const std::string& text) {
    std::uint16_t number = 0;
    const char* const end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, number);
    return error == std::errc{} && rest == end;
}

using AddressList = std::unique_ptr<addrinfo, FreeAddresses>;

/// Null for what is no place.
AddressList AddressOf(const std::string& place) {
    const auto colon = place.rfind(':');
    std::string host = place.substr(0, colon);
    if (host.starts_with('[') && host.ends_with(']')) {
        host = host.substr(1, host.size() - 2);
    }
    addrinfo hints{};
    hints.ai_flags = AI_NUMERICHOST | AI_NUMERICSERV;
    hints.ai_socktype = SOCK_STREAM;
    addrinfo* list = nullptr;
    const std::string port = colon == std::string::npos ? "" : place.substr(colon + 1);
    const bool isPlace = !host.empty() && IsPort(port) &&
                         getaddrinfo(host.c_str(), port.c_str(), &hints, &list) == 0;
    return AddressList(isPlace ? list : nullptr);
}

}  // namespace

int Complain(std::string_view role, const std::string& why, int status) {
    const std::string name(role);
    (void)std::fprintf(stderr, "linefold-sim %s: %s\n", name.c_str(), why.c_str());
    if (status == kUsage) {
        (void)std::fprintf(stderr, "Try: linefold-sim %s --help\n", name.c_str());
    }
    return status;
}

std::optional<RoleOptions> RoleOptions::parse(std::string_view role,
                                              std::span<const std::string_view> words,
                                              std::span<const KnownOption> known) {
    RoleOptions options(role);
    for (std::size_t i = 0; i < words.size(); ++i) {
        const auto option = std::ranges::find(known, words[i], &KnownOption::name);
        const std::string word(words[i]);
        if (option == known.end()) {
            (void)Complain(role, "there is no option " + word, kUsage);
            return std::nullopt;
        }
        const bool takesValue = option->takes == KnownOption::Takes::kValue;
        if (takesValue && i + 1 == words.size()) {
            (void)Complain(role, "the option " + word + " needs a value", kUsage);
            return std::nullopt;
        }
        options.given_.emplace_back(word, takesValue ? words[++i] : std::string_view());
    }
    return options;
}

const std::string* RoleOptions::find(std::string_view name) const {
    const auto found = std::ranges::find(given_, name, &std::pair<std::string, std::string>::first);
    return found == given_.end() ? nullptr : &found->second;
}

std::string RoleOptions::value(std::string_view name, std::string_view otherwise) const {
    const std::string* const text = find(name);
    return text == nullptr ? std::string(otherwise) : *text;
}

std::optional<double> RoleOptions::number(std::string_view name,
                                          double otherwise,
                                          double least) const {
    const std::string* const text = find(name);
    if (text == nullptr) {
        return otherwise;
    }
    double number = 0;
    const char* const end = text->data() + text->size();
    const auto [rest, error] = std::from_chars(text->data(), end, number);
    constexpr double kMost = 2147483647;
    if (error != std::errc{} || rest != end || !(number >= least && number <= kMost)) {
        (void)Complain(role_, "cannot use " + std::string(name) + " " + *text, kUsage);
        return std::nullopt;
    }
    return number;
}

std::optional<std::string> RoleOptions::place(std::string_view name,
                                              std::string_view otherwise) const {
    const std::string place = value(name, otherwise);
    if (AddressOf(place) == nullptr) {
        (void)Complain(role_, place + " is not ADDRESS:PORT", kUsage);
        return std::nullopt;
    }
    return place;
}

Termination::Termination() {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    (void)sigprocmask(SIG_BLOCK, &signals, nullptr);
    signals_.reset(signalfd(-1, &signals, SFD_CLOEXEC));
}

void Termination::await() const {
    pollfd state{.fd = descriptor(), .events = POLLIN, .revents = 0};
    while (poll(&state, 1, -1) != 1) {
    }
}

OwnedFd SocketAt(std::string_view role, const std::string& place, int kind) {
    const AddressList address = AddressOf(place);
    OwnedFd made(socket(address->ai_family, kind | SOCK_CLOEXEC, 0));
    const int yes = 1;
    if (!made.isOpen() || setsockopt(made.get(), SOL_SOCKET, SO_REUSEADDR, &yes, sizeof yes) != 0 ||
        bind(made.get(), address->ai_addr, address->ai_addrlen) != 0 ||
        (kind == SOCK_STREAM && listen(made.get(), SOMAXCONN) != 0)) {
        (void)Complain(role, place + " cannot be had: " + std::strerror(errno));
        return {};
    }
    return made;
}

}  // namespace simulator
