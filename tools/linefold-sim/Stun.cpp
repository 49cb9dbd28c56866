#include "tools/linefold-sim/Stun.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "tools/linefold-sim/RoleOptions.h"

namespace simulator {
namespace {

using platform::OwnedFd;
using Takes = KnownOption::Takes;
using Bytes = std::vector<std::uint8_t>;

constexpr std::string_view kRole = "stun";
constexpr std::size_t kHeaderSize = 20;
constexpr std::uint32_t kCookie = 0x2112A442;

struct Settings {
    std::string place;
    std::string claim;
    std::chrono::duration<double> delay{};
    int skip = 0;
    int error = 0;
    bool isPlain = false;
    bool isSilent = false;
    bool isGarbage = false;
    bool isOtherTransaction = false;
    bool isOtherPort = false;
};

std::optional<Settings> Parse(std::span<const std::string_view> words) {
    constexpr std::array<KnownOption, 10> kKnown{{{"--listen"},
                                                  {"--claim"},
                                                  {"--plain", Takes::kNothing},
                                                  {"--error"},
                                                  {"--delay"},
                                                  {"--skip"},
                                                  {"--silent", Takes::kNothing},
                                                  {"--garbage", Takes::kNothing},
                                                  {"--other-transaction", Takes::kNothing},
                                                  {"--other-port", Takes::kNothing}}};
    const auto options = RoleOptions::parse(kRole, words, kKnown);
    if (!options) {
        return std::nullopt;
    }
    const auto delay = options->number("--delay", 0, 0);
    const auto place = options->place("--listen", "198.51.100.1:3478");
    const auto skip = options->number("--skip", 0, 0);
    const auto error = options->number("--error", 0, 300);
    if (!delay || !place || !skip || !error) {
        return std::nullopt;
    }
    const std::string claim = options->value("--claim", "");
    std::array<std::uint8_t, 16> address{};
    if (!claim.empty() && inet_pton(AF_INET, claim.c_str(), address.data()) != 1 &&
        inet_pton(AF_INET6, claim.c_str(), address.data()) != 1) {
        (void)Complain(kRole, claim + " is no address", kUsage);
        return std::nullopt;
    }
    return Settings{.place = *place,
                    .claim = claim,
                    .delay = std::chrono::duration<double>(*delay),
                    .skip = static_cast<int>(*skip),
                    .error = static_cast<int>(*error),
                    .isPlain = options->has("--plain"),
                    .isSilent = options->has("--silent"),
                    .isGarbage = options->has("--garbage"),
                    .isOtherTransaction = options->has("--other-transaction"),
                    .isOtherPort = options->has("--other-port")};
}

void Put16(Bytes& bytes, unsigned number) {
    bytes.push_back(static_cast<std::uint8_t>(number >> 8));
    bytes.push_back(static_cast<std::uint8_t>(number));
}

struct Peer {
    sockaddr_storage address{};
    socklen_t size = sizeof address;

    [[nodiscard]] const sockaddr* get() const {
        return reinterpret_cast<const sockaddr*>(&address);
    }

    [[nodiscard]] unsigned port() const {
        return ntohs(reinterpret_cast<const sockaddr_in*>(&address)->sin_port);
    }

