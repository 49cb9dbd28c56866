// The bare calls that benchmarks make: one datagram out, one datagram in, nothing between.
#pragma once

#include <span>

#include "platform/linux/OwnedFd.h"
#include "tests/support/PhoneRoot.h"

namespace bench {

inline constexpr std::size_t kRequestSize = 288;
inline constexpr std::size_t kReplySize = 36;

/// A request that its stub refuses when it has looked at it (no routine of this size may be
/// complex): what is measured is the carriage and the dispatch, not what a handler does.
[[nodiscard]] phone::Bytes RefusedRequest();

/// Blocking; anything but success throws.
void Send(int socket, std::span<const std::byte> datagram);
void Receive(int socket, std::size_t expectedSize);

/// Sends with a descriptor beside it.
void SendWithDescriptor(int socket, std::span<const std::byte> datagram, int descriptor);
/// Receives a datagram of at least `smallest` bytes; the descriptor is closed when none came.
[[nodiscard]] platform::OwnedFd ReceiveWithDescriptor(int socket, std::size_t smallest);

/// Answers requests with blocking calls, until the other side closes.
void ServeBlocking(int socket);

/// `count` requests with up to `outstanding` of them under way; seconds for each.
[[nodiscard]] double TimeRequests(int socket, int count, int outstanding);

/// From now on this process connects as one of the entitled group.
void BecomeEntitled();

/// One check-in from socket(2) to the private port.
struct CheckedIn {
    platform::OwnedFd watch;
    platform::OwnedFd privatePort;
};

[[nodiscard]] platform::OwnedFd ConnectTo(std::string_view path);
[[nodiscard]] platform::OwnedFd ListenAt(std::string_view path);
[[nodiscard]] CheckedIn CheckIn();

/// A line of /proc/<pid>/<file> that starts with `name`, as a number.
[[nodiscard]] long ProcessNumber(pid_t pid, const char* file, std::string_view name);

}  // namespace bench
