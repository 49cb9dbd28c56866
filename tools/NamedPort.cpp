#include "tools/NamedPort.h"

#include <sys/epoll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <chrono>

#include "platform/MachMessage.h"
#include "platform/linux/ServiceSocket.h"

namespace tools {
namespace {

using platform::MachMsgHeader;
using platform::OwnedFd;

constexpr std::size_t kConnectionsMax = 64;
constexpr std::size_t kDatagramMax = 256 * 1024;  // more than a socket's buffer takes

/// The number of the listening socket among the connections.
constexpr int kListening = 0;

bool Watch(int events, int descriptor, int number) {
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.fd = number;
    return epoll_ctl(events, EPOLL_CTL_ADD, descriptor, &event) == 0;
}

}  // namespace

std::optional<NamedPort> NamedPort::own(std::string_view name) {
    OwnedFd listening = platform::BindServiceSocket(name);
    OwnedFd events(epoll_create1(EPOLL_CLOEXEC));
    if (!listening.isOpen() || !events.isOpen() ||
        !Watch(events.get(), listening.get(), kListening)) {
        return std::nullopt;
    }
    return NamedPort(std::move(listening), std::move(events));
}

NamedPort::NamedPort(OwnedFd listening, OwnedFd events)
    : listening_(std::move(listening)), events_(std::move(events)) {}

std::optional<PortMessage> NamedPort::receive(int timeoutMs) {
    using Clock = std::chrono::steady_clock;
    const auto end = Clock::now() + std::chrono::milliseconds(timeoutMs);
    for (;;) {
        const auto left =
            std::chrono::duration_cast<std::chrono::milliseconds>(end - Clock::now()).count();
        const int wait = timeoutMs < 0 ? -1 : static_cast<int>(std::max<std::int64_t>(left, 0));
        epoll_event event{};
        if (epoll_wait(events_.get(), &event, 1, wait) != 1) {
            return std::nullopt;
        }
        if (event.data.fd == kListening) {
            accept();
        } else if (auto message = read(event.data.fd)) {
            return message;
        }
    }
}

void NamedPort::accept() {
    OwnedFd connection(accept4(listening_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (!connection.isOpen() || !Watch(events_.get(), connection.get(), lastNumber_ + 1)) {
        return;
    }
    if (connections_.size() == kConnectionsMax) {
        connections_.erase(connections_.begin());
    }
    connections_.emplace(++lastNumber_, std::move(connection));
}

std::optional<PortMessage> NamedPort::read(int sender) {
    const auto connection = connections_.find(sender);
    if (connection == connections_.end()) {
        return std::nullopt;
    }
    std::vector<std::byte> datagram(kDatagramMax);
    const ssize_t size =
        recv(connection->second.get(), datagram.data(), datagram.size(), MSG_TRUNC);
    if (size < 0 && (errno == EAGAIN || errno == EINTR)) {
        return std::nullopt;
    }
    const std::size_t length = size < 0 ? 0 : static_cast<std::size_t>(size);
    MachMsgHeader header;
    if (length >= sizeof header && length <= datagram.size()) {
        header = platform::Load<MachMsgHeader>(datagram, 0);
    }
    if (length < sizeof header || header.size != length) {
        connections_.erase(connection);
        return std::nullopt;
    }
    datagram.resize(length);
    datagram.erase(datagram.begin(), datagram.begin() + sizeof header);
    return PortMessage{.sender = sender, .id = header.id, .body = std::move(datagram)};
}

bool NamedPort::send(int sender, std::int32_t id, std::span<const std::byte> body) const {
    std::vector<std::byte> datagram(sizeof(MachMsgHeader) + body.size());
    const MachMsgHeader header{.size = static_cast<std::uint32_t>(datagram.size()), .id = id};
    platform::Store(std::span(datagram), 0, header);
    std::ranges::copy(body, datagram.begin() + sizeof header);
    const auto connection = connections_.find(sender);
    return connection != connections_.end() &&
           ::send(connection->second.get(), datagram.data(), datagram.size(), MSG_NOSIGNAL) ==
               static_cast<ssize_t>(datagram.size());
}

}  // namespace tools
