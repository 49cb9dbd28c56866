// Messages to a port that another process owns by name.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

namespace platform {

/// Sends one message without waiting, and without asking for an answer: the 24 bytes of a header
/// that carries `messageId`, and the data behind it. Each message has a connection of its own,
/// which ends with it.
///
/// False, and nothing was sent, when nobody owns the port, or its owner takes no more for now or no
/// message of that size. Nothing is logged: who sends does not depend on somebody being there.
[[nodiscard]] bool MessagePortSendRequest(std::string_view portName,
                                          std::int32_t messageId,
                                          std::span<const std::byte> data);

}  // namespace platform
