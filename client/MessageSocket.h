// Messages over a connected seqpacket socket, each one datagram with at most one descriptor.
#pragma once

#include <sys/un.h>

#include <cstddef>
#include <cstdint>
#include <span>

#include "client/Descriptor.h"

namespace linefold_client {

enum class ConnectResult : std::uint8_t {
    kConnected,
    kNoService,     ///< nothing has the name
    kRefused,       ///< the name is there and nobody takes connections: trying again may help
    kNotAService,   ///< something else has the name
    kNoPermission,  ///< not for this process
    kNoResources,
};

/// Connects to the socket at `address`, waiting while its queue is full.
[[nodiscard]] ConnectResult ConnectToService(const sockaddr_un& address, Descriptor& connection);

struct OutgoingMessage {
    std::span<const std::byte> message{};
    /// Data that rides behind the message.
    std::span<const std::byte> behind{};
    /// Lent for the call; -1 for none.
    int descriptor = -1;
};

enum class SendResult : std::uint8_t {
    kSent,
    kPeerGone,  ///< the message was not delivered, and none will be
    kTooLarge,  ///< for the socket's buffer
    kNoResources,
};

/// Waits until the peer has room. Only a message that was sent is delivered.
[[nodiscard]] SendResult SendMessage(int connection, const OutgoingMessage& outgoing);

enum class Arrival : std::uint8_t {
    kNothingBeside,
    kOneDescriptor,
    kSurplusDescriptors,  ///< more than one, of which none is kept
    kTableFull,           ///< one was sent, and this process had no room for it
};

struct IncomingMessage {
    /// The full length, which is more than the buffer's when the message was cut.
    std::size_t size = 0;
    Arrival arrival = Arrival::kNothingBeside;
    Descriptor descriptor;
};

enum class ReceiveResult : std::uint8_t { kReceived, kPeerGone, kNoResources };

/// Waits for a message.
[[nodiscard]] ReceiveResult ReceiveMessage(int connection,
                                           std::span<std::byte> buffer,
                                           IncomingMessage& incoming);

/// True for an end of a seqpacket pair; a listening socket or anything else is none.
[[nodiscard]] bool IsMessageSocket(int descriptor);

/// A descriptor keeps the mode that its maker gave it: makes calls on this one wait.
[[nodiscard]] bool MakeBlocking(int descriptor);

}  // namespace linefold_client
