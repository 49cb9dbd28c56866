// The gateway's side of the phone's network: what arrives there, and answers that a test makes up.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/OwnedFd.h"

namespace gateway {

/// An ICMP echo request as it arrived.
struct Packet {
    double time = 0;           ///< of its arrival, in seconds of the clock
    std::uint32_t source = 0;  ///< host byte order
    std::uint32_t destination = 0;
    std::vector<std::byte> message{};  ///< what is behind the IP header
};

/// Collects what arrives on an interface of the gateway, from its making on.
class Capture {
public:
    explicit Capture(const std::string& interface);

    /// All echo requests so far.
    [[nodiscard]] const std::vector<Packet>& packets();

    /// Waits for so many in all, at most 20 s.
    [[nodiscard]] bool has(std::size_t count);

private:
    platform::OwnedFd socket_;
    std::vector<Packet> packets_;
};

/// Sends ICMP messages from the gateway to the phone.
class Responder {
public:
    Responder();

    void send(const Packet& request, std::vector<std::byte> message) const;

private:
    platform::OwnedFd socket_;
};

/// The proper reply to a request.
[[nodiscard]] std::vector<std::byte> ReplyTo(const Packet& request);

/// Puts the right checksum into a message.
void Seal(std::vector<std::byte>& message);

/// Whether the gateway itself answers echo requests.
void SetAnswering(bool isAnswering);

/// Runs a command of the shell, in the phone; throws when it fails.
void Run(const std::string& command);

}  // namespace gateway
