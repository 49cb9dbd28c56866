// A telephony daemon's port that says to each connection what a test tells it to.
#pragma once

#include <atomic>
#include <functional>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/PropertyList.h"
#include "platform/linux/OwnedFd.h"

namespace port {

inline constexpr const char* kPath = "/run/linefold/com.vendra.linefold.server";

/// One message as it came.
struct Message {
    std::int32_t id = 0;
    bool isSizeTrue = false;
    platform::PropertyList body{};
};

/// The daemon's end of one connection.
class PortConnection {
public:
    PortConnection(int socket, const std::atomic<bool>& isStopping)
        : socket_(socket), isStopping_(isStopping) {}

    /// Waits for the next message; one with the id 0 when the other side is gone.
    [[nodiscard]] Message receive() const;

    /// Sends bytes as they are, if wanted with a descriptor beside them. False when the other side
    /// is gone.
    bool sendBytes(std::span<const std::byte> datagram, int descriptor = -1) const;

    bool sendMessage(std::int32_t id, std::string_view xml) const;

    /// The answer to a report.
    bool answer(std::int32_t id, std::int64_t domain, std::int64_t error) const;

    /// Waits until the other side or the server goes.
    void hang() const;

private:
    const int socket_;
    const std::atomic<bool>& isStopping_;
};

/// Bytes of a message with a header in front.
[[nodiscard]] std::vector<std::byte> MessageBytes(std::int32_t id, std::span<const std::byte> body);

/// Owns the port and serves one connection after the other, until it goes.
class PortServer {
public:
    using Script = std::function<void(const PortConnection&)>;

    explicit PortServer(Script script);
    ~PortServer();
    PortServer(const PortServer&) = delete;
    PortServer& operator=(const PortServer&) = delete;

private:
    void serve();

    const Script script_;
    platform::OwnedFd listening_;
    std::atomic<bool> isStopping_ = false;
    std::thread thread_;
};

/// A socket that listens at the port's path, with room for so many connections.
[[nodiscard]] platform::OwnedFd Listen(int backlog);

}  // namespace port
