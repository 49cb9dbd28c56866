// A named port that a tool owns in the telephony daemon's place.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

#include "platform/linux/OwnedFd.h"

namespace tools {

/// What arrived: one datagram, without its header.
struct PortMessage {
    int sender = -1;      ///< names the connection for a reply, and never another one
    std::int32_t id = 0;  ///< of the message
    std::vector<std::byte> body{};
};

/// The receiving end of /run/linefold/<name>: everybody may connect, and each datagram is a
/// message, a header of 24 bytes and data behind it. A datagram that is shorter than its header, or
/// whose header lies about its size, ends its connection.
class NamedPort {
public:
    /// None when somebody alive owns the name, or it cannot be had. Held until the process ends.
    [[nodiscard]] static std::optional<NamedPort> own(std::string_view name);

    /// Waits at most so long (-1: for ever) for the next message. None when the time is over or a
    /// signal came. At most 64 connections are served at once; beyond that one of
    /// them makes room.
    [[nodiscard]] std::optional<PortMessage> receive(int timeoutMs);

    /// Sends a message back on the connection that a message came from. False when it is gone.
    bool send(int sender, std::int32_t id, std::span<const std::byte> body) const;

    /// The descriptor that becomes readable when receive would find something, for poll(2).
    [[nodiscard]] int descriptor() const { return events_.get(); }

private:
    NamedPort(platform::OwnedFd listening, platform::OwnedFd events);

    void accept();
    std::optional<PortMessage> read(int sender);

    platform::OwnedFd listening_;
    platform::OwnedFd events_;
    std::map<int, platform::OwnedFd> connections_;  // by number, the oldest first
    int lastNumber_ = 0;
};

}  // namespace tools
