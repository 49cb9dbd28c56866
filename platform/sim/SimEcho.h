// The simulated network of the echo socket: interfaces, names, and the gateway that answers.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/EchoSocket.h"

namespace sim {

/// A message as it left the phone.
struct SentEcho {
    double time = 0;
    std::vector<std::byte> bytes{};
    platform::HostAddress destination{};
    std::string boundTo{};  ///< the interface, empty for whatever the routes say
};

/// A datagram on its way back: an IPv4 header, then an ICMP message.
struct EchoAnswer {
    double delay = 0;
    std::vector<std::byte> datagram{};
};

using EchoGateway = std::function<std::vector<EchoAnswer>(const SentEcho& request)>;

/// From now on requests are answered so. In a new world each gets its reply after 50 ms.
void SetEchoGateway(EchoGateway gateway);

/// The proper reply to a request.
[[nodiscard]] std::vector<std::byte> EchoReplyTo(const SentEcho& request);

[[nodiscard]] const std::vector<SentEcho>& SentEchoes();

/// A new world has the interface pdp_ip0 alone.
void SetInterface(std::string_view name, bool isThere);

/// A new world knows no names.
void SetHost(std::string_view name, const platform::HostAddress& address);

/// Another process has this identifier.
void HoldEchoIdentifier(std::uint16_t identifier);

/// What LastSystemError tells of calls that are made to fail; 5 in a new world.
void SetSystemError(std::int32_t error);

/// Of each message only so many bytes go out.
void CutEchoesSent(std::size_t bytes);

/// Somebody sets the clock, forwards or back.
void ShiftTimeOfDay(double seconds);

/// Echo sockets that the daemon has open.
[[nodiscard]] std::size_t OpenEchoSockets();

}  // namespace sim
