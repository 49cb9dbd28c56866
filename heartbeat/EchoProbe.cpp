#include "heartbeat/EchoProbe.h"

#include <unistd.h>

#include <bit>
#include <cerrno>
#include <cstring>
#include <optional>

using namespace platform;

namespace {

constexpr std::size_t kHostTextSize = 256;
constexpr std::int32_t kReceiveBufferOption = 51'200;
constexpr std::size_t kReceiveBufferSize = 2048;
constexpr std::int64_t kReceiveTimeoutSeconds = 1;
constexpr const char* kInterface = "pdp_ip0";
constexpr const char* kProtocol = "icmp";

constexpr std::byte kEchoRequestType{8};
constexpr std::byte kEchoReplyType{0};
constexpr std::size_t kOffsetOfChecksum = 2;
constexpr std::size_t kOffsetOfIdentifier = 4;
constexpr std::size_t kOffsetOfSendTime = 32;

/// The outcome that means no more than "not permitted" or "something".
constexpr std::int32_t kSomeError = 1;

std::uint16_t InNetworkOrder(std::uint16_t value) {
    return std::endian::native == std::endian::little
               ? static_cast<std::uint16_t>(value << 8 | value >> 8)
               : value;
}

std::int32_t LastErrorOrSome() {
    const std::int32_t error = LastSystemError();
    return error != 0 ? error : kSomeError;
}

std::error_code Outcome(std::int32_t error) {
    return {error, std::generic_category()};
}

/// Whole seconds from one time to the other.
std::int64_t ElapsedSeconds(const TimeOfDay& start, const TimeOfDay& now) {
    return now.seconds - start.seconds - (now.microseconds < start.microseconds ? 1 : 0);
}

std::optional<HostAddress> AddressOf(const char* host) {
    const auto literal = ParseInternetAddress(host);
    return literal ? literal : ResolveHostName(host);
}

bool SendRequest(EchoSocket& socket, std::uint16_t identifier, const HostAddress& destination) {
    const auto now = GetTimeOfDay();
    return now && socket.send(MakeEchoRequest(identifier, *now), destination) ==
                      std::int64_t{kEchoRequestSize};
}

/// Receives until a reply came, a whole second passed after the first receive, or an error. 0 for a
/// reply.
std::int32_t AwaitReply(EchoSocket& socket, std::uint16_t identifier) {
    std::array<std::byte, kReceiveBufferSize> buffer;
    std::optional<TimeOfDay> start;
    bool isReply = false;
    bool isOver = false;
    while (!isOver) {
        const std::int64_t received = socket.receive(buffer);
        const std::int32_t error = received < 0 ? LastSystemError() : 0;
        if (!start && !(start = GetTimeOfDay())) {
            return LastErrorOrSome();
        }
        if (error != 0 && error != EAGAIN) {
            break;
        }
        const auto size = received < 0 ? 0 : static_cast<std::size_t>(received);
        isReply = IsEchoReply(std::span(buffer).first(size), identifier);
        const auto now = GetTimeOfDay();
        isOver = isReply || !now || ElapsedSeconds(*start, *now) > 0;
    }
    return isReply ? 0 : ETIMEDOUT;
}

/// From the bound socket on; the socket is closed afterwards.
std::int32_t Probe(EchoSocket& socket, std::uint16_t identifier, const HostAddress& destination) {
    if (!socket.setReceiveTimeout(kReceiveTimeoutSeconds, 0)) {
        socket.close();
        if (const std::int32_t error = LastSystemError(); error != 0) {
            // The second close is on purpose. It cannot hit what got the number in the meantime:
            // the socket has forgotten it.
            socket.close();
            return error;
        }
        // Without a reason the probe goes on, with the closed socket.
    }
    const std::int32_t error = SendRequest(socket, identifier, destination)
                                   ? AwaitReply(socket, identifier)
                                   : LastErrorOrSome();
    socket.close();
    return error;
}

}  // namespace

std::error_code SendEchoProbe(std::string_view host) {
    std::array<char, kHostTextSize> text;
    if (!CopyHostText(host, text)) {
        return Outcome(EINVAL);
    }
    const auto destination = AddressOf(text.data());
    if (!destination) {
        return Outcome(EHOSTUNREACH);
    }
    const auto protocol = ProtocolByName(kProtocol);
    if (!protocol) {
        return Outcome(EPFNOSUPPORT);
    }
    auto socket = EchoSocket::open(*protocol);
    if (!socket) {
        return Outcome(kSomeError);
    }
    const std::uint16_t identifier = socket->takeIdentifier(static_cast<std::uint16_t>(getpid()));
    (void)socket->setReceiveBufferSize(kReceiveBufferOption);  // the usual size serves too
    if (InterfaceIndexByName(kInterface) != 0) {
        // Unbound, the request leaves on whatever interface leads to the host, as it does without
        // the cellular one.
        (void)socket->bindToInterface(kInterface);
    }
    return Outcome(Probe(*socket, identifier, *destination));
}

EchoRequestBytes MakeEchoRequest(std::uint16_t identifier, const TimeOfDay& now) {
    EchoRequestBytes request{kEchoRequestType};
    const std::uint16_t identifierOnTheWire = InNetworkOrder(identifier);
    std::memcpy(&request[kOffsetOfIdentifier], &identifierOnTheWire, sizeof identifierOnTheWire);
    std::memcpy(&request[kOffsetOfSendTime], &now, sizeof now);
    const std::uint16_t checksum = InternetChecksum(request);
    std::memcpy(&request[kOffsetOfChecksum], &checksum, sizeof checksum);
    return request;
}

bool IsEchoReply(std::span<const std::byte> datagram, std::uint16_t identifier) {
    if (datagram.empty()) {
        return false;
    }
    const auto headerSize = std::to_integer<std::size_t>(datagram[0] & std::byte{0x0F}) * 4;
    if (datagram.size() < headerSize + kEchoRequestSize) {
        return false;
    }
    std::uint16_t carried = 0;
    std::memcpy(&carried, &datagram[headerSize + kOffsetOfIdentifier], sizeof carried);
    return datagram[headerSize] == kEchoReplyType && carried == InNetworkOrder(identifier);
}

std::uint16_t InternetChecksum(std::span<const std::byte> bytes) {
    std::uint32_t sum = 0;
    for (std::size_t i = 0; i < bytes.size(); i += sizeof(std::uint16_t)) {
        std::uint16_t word = 0;
        std::memcpy(&word, &bytes[i], sizeof word);
        sum += word;
    }
    sum = (sum >> 16) + (sum & 0xFFFF);
    sum += sum >> 16;
    return static_cast<std::uint16_t>(~sum);
}