    /// In network byte order, 4 or 16 bytes.
    [[nodiscard]] Bytes host() const {
        const auto* const ipv4 = &reinterpret_cast<const sockaddr_in*>(&address)->sin_addr;
        const auto* const ipv6 = &reinterpret_cast<const sockaddr_in6*>(&address)->sin6_addr;
        const bool isIPv4 = address.ss_family == AF_INET;
        Bytes bytes(isIPv4 ? sizeof *ipv4 : sizeof *ipv6);
        std::memcpy(bytes.data(), isIPv4 ? static_cast<const void*>(ipv4) : ipv6, bytes.size());
        return bytes;
    }
};

Bytes ClaimedHost(const std::string& claim) {
    Bytes bytes(claim.find(':') == std::string::npos ? 4 : 16);
    (void)inet_pton(bytes.size() == 4 ? AF_INET : AF_INET6, claim.c_str(), bytes.data());
    return bytes;
}

/// The attribute that tells an address; `mask` is the cookie and the transaction of the request.
Bytes AddressAttribute(Bytes host,
                       unsigned port,
                       std::span<const std::uint8_t> mask,
                       bool isPlain) {
    if (!isPlain) {
        port ^= kCookie >> 16;
        for (std::size_t i = 0; i < host.size(); ++i) {
            host[i] = static_cast<std::uint8_t>(host[i] ^ mask[i]);
        }
    }
    Bytes attribute;
    Put16(attribute, isPlain ? 0x0001 : 0x0020);
    Put16(attribute, static_cast<unsigned>(4 + host.size()));
    Put16(attribute, host.size() == 4 ? 1 : 2);
    Put16(attribute, port);
    attribute.insert(attribute.end(), host.begin(), host.end());
    return attribute;
}

Bytes ErrorAttribute(int error) {
    Bytes attribute{0x00, 0x09, 0x00, 0x08, 0x00, 0x00};
    attribute.push_back(static_cast<std::uint8_t>(error / 100));
    attribute.push_back(static_cast<std::uint8_t>(error % 100));
    attribute.insert(attribute.end(), {'N', 'o', 'p', 'e'});
    return attribute;
}

Bytes Response(std::span<const std::uint8_t> request, const Peer& peer, const Settings& settings) {
    if (settings.isGarbage) {
        return Bytes(64, 0xA5);
    }
    const auto mask = request.subspan(4, 16);
    const Bytes attribute =
        settings.error != 0
            ? ErrorAttribute(settings.error)
            : AddressAttribute(settings.claim.empty() ? peer.host() : ClaimedHost(settings.claim),
                               peer.port(),
                               mask,
                               settings.isPlain);
    Bytes response;
    Put16(response, settings.error != 0 ? 0x0111 : 0x0101);
    Put16(response, static_cast<unsigned>(attribute.size()));
    response.insert(response.end(), mask.begin(), mask.end());
    response.back() ^= settings.isOtherTransaction ? 1 : 0;
    response.insert(response.end(), attribute.begin(), attribute.end());
    return response;
}

bool IsBindingRequest(std::span<const std::uint8_t> datagram) {
    constexpr std::array<std::uint8_t, 2> kBindingRequest{0x00, 0x01};
    constexpr std::array<std::uint8_t, 4> kCookieBytes{0x21, 0x12, 0xA4, 0x42};
    return datagram.size() >= kHeaderSize &&
           std::ranges::equal(datagram.first(2), kBindingRequest) &&
           std::ranges::equal(datagram.subspan(4, 4), kCookieBytes);
}

/// A socket beside the one that listens, for answers from somewhere else.
OwnedFd OtherSocket(const OwnedFd& listening) {
    Peer own;
    (void)getsockname(listening.get(), reinterpret_cast<sockaddr*>(&own.address), &own.size);
    reinterpret_cast<sockaddr_in*>(&own.address)->sin_port = 0;
    OwnedFd other(socket(own.address.ss_family, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    (void)bind(other.get(), own.get(), own.size);
    return other;
}

void Play(const OwnedFd& listening, Settings settings, const Termination& termination) {
    const OwnedFd other = OtherSocket(listening);
    std::array<pollfd, 2> states{{{.fd = termination.descriptor(), .events = POLLIN, .revents = 0},
                                  {.fd = listening.get(), .events = POLLIN, .revents = 0}}};
    while (states[0].revents == 0) {
        (void)poll(states.data(), states.size(), -1);
        if (states[1].revents == 0) {
            continue;
        }
        std::array<std::uint8_t, 1500> datagram;
        Peer peer;
        const ssize_t size = recvfrom(listening.get(),
                                      datagram.data(),
                                      datagram.size(),
                                      MSG_DONTWAIT,
                                      reinterpret_cast<sockaddr*>(&peer.address),
                                      &peer.size);
        const auto request =
            std::span(datagram).first(static_cast<std::size_t>(std::max<ssize_t>(size, 0)));
        if (!IsBindingRequest(request)) {
            continue;
        }
        (void)std::fprintf(stdout, "binding request\n");
        if (settings.isSilent || settings.skip-- > 0) {
            continue;
        }
        std::this_thread::sleep_for(settings.delay);
        const Bytes response = Response(request, peer, settings);
        (void)sendto(settings.isOtherPort ? other.get() : listening.get(),
                     response.data(),
                     response.size(),
                     0,
                     peer.get(),
                     peer.size);
    }
}

}  // namespace

int PlayStun(std::span<const std::string_view> words) {
    const auto settings = Parse(words);
    if (!settings) {
        return kUsage;
    }
    const Termination termination;
    const OwnedFd listening = SocketAt(kRole, settings->place, SOCK_DGRAM);
    if (!listening.isOpen()) {
        return kCannotPlay;
    }
    (void)std::fprintf(stdout, "ready\n");
    Play(listening, *settings, termination);
    return 0;
}

}  // namespace simulator
