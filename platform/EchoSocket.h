// The calls behind an ICMP echo: names and addresses, a datagram socket, and the time of day.
//
// Each stands by itself, so that each can fail by itself. All of them block at most for as long as
// their words say, resolution for as long as the resolver takes: none belongs on the main loop. A
// call that failed leaves its reason in LastSystemError of its thread.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

namespace platform {

inline constexpr std::int32_t kAddressFamilyInet = 2;

/// An address as a resolver answers it.
struct HostAddress {
    std::int32_t family = kAddressFamilyInet;
    std::array<std::byte, 16>
        bytes{};  ///< as many as the answer says, in network order, then zeros

    bool operator==(const HostAddress&) const = default;
};

/// The system's time-of-day record, as it travels in the requests: host layout, host byte order.
struct TimeOfDay {
    std::int64_t seconds = 0;
    std::int32_t microseconds = 0;
    std::uint32_t padding = 0;

    bool operator==(const TimeOfDay&) const = default;
};

static_assert(sizeof(TimeOfDay) == 16);

/// Puts a host name or address into `text` as UTF-8 that ends in NUL. False, and nothing is
/// written, when it is no UTF-8, holds NUL or does not fit.
[[nodiscard]] bool CopyHostText(std::string_view host, std::span<char> text);

/// A dotted IPv4 address, or nothing when the text is none. 255.255.255.255 is none.
[[nodiscard]] std::optional<HostAddress> ParseInternetAddress(const char* text);

/// The first address of a name, or nothing. Waits for the resolver.
[[nodiscard]] std::optional<HostAddress> ResolveHostName(const char* name);

/// The number of a protocol such as "icmp", or nothing.
[[nodiscard]] std::optional<std::int32_t> ProtocolByName(const char* name);

/// The index of a network interface; 0 when there is none of that name.
[[nodiscard]] std::uint32_t InterfaceIndexByName(const char* name);

/// The time of day, or nothing when it cannot be read.
[[nodiscard]] std::optional<TimeOfDay> GetTimeOfDay();

/// Why the latest call of this thread that failed did so, as an error number of the system.
[[nodiscard]] std::int32_t LastSystemError();

/// A datagram socket of IPv4 that sends echo requests. Belongs to one thread at a time. The end of
/// the object closes what is still open.
class EchoSocket {
public:
    /// Opens a socket for the protocol, or nothing: none may be open to us, or none is left.
    [[nodiscard]] static std::optional<EchoSocket> open(std::int32_t protocol);

    EchoSocket(EchoSocket&& other) noexcept;
    EchoSocket(const EchoSocket&) = delete;
    EchoSocket& operator=(const EchoSocket&) = delete;
    ~EchoSocket();

    /// Has the requests carry an identifier (host byte order), if the system lets us: gives the one
    /// that they will carry. 0 and an identifier that is taken get one of the system's choice.
    [[nodiscard]] std::uint16_t takeIdentifier(std::uint16_t wanted);

    [[nodiscard]] bool setReceiveBufferSize(std::int32_t bytes);

    /// Sends and receives through this interface alone, whatever the routes say.
    [[nodiscard]] bool bindToInterface(const char* name);

    /// How long a receive waits.
    [[nodiscard]] bool setReceiveTimeout(std::int64_t seconds, std::int32_t microseconds);

    /// Sends one ICMP message to the first four bytes of the address. The number of bytes that went
    /// out, negative on failure. The system writes its own identifier and checksum over those of
    /// the message, which are the same when they are right.
    [[nodiscard]] std::int64_t send(std::span<const std::byte> message,
                                    const HostAddress& destination);

    /// Waits for one datagram: an IPv4 header, then the ICMP message. The number of bytes written,
    /// cut at the size of the buffer; negative on failure, with EAGAIN when the time-out passed.
    [[nodiscard]] std::int64_t receive(std::span<std::byte> datagram);

    /// Closes the socket, after which all that is asked of it fails with EBADF, also closing it
    /// again: the object never touches what its number has become. LastSystemError is as before
    /// when the socket was open.
    void close();

private:
    explicit EchoSocket(int descriptor) : descriptor_(descriptor) {}

    int descriptor_;
};

}  // namespace platform
