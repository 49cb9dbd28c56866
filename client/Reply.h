// Replies, believed only after every part of them has been checked.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

#include "Helper/Shared/Server/MessageLayouts.h"
#include "client/MessageSocket.h"

namespace linefold_client {

/// Holds the largest reply and the data behind it.
inline constexpr std::size_t kReplyBufferSize = platform::kMaxReplySize + platform::kMaxInlineData;

struct Reply {
    std::int32_t returnCode = 0;
    /// The inline out value of a success.
    std::span<const std::byte> value;
    /// Bytes of out-of-line data, which lie in `inlineData` or, with a descriptor, in its file.
    std::uint32_t dataSize = 0;
    std::span<const std::byte> inlineData;
};

/// Takes a reply apart. Answers 0, INVALID_REPLY, or NO_RESOURCES when its descriptor had no room
/// here. The spans lie in `buffer`.
[[nodiscard]] std::int32_t ParseReply(const RoutineLayout& layout,
                                      std::span<const std::byte> buffer,
                                      const IncomingMessage& incoming,
                                      Reply& reply);

/// The same for the check-in; on success with return code 0 the descriptor is the private port.
[[nodiscard]] std::int32_t ParseCheckInReply(std::span<const std::byte> buffer,
                                             const IncomingMessage& incoming,
                                             std::int32_t& returnCode);

}  // namespace linefold_client
