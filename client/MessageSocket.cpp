#include "client/MessageSocket.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <cstring>

namespace linefold_client {
namespace {

/// Room for one descriptor and not a byte more: the kernel would fill the padding of CMSG_SPACE
/// with a second one.
constexpr std::size_t kControlSize = CMSG_LEN(sizeof(int));

struct alignas(cmsghdr) ControlBuffer {
    std::array<std::byte, CMSG_SPACE(sizeof(int))> bytes{};
};

ConnectResult ConnectResultOfErrno(int error) {
    switch (error) {
        case ENOENT:
        case ENOTDIR:
        case ELOOP:
        case ENAMETOOLONG:
            return ConnectResult::kNoService;
        case ECONNREFUSED:
        case ECONNRESET:
        case EAGAIN:
            return ConnectResult::kRefused;
        case EPROTOTYPE:
            return ConnectResult::kNotAService;
        case EACCES:
        case EPERM:
            return ConnectResult::kNoPermission;
        default:
            return ConnectResult::kNoResources;
    }
}

int ConnectUninterrupted(int connection, const sockaddr_un& address) {
    int result = 0;
    do {
        result = connect(connection, reinterpret_cast<const sockaddr*>(&address), sizeof address);
    } while (result != 0 && errno == EINTR);
    return result;
}

void AttachDescriptor(msghdr& header, ControlBuffer& control, int descriptor) {
    header.msg_control = control.bytes.data();
    header.msg_controllen = control.bytes.size();
    cmsghdr* const item = CMSG_FIRSTHDR(&header);
    item->cmsg_level = SOL_SOCKET;
    item->cmsg_type = SCM_RIGHTS;
    item->cmsg_len = CMSG_LEN(sizeof descriptor);
    std::memcpy(CMSG_DATA(item), &descriptor, sizeof descriptor);
}

/// For sendmsg, which reads through the pointer only.
iovec PartOf(std::span<const std::byte> bytes) {
    // NOLINTNEXTLINE(cppcoreguidelines-pro-type-const-cast)
    return {const_cast<std::byte*>(bytes.data()), bytes.size()};
}

SendResult SendResultOfErrno(int error) {
    switch (error) {
        case EPIPE:
        case ECONNRESET:
        case ECONNREFUSED:
        case ENOTCONN:
            return SendResult::kPeerGone;
        case EMSGSIZE:
            return SendResult::kTooLarge;
        default:
            return SendResult::kNoResources;
    }
}

Descriptor TakeDescriptor(msghdr& header) {
    cmsghdr* const item = CMSG_FIRSTHDR(&header);
    if (item == nullptr || item->cmsg_level != SOL_SOCKET || item->cmsg_type != SCM_RIGHTS ||
        item->cmsg_len < CMSG_LEN(sizeof(int))) {
        return Descriptor();
    }
    int number = -1;
    std::memcpy(&number, CMSG_DATA(item), sizeof number);
    return Descriptor(number);
}

/// The kernel has closed what had no room, so a cut control message never leaks.
void TakeArrival(msghdr& header, IncomingMessage& incoming) {
    Descriptor descriptor = TakeDescriptor(header);
    if ((header.msg_flags & MSG_CTRUNC) != 0) {
        incoming.arrival = descriptor.isOpen() ? Arrival::kSurplusDescriptors : Arrival::kTableFull;
    } else if (descriptor.isOpen()) {
        incoming.arrival = Arrival::kOneDescriptor;
        incoming.descriptor = std::move(descriptor);
    }
}

bool HasSocketOption(int descriptor, int option, int expected) {
    int value = 0;
    socklen_t size = sizeof value;
    return getsockopt(descriptor, SOL_SOCKET, option, &value, &size) == 0 && value == expected;
}

}  // namespace

ConnectResult ConnectToService(const sockaddr_un& address, Descriptor& connection) {
    struct stat status {};

    if (stat(address.sun_path, &status) != 0) {
        return ConnectResultOfErrno(errno);
    }
    // Connecting to a file that is no socket is answered like a socket that nobody listens on.
    if (!S_ISSOCK(status.st_mode)) {
        return ConnectResult::kNotAService;
    }
    Descriptor made(socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    if (!made.isOpen()) {
        return ConnectResult::kNoResources;
    }
    if (ConnectUninterrupted(made.get(), address) != 0) {
        return ConnectResultOfErrno(errno);
    }
    connection = std::move(made);
    return ConnectResult::kConnected;
}

SendResult SendMessage(int connection, const OutgoingMessage& outgoing) {
    std::array<iovec, 2> parts{PartOf(outgoing.message), PartOf(outgoing.behind)};
    ControlBuffer control;
    msghdr header{};
    header.msg_iov = parts.data();
    header.msg_iovlen = parts.size();
    if (outgoing.descriptor >= 0) {
        AttachDescriptor(header, control, outgoing.descriptor);
    }
    ssize_t sent = 0;
    do {
        sent = sendmsg(connection, &header, MSG_NOSIGNAL);
    } while (sent < 0 && errno == EINTR);
    return sent < 0 ? SendResultOfErrno(errno) : SendResult::kSent;
}

ReceiveResult ReceiveMessage(int connection,
                             std::span<std::byte> buffer,
                             IncomingMessage& incoming) {
    incoming = IncomingMessage{};
    iovec part{buffer.data(), buffer.size()};
    ControlBuffer control;
    msghdr header{};
    ssize_t received = 0;
    do {
        header = {};
        header.msg_iov = &part;
        header.msg_iovlen = 1;
        header.msg_control = control.bytes.data();
        header.msg_controllen = kControlSize;
        received = recvmsg(connection, &header, MSG_CMSG_CLOEXEC | MSG_TRUNC);
    } while (received < 0 && errno == EINTR);
    if (received < 0) {
        const bool isOver = errno == ECONNRESET || errno == EPIPE || errno == ENOTCONN;
        return isOver ? ReceiveResult::kPeerGone : ReceiveResult::kNoResources;
    }
    TakeArrival(header, incoming);
    if (received == 0) {
        return ReceiveResult::kPeerGone;
    }
    incoming.size = static_cast<std::size_t>(received);
    return ReceiveResult::kReceived;
}

bool IsMessageSocket(int descriptor) {
    return HasSocketOption(descriptor, SO_DOMAIN, AF_UNIX) &&
           HasSocketOption(descriptor, SO_TYPE, SOCK_SEQPACKET) &&
           HasSocketOption(descriptor, SO_ACCEPTCONN, 0);
}

bool MakeBlocking(int descriptor) {
    const int flags = fcntl(descriptor, F_GETFL);
    return flags >= 0 &&
           ((flags & O_NONBLOCK) == 0 || fcntl(descriptor, F_SETFL, flags & ~O_NONBLOCK) == 0);
}

}  // namespace linefold_client
