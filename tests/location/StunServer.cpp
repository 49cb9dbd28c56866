#include "tests/location/StunServer.h"

#include <arpa/inet.h>
#include <poll.h>

#include <algorithm>
#include <array>

namespace stun {
namespace {

using platform::OwnedFd;

constexpr int kTickMs = 10;

sockaddr_in6 LocalAddress(std::string_view address) {
    sockaddr_in6 local{};
    const std::string text(address);
    auto* const ipv4 = reinterpret_cast<sockaddr_in*>(&local);
    if (inet_pton(AF_INET, text.c_str(), &ipv4->sin_addr) == 1) {
        ipv4->sin_family = AF_INET;
    } else {
        local = {};
        local.sin6_family = AF_INET6;
        (void)inet_pton(AF_INET6, text.c_str(), &local.sin6_addr);
    }
    return local;
}

OwnedFd SocketAt(const sockaddr_in6& local) {
    OwnedFd made(socket(local.sin6_family, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    (void)bind(made.get(), reinterpret_cast<const sockaddr*>(&local), sizeof local);
    return made;
}

}  // namespace

void Request::send(const Bytes& answer) const {
    (void)sendto(socket_,
                 answer.data(),
                 answer.size(),
                 0,
                 reinterpret_cast<const sockaddr*>(&peer_),
                 peerSize_);
}

void Request::sendFromElsewhere(const Bytes& answer) const {
    sockaddr_in6 local{};
    local.sin6_family = peer_.ss_family;
    const OwnedFd other = SocketAt(local);
    (void)sendto(other.get(),
                 answer.data(),
                 answer.size(),
                 0,
                 reinterpret_cast<const sockaddr*>(&peer_),
                 peerSize_);
}

Bytes Request::response(const Bytes& attributes, unsigned type) const {
    Bytes bytes{static_cast<std::uint8_t>(type >> 8),
                static_cast<std::uint8_t>(type),
                static_cast<std::uint8_t>(attributes.size() >> 8),
                static_cast<std::uint8_t>(attributes.size())};
    bytes.insert(bytes.end(), datagram_.begin() + 4, datagram_.begin() + 20);
    bytes.insert(bytes.end(), attributes.begin(), attributes.end());
    return bytes;
}

Bytes Request::success(std::uint8_t last) const {
    const std::uint8_t masked = last ^ 0x42;
    return response(Attribute(0x0020, {0x00, 0x01, 0xA1, 0x47, 0xE1, 0x12, 0xA6, masked}));
}

Bytes Attribute(unsigned type, const Bytes& value) {
    Bytes bytes{static_cast<std::uint8_t>(type >> 8),
                static_cast<std::uint8_t>(type),
                static_cast<std::uint8_t>(value.size() >> 8),
                static_cast<std::uint8_t>(value.size())};
    bytes.insert(bytes.end(), value.begin(), value.end());
    bytes.resize((bytes.size() + 3) / 4 * 4);
    return bytes;
}

Server::Server(Script script, std::string_view address) : script_(std::move(script)) {
    socket_ = SocketAt(LocalAddress(address));
    sockaddr_in6 bound{};
    socklen_t size = sizeof bound;
    (void)getsockname(socket_.get(), reinterpret_cast<sockaddr*>(&bound), &size);
    port_ = std::to_string(ntohs(bound.sin6_port));
    thread_ = std::thread([this] { serve(); });
}

Server::~Server() {
    isStopping_ = true;
    thread_.join();
}

void Server::serve() {
    while (!isStopping_) {
        pollfd state{.fd = socket_.get(), .events = POLLIN, .revents = 0};
        if (poll(&state, 1, kTickMs) != 1) {
            continue;
        }
        Bytes datagram(1500);
        sockaddr_storage peer{};
        socklen_t peerSize = sizeof peer;
        const ssize_t size = recvfrom(socket_.get(),
                                      datagram.data(),
                                      datagram.size(),
                                      0,
                                      reinterpret_cast<sockaddr*>(&peer),
                                      &peerSize);
        if (size >= 20) {
            datagram.resize(static_cast<std::size_t>(size));
            ++requests_;
            script_(Request(datagram, socket_.get(), peer, peerSize), requests_);
        }
    }
}

}  // namespace stun
