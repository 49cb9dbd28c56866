// One ICMP echo request over the cellular interface, and the wait for its reply.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>
#include <system_error>

#include "platform/EchoSocket.h"

inline constexpr std::size_t kEchoRequestSize = 48;

using EchoRequestBytes = std::array<std::byte, kEchoRequestSize>;

/// Sends one request to the host, a dotted IPv4 address or a name, and waits up to about two
/// seconds for the first reply to it. Blocks; on the heartbeat queue alone.
///
/// No error: a reply came. Else, in the generic category, EINVAL: the host is no text;
/// EHOSTUNREACH: it has no address; EPFNOSUPPORT: there is no protocol "icmp"; 1: no socket opens;
/// ETIMEDOUT: no reply came; or what the system said of the time-out, the clock or the sending, in
/// place of which 1 stands when it said nothing.
[[nodiscard]] std::error_code SendEchoProbe(std::string_view host);

/// The request. The identifier, in host byte order, goes out in network order.
[[nodiscard]] EchoRequestBytes MakeEchoRequest(std::uint16_t identifier,
                                               const platform::TimeOfDay& now);

/// Whether a datagram that begins with its IPv4 header is a reply to a request of that identifier,
/// and no shorter than one. Sequence number, checksum and payload are not looked at.
[[nodiscard]] bool IsEchoReply(std::span<const std::byte> datagram, std::uint16_t identifier);

/// The Internet checksum (RFC 1071) of the bytes, whose number is even, ready to be stored in host
/// byte order. 0 over bytes that hold their own right checksum.
[[nodiscard]] std::uint16_t InternetChecksum(std::span<const std::byte> bytes);
