// STUN binding messages (RFC 8489), as far as a client needs them that asks for its own address.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>

namespace platform {

inline constexpr std::size_t kStunHeaderSize = 20;

/// 96 random bits that a response repeats.
using StunTransaction = std::array<std::byte, 12>;

using StunRequest = std::array<std::byte, kStunHeaderSize>;

[[nodiscard]] StunRequest StunBindingRequest(const StunTransaction& transaction);

/// What a datagram means to one who waits for the response to a transaction.
struct StunResponse {
    enum class Kind : std::uint8_t {
        kNone,     ///< not the response: wait on
        kAddress,  ///< `text` is the address under which the server saw the request
        kError,    ///< the transaction has failed, and `text` tells why
    };

    Kind kind = Kind::kNone;
    std::string text{};
};

/// Takes the address from XOR-MAPPED-ADDRESS, or, of a server that has none, from MAPPED-ADDRESS.
[[nodiscard]] StunResponse ReadStunResponse(std::span<const std::byte> datagram,
                                            const StunTransaction& transaction);

}  // namespace platform
