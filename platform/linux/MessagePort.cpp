#include "platform/MessagePort.h"

#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/uio.h>
#include <sys/un.h>

#include <array>
#include <cstring>
#include <optional>
#include <string>

#include "platform/MachMessage.h"
#include "platform/linux/OwnedFd.h"
#include "platform/linux/ServiceSocket.h"

namespace platform {
namespace {

/// None when the name is no file name, or too long for an address.
std::optional<sockaddr_un> AddressOfPort(std::string_view name) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    const std::string path = std::string(kServiceDirectory) + "/" + std::string(name);
    if (name.empty() || name == "." || name == ".." || name.find('/') != std::string_view::npos ||
        name.find('\0') != std::string_view::npos || path.size() >= sizeof address.sun_path) {
        return std::nullopt;
    }
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    return address;
}

/// Only root puts things into the folder, so what the path is now it is when it is used. Even so a
/// link there is none of ours: it could lead the message to somebody else.
bool IsSocket(const char* path) {
    struct stat status {};

    return lstat(path, &status) == 0 && S_ISSOCK(status.st_mode);
}

/// Closed when nobody listens, or too many wait already.
OwnedFd ConnectTo(const sockaddr_un& address) {
    OwnedFd socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!socket.isOpen() ||
        connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        return {};
    }
    return socket;
}

}  // namespace

bool MessagePortSendRequest(std::string_view portName,
                            std::int32_t messageId,
                            std::span<const std::byte> data) {
    const auto address = AddressOfPort(portName);
    if (!address || !IsSocket(address->sun_path)) {
        return false;
    }
    const OwnedFd connection = ConnectTo(*address);
    if (!connection.isOpen()) {
        return false;
    }
    MachMsgHeader header{.size = static_cast<std::uint32_t>(sizeof header + data.size()),
                         .id = messageId};
    std::array<iovec, 2> parts{
        iovec{.iov_base = &header, .iov_len = sizeof header},
        iovec{.iov_base = const_cast<std::byte*>(data.data()), .iov_len = data.size()}};
    msghdr message{};
    message.msg_iov = parts.data();
    message.msg_iovlen = parts.size();
    // A datagram goes as a whole or not at all, and what was sent stays for the owner when this end
    // is closed.
    return sendmsg(connection.get(), &message, MSG_NOSIGNAL) >= 0;
}

}  // namespace platform
