// A STUN server that answers each request as a test tells it to, by bytes of the test's own.
#pragma once

#include <netinet/in.h>
#include <sys/socket.h>

#include <atomic>
#include <cstdint>
#include <functional>
#include <initializer_list>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/linux/OwnedFd.h"

namespace stun {

using Bytes = std::vector<std::uint8_t>;

/// One request that has come.
class Request {
public:
    Request(Bytes datagram, int socket, const sockaddr_storage& peer, socklen_t peerSize)
        : datagram_(std::move(datagram)), socket_(socket), peer_(peer), peerSize_(peerSize) {}

    [[nodiscard]] const Bytes& datagram() const { return datagram_; }

    /// Sends from the address that was asked, or from another port.
    void send(const Bytes& answer) const;
    void sendFromElsewhere(const Bytes& answer) const;

    /// A response with these attributes, to this request.
    [[nodiscard]] Bytes response(const Bytes& attributes, unsigned type = 0x0101) const;

    /// One that tells 192.0.2.<last>, in an XOR-MAPPED-ADDRESS.
    [[nodiscard]] Bytes success(std::uint8_t last) const;

private:
    const Bytes datagram_;
    const int socket_;
    const sockaddr_storage peer_;
    const socklen_t peerSize_;
};

/// An attribute: its type, its length, the value, and what fills it up.
[[nodiscard]] Bytes Attribute(unsigned type, const Bytes& value);

class Server {
public:
    /// `count` is 1 for the first request.
    using Script = std::function<void(const Request& request, int count)>;

    explicit Server(Script script, std::string_view address = "127.0.0.1");
    ~Server();
    Server(const Server&) = delete;
    Server& operator=(const Server&) = delete;

    [[nodiscard]] const std::string& port() const { return port_; }

    [[nodiscard]] int requests() const { return requests_; }

private:
    void serve();

    const Script script_;
    platform::OwnedFd socket_;
    std::string port_;
    std::atomic<int> requests_ = 0;
    std::atomic<bool> isStopping_ = false;
    std::thread thread_;
};

}  // namespace stun
