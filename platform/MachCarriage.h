// The carriage of messages: how a datagram becomes a message, under the same rules for every twin.
//
// The verdict about a request is reached in this order: the stub's own checks, then what the
// carriage found wrong with what came beside the bytes, then the handler.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

#include "platform/MachMessage.h"

namespace platform {

/// The largest request that any routine takes.
inline constexpr std::size_t kMaxRequestSize = 3104;

/// A receive buffer: the largest request, the data behind it, and the trailer.
inline constexpr std::size_t kReceiveCapacity = kMaxRequestSize + kMaxInlineData;
inline constexpr std::size_t kReceiveBufferSize =
    kReceiveCapacity + sizeof(MachMsgAuditTrailer) + 4;

struct MessageOrigin {
    mach_port_t localPort = MACH_PORT_NULL;
    mach_port_t replyRoute = MACH_PORT_NULL;
    std::uint32_t sequenceNumber = 0;
    const AuditToken* sender = &kUnknownSender;
};

/// Turns the datagram at the start of `buffer` (kReceiveBufferSize bytes) into a message. `arrived`
/// is the full length of the datagram, at least a header, also when it was cut to kReceiveCapacity.
///
/// The size in the header stands only if message plus announced data is exactly what arrived;
/// otherwise it becomes the number of bytes that arrived, and the size check refuses it. Names and
/// addresses that the sender wrote are overwritten. The trailer is put behind the message.
[[nodiscard]] ReceivedMessage MakeReceivedMessage(std::span<std::byte> buffer,
                                                  std::size_t arrived,
                                                  DescriptorArrival arrival,
                                                  int descriptor,
                                                  const MessageOrigin& origin);

// What a twin brings to MachMessageAccept.

/// Gives the descriptor a name as a send right; the name owns it on success.
[[nodiscard]] kern_return_t AdoptPortDescriptor(int descriptor, mach_port_t* name);

/// Fills `into` from a memory object that nobody can change any more; the descriptor stays with
/// the caller. MIG_BAD_ARGUMENTS when it is something else, not sealed, or too short.
[[nodiscard]] kern_return_t ReadMemoryDescriptor(int descriptor, std::span<std::byte> into);

}  // namespace platform
