#include "tests/location/PortServer.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <cstring>
#include <filesystem>

#include "platform/MachMessage.h"

namespace port {
namespace {

using platform::MachMsgHeader;
using platform::OwnedFd;

constexpr int kTickMs = 10;

bool Await(int socket, const std::atomic<bool>& isStopping) {
    while (!isStopping) {
        pollfd state{.fd = socket, .events = POLLIN, .revents = 0};
        if (poll(&state, 1, kTickMs) == 1) {
            return true;
        }
    }
    return false;
}

}  // namespace

Message PortConnection::receive() const {
    std::vector<std::byte> datagram(256 << 10);
    const ssize_t size =
        Await(socket_, isStopping_) ? recv(socket_, datagram.data(), datagram.size(), 0) : 0;
    if (size < static_cast<ssize_t>(sizeof(MachMsgHeader))) {
        return {};
    }
    datagram.resize(static_cast<std::size_t>(size));
    const auto header = platform::Load<MachMsgHeader>(datagram, 0);
    const auto body =
        platform::PropertyListCreateWithData(std::span(datagram).subspan(sizeof header));
    return {.id = header.id,
            .isSizeTrue = header.size == datagram.size(),
            .body = body.value_or(platform::PropertyList())};
}

bool PortConnection::sendBytes(std::span<const std::byte> datagram, int descriptor) const {
    iovec part{.iov_base = const_cast<std::byte*>(datagram.data()), .iov_len = datagram.size()};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    alignas(cmsghdr) std::array<std::byte, CMSG_SPACE(sizeof descriptor)> control{};
    if (descriptor >= 0) {
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        cmsghdr* const header = CMSG_FIRSTHDR(&message);
        *header = {.cmsg_len = CMSG_LEN(sizeof descriptor),
                   .cmsg_level = SOL_SOCKET,
                   .cmsg_type = SCM_RIGHTS};
        std::memcpy(CMSG_DATA(header), &descriptor, sizeof descriptor);
    }
    return sendmsg(socket_, &message, MSG_NOSIGNAL) >= 0;
}

bool PortConnection::sendMessage(std::int32_t id, std::string_view xml) const {
    return sendBytes(MessageBytes(id, std::as_bytes(std::span(xml))));
}

bool PortConnection::answer(std::int32_t id, std::int64_t domain, std::int64_t error) const {
    return sendMessage(id,
                       "<plist version=\"1.0\"><dict><key>Domain</key><integer>" +
                           std::to_string(domain) + "</integer><key>Error</key><integer>" +
                           std::to_string(error) + "</integer></dict></plist>");
}

void PortConnection::hang() const {
    while (receive().id != 0) {
    }
}

std::vector<std::byte> MessageBytes(std::int32_t id, std::span<const std::byte> body) {
    std::vector<std::byte> message(sizeof(MachMsgHeader) + body.size());
    const MachMsgHeader header{.size = static_cast<std::uint32_t>(message.size()), .id = id};
    platform::Store(std::span(message), 0, header);
    std::ranges::copy(body, message.begin() + sizeof header);
    return message;
}

OwnedFd Listen(int backlog) {
    std::filesystem::create_directories("/run/linefold");
    std::filesystem::remove(kPath);
    OwnedFd socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, kPath, sizeof address.sun_path - 1);
    if (bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        listen(socket.get(), backlog) != 0) {
        return {};
    }
    return socket;
}

PortServer::PortServer(Script script)
    : script_(std::move(script)), listening_(Listen(SOMAXCONN)), thread_([this] { serve(); }) {}

PortServer::~PortServer() {
    isStopping_ = true;
    thread_.join();
    std::filesystem::remove(kPath);
}

void PortServer::serve() {
    while (Await(listening_.get(), isStopping_)) {
        const OwnedFd connection(accept4(listening_.get(), nullptr, nullptr, SOCK_CLOEXEC));
        script_(PortConnection(connection.get(), isStopping_));
    }
}

}  // namespace port
