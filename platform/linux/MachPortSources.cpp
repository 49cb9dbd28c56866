// Sources on ports: a client's private port, and a service with its connections.
#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <forward_list>
#include <list>
#include <map>

#include "platform/linux/DescriptorKind.h"
#include "platform/linux/MessageSource.h"
#include "platform/linux/PortSpace.h"
#include "platform/linux/ServiceSocket.h"

namespace platform {
namespace {

/// Connections that have not checked in.
constexpr std::size_t kMaxConnectionsOfUser = 64;
constexpr std::size_t kMaxConnections = 512;
constexpr int kAcceptsPerTurn = 16;

class PrivatePortSource final : public MessageSource {
public:
    using MessageSource::MessageSource;

private:
    void closeSocket() override { PortSpace::shared().silence(port()); }
};

class ServiceSource;

/// One connection to the service port, with the kernel's snapshot of who connected.
class ServiceConnection final : public MessageSource {
public:
    ServiceConnection(OwnedFd socket,
                      const Service& service,
                      const ucred& peer,
                      ServiceSource& owner)
        : MessageSource(socket.get(), service),
          socket_(std::move(socket)),
          owner_(owner),
          sender_{peer.uid,
                  peer.uid,
                  peer.gid,
                  peer.uid,
                  peer.gid,
                  static_cast<std::uint32_t>(peer.pid),
                  0,
                  0} {}

    [[nodiscard]] std::uint32_t uid() const { return sender_[0]; }

private:
    void closeSocket() override;

    [[nodiscard]] const AuditToken& sender() const override { return sender_; }

    /// A reply that hands over a port completes the check-in: the client has no more use for us.
    [[nodiscard]] bool isLastReply(const ReplyMessage& reply) const override {
        return (reply.header().bits & MACH_MSGH_BITS_COMPLEX) != 0;
    }

    const OwnedFd socket_;
    ServiceSource& owner_;
    const AuditToken sender_;
};

class ServiceSource final : public EventSource {
public:
    ServiceSource(int descriptor, const MessageSource::Service& service)
        : EventSource(descriptor, EPOLLIN),
          service_(service),
          spare_(open("/dev/null", O_RDONLY | O_CLOEXEC)) {}

    ~ServiceSource() override {
        for (const auto& connection : connections_) {
            connection->leaveLoop();
        }
    }

    void ready(std::uint32_t /*events*/) override {
        for (int accepted = 0; accepted < kAcceptsPerTurn && acceptOne(); ++accepted) {
        }
    }

    void forget(const ServiceConnection& connection) {
        if (--countOfUser_[connection.uid()] == 0) {
            countOfUser_.erase(connection.uid());
        }
        connections_.remove_if([&](const auto& other) { return other.get() == &connection; });
    }

private:
    /// False when nobody waits any more.
    bool acceptOne() {
        OwnedFd socket(accept4(descriptor(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
        if (!socket.isOpen()) {
            return errno == EMFILE || errno == ENFILE ? turnAway()
                                                      : errno == EINTR || errno == ECONNABORTED;
        }
        ucred peer{};
        socklen_t size = sizeof peer;
        if (socket.get() < ForeignDescriptorLimit() &&
            getsockopt(socket.get(), SOL_SOCKET, SO_PEERCRED, &peer, &size) == 0) {
            admit(std::move(socket), peer);
        }
        return true;
    }

    /// Without a descriptor left the connection would stay in the queue and wake us for ever: the
    /// spare one takes it in, and it is closed.
    bool turnAway() {
        spare_.reset();
        OwnedFd socket(accept4(descriptor(), nullptr, nullptr, SOCK_CLOEXEC));
        const bool turnedAway = socket.isOpen();
        socket.reset();
        spare_.reset(open("/dev/null", O_RDONLY | O_CLOEXEC));
        return turnedAway;
    }

    void admit(OwnedFd socket, const ucred& peer) {
        auto connection =
            std::make_shared<ServiceConnection>(std::move(socket), service_, peer, *this);
        connections_.push_back(connection);
        const std::size_t count = ++countOfUser_[peer.uid];
        RunLoop::current().addSource(connection);
        if (count > kMaxConnectionsOfUser) {
            closeOldestOf(peer.uid);
        } else if (connections_.size() > kMaxConnections) {
            closeOldestOf(std::ranges::max_element(countOfUser_, {}, [](const auto& entry) {
                              return entry.second;
                          })->first);
        }
    }

    void closeOldestOf(uid_t uid) {
        const auto oldest = std::ranges::find_if(
            connections_, [uid](const auto& connection) { return connection->uid() == uid; });
        const auto connection = *oldest;
        connection->leaveLoop();
        forget(*connection);
    }

    const MessageSource::Service service_;
    OwnedFd spare_;
    std::list<std::shared_ptr<ServiceConnection>> connections_;  // the oldest first
    std::map<uid_t, std::size_t> countOfUser_;
};

void ServiceConnection::closeSocket() {
    owner_.forget(*this);
}

/// There are as many as message tables in the program: two.
const MessageSource::Receiver* SharedReceiver(const MessageSource::Receiver& wanted) {
    static thread_local std::forward_list<MessageSource::Receiver> receivers;
    const auto known = std::ranges::find(receivers, wanted);
    return known != receivers.end() ? &*known : &receivers.emplace_front(wanted);
}

bool IsListening(int descriptor) {
    int value = 0;
    socklen_t size = sizeof value;
    return getsockopt(descriptor, SOL_SOCKET, SO_ACCEPTCONN, &value, &size) == 0 && value == 1;
}

}  // namespace

kern_return_t bootstrap_check_in(std::string_view serviceName, mach_port_t* port) {
    OwnedFd socket = TakeActivatedSocket(serviceName);
    if (!socket.isOpen()) {
        socket = BindServiceSocket(serviceName);
    }
    return socket.isOpen() ? PortSpace::shared().addReceiveRight(std::move(socket), OwnedFd(), port)
                           : KERN_FAILURE;
}

std::shared_ptr<RunLoopSource> MachPortCreateRunLoopSource(mach_port_t port,
                                                           MachMessageCallout callout,
                                                           const void* context) {
    const int descriptor = PortSpace::shared().receiveSocket(port);
    if (descriptor < 0) {
        return nullptr;
    }
    const MessageSource::Service service{
        .port = port, .receiver = SharedReceiver({.callout = callout, .context = context})};
    if (IsListening(descriptor)) {
        return std::make_shared<ServiceSource>(descriptor, service);
    }
    return std::make_shared<PrivatePortSource>(descriptor, service);
}

}  // namespace platform
