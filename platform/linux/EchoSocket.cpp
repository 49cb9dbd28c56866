// Echo requests through the kernel's own echo socket, which needs no raw access.
//
// A request's identifier is the socket's port, and a reply arrives without its IP header. The group
// of the process must lie in net.ipv4.ping_group_range, root's no less, or no socket opens.
#include "platform/EchoSocket.h"

#include <arpa/inet.h>
#include <net/if.h>
#include <netdb.h>
#include <netinet/in.h>
#include <netinet/ip.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>
#include <vector>

#include "platform/Utf8.h"

namespace platform {
namespace {

static_assert(kAddressFamilyInet == AF_INET);

constexpr std::size_t kAnswerBytes = 1024;
constexpr std::size_t kAnswerBytesMax = std::size_t{64} << 10;

/// Calls a reentrant look-up with room for its answer, with more of it when it asks for more.
template <typename LookUp>
bool CallWithRoom(const LookUp& lookUp) {
    std::vector<char> room(kAnswerBytes);
    int error = lookUp(room);
    while (error == ERANGE && room.size() < kAnswerBytesMax) {
        room.resize(room.size() * 2);
        error = lookUp(room);
    }
    return error == 0;
}

HostAddress AddressOf(std::int32_t family, const void* bytes, std::size_t size) {
    HostAddress address{.family = family};
    std::memcpy(address.bytes.data(), bytes, std::min(size, address.bytes.size()));
    return address;
}

bool SetOption(int socket, int option, const void* value, std::size_t size) {
    return setsockopt(socket, SOL_SOCKET, option, value, static_cast<socklen_t>(size)) == 0;
}

bool BindIdentifier(int socket, std::uint16_t identifier) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(identifier);
    return bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}

/// Where a datagram without its IP header came from, in a header of the shortest kind.
void WriteHeader(std::span<std::byte> header, std::size_t messageSize, const sockaddr_in& source) {
    iphdr written{};
    written.version = 4;
    written.ihl = sizeof written / 4;
    written.tot_len = htons(static_cast<std::uint16_t>(sizeof written + messageSize));
    written.protocol = IPPROTO_ICMP;
    written.saddr = source.sin_addr.s_addr;
    std::memcpy(header.data(), &written, std::min(header.size(), sizeof written));
}

}  // namespace

bool CopyHostText(std::string_view host, std::span<char> text) {
    if (!IsUtf8(host) || host.find('\0') != std::string_view::npos || host.size() >= text.size()) {
        errno = EINVAL;
        return false;
    }
    std::ranges::copy(host, text.begin());
    text[host.size()] = '\0';
    return true;
}

std::optional<HostAddress> ParseInternetAddress(const char* text) {
    const in_addr_t address = inet_addr(text);
    return address == INADDR_NONE ? std::nullopt
                                  : std::optional(AddressOf(AF_INET, &address, sizeof address));
}

std::optional<HostAddress> ResolveHostName(const char* name) {
    hostent entry{};
    hostent* found = nullptr;
    std::optional<HostAddress> address;
    (void)CallWithRoom([&](std::vector<char>& room) {
        int reason = 0;
        const int error = gethostbyname_r(name, &entry, room.data(), room.size(), &found, &reason);
        if (error == 0 && found != nullptr && found->h_addr_list[0] != nullptr) {
            address = AddressOf(found->h_addrtype,
                                found->h_addr_list[0],
                                static_cast<std::size_t>(found->h_length));
        }
        return error;
    });
    return address;
}

std::optional<std::int32_t> ProtocolByName(const char* name) {
    protoent entry{};
    protoent* found = nullptr;
    const bool isAnswered = CallWithRoom([&](std::vector<char>& room) {
        return getprotobyname_r(name, &entry, room.data(), room.size(), &found);
    });
    return isAnswered && found != nullptr ? std::optional(entry.p_proto) : std::nullopt;
}

std::uint32_t InterfaceIndexByName(const char* name) {
    return if_nametoindex(name);
}

std::optional<TimeOfDay> GetTimeOfDay() {
    timeval now{};
    if (gettimeofday(&now, nullptr) != 0) {
        return std::nullopt;
    }
    return TimeOfDay{.seconds = now.tv_sec, .microseconds = static_cast<std::int32_t>(now.tv_usec)};
}

std::int32_t LastSystemError() {
    return errno;
}

std::optional<EchoSocket> EchoSocket::open(std::int32_t protocol) {
    const int descriptor = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, protocol);
    return descriptor < 0 ? std::nullopt : std::optional(EchoSocket(descriptor));
}

EchoSocket::EchoSocket(EchoSocket&& other) noexcept
    : descriptor_(std::exchange(other.descriptor_, -1)) {}

EchoSocket::~EchoSocket() {
    if (descriptor_ >= 0) {
        ::close(descriptor_);
    }
}

std::uint16_t EchoSocket::takeIdentifier(std::uint16_t wanted) {
    if (!BindIdentifier(descriptor_, wanted)) {
        // Somebody else has it. Port 0 lets the kernel choose, as it would at the first sending.
        (void)BindIdentifier(descriptor_, 0);
    }
    sockaddr_in address{};
    socklen_t size = sizeof address;
    if (getsockname(descriptor_, reinterpret_cast<sockaddr*>(&address), &size) != 0) {
        return wanted;
    }
    return ntohs(address.sin_port);
}

bool EchoSocket::setReceiveBufferSize(std::int32_t bytes) {
    return SetOption(descriptor_, SO_RCVBUF, &bytes, sizeof bytes);
}

bool EchoSocket::bindToInterface(const char* name) {
    return SetOption(descriptor_, SO_BINDTODEVICE, name, std::strlen(name) + 1);
}

bool EchoSocket::setReceiveTimeout(std::int64_t seconds, std::int32_t microseconds) {
    const timeval timeout{.tv_sec = seconds, .tv_usec = microseconds};
    return SetOption(descriptor_, SO_RCVTIMEO, &timeout, sizeof timeout);
}

std::int64_t EchoSocket::send(std::span<const std::byte> message, const HostAddress& destination) {
    sockaddr_in address{};
    address.sin_family = static_cast<sa_family_t>(destination.family);
    std::memcpy(&address.sin_addr, destination.bytes.data(), sizeof address.sin_addr);
    return sendto(descriptor_,
                  message.data(),
                  message.size(),
                  MSG_NOSIGNAL,
                  reinterpret_cast<const sockaddr*>(&address),
                  sizeof address);
}

std::int64_t EchoSocket::receive(std::span<std::byte> datagram) {
    const auto header = datagram.first(std::min(datagram.size(), sizeof(iphdr)));
    const auto message = datagram.subspan(header.size());
    sockaddr_in source{};
    socklen_t size = sizeof source;
    const ssize_t received = recvfrom(descriptor_,
                                      message.data(),
                                      message.size(),
                                      0,
                                      reinterpret_cast<sockaddr*>(&source),
                                      &size);
    if (received < 0) {
        return received;
    }
    const auto messageSize = static_cast<std::size_t>(received);
    WriteHeader(header, messageSize, source);
    return static_cast<std::int64_t>(header.size() + messageSize);
}

void EchoSocket::close() {
    const int error = errno;
    errno = ::close(std::exchange(descriptor_, -1)) == 0 ? error : errno;
}

}  // namespace platform
