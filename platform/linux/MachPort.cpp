#include "platform/MachPort.h"

#include <poll.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <utility>

#include "platform/MachCarriage.h"
#include "platform/linux/DescriptorKind.h"
#include "platform/linux/EventLoop.h"
#include "platform/linux/PortSpace.h"

namespace platform {
namespace {

/// The watch on a send right. Nothing but its hang-up wakes the loop: EPOLLHUP is reported without
/// being asked for, and data that arrives is not asked for.
class WatchedPort final : public MachPort, public EventSource {
public:
    WatchedPort(mach_port_t name, int descriptor, void* info)
        : EventSource(descriptor, 0), name_(name), info_(info) {}

    void ready(std::uint32_t /*events*/) override { end(); }

    [[nodiscard]] bool isDead() const {
        pollfd state{.fd = descriptor(), .events = 0, .revents = 0};
        return poll(&state, 1, 0) == 1;
    }

    void end() {
        if (!EventSource::isValid()) {
            return;
        }
        leaveLoop();  // the loop, or who invalidates, still holds us through the callback
        if (const auto callBack = std::exchange(callBack_, nullptr); callBack != nullptr) {
            callBack(*this, info_);
        }
    }

private:
    friend class platform::MachPort;

    const mach_port_t name_;
    void* const info_;
    MachPortInvalidation callBack_ = nullptr;
};

static_assert(sizeof(WatchedPort) == 40, "with what its owners share it fills a block of 64");

bool CanBeWatched(int descriptor) {
    const auto kind = ClassifyDescriptor(descriptor);
    return kind == DescriptorKind::kPipe || kind == DescriptorKind::kConnectedLocalSocket;
}

}  // namespace

kern_return_t mach_port_allocate(MachPortRight right, mach_port_t* name) {
    if (right != MachPortRight::kReceive) {
        return KERN_INVALID_ARGUMENT;
    }
    // Blocking, since the flag is one for all holders of an end: the client's is the client's own.
    std::array<int, 2> ends{-1, -1};
    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()) != 0) {
        return KERN_RESOURCE_SHORTAGE;
    }
    OwnedFd receive(ends[0]);
    OwnedFd peer(ends[1]);
    if (peer.get() >= ForeignDescriptorLimit() || receive.get() >= ForeignDescriptorLimit()) {
        return KERN_RESOURCE_SHORTAGE;
    }
    return PortSpace::shared().addReceiveRight(std::move(receive), std::move(peer), name);
}

kern_return_t mach_port_insert_right(mach_port_t name, MachMsgType disposition) {
    return disposition == MachMsgType::kMakeSend ? PortSpace::shared().makeSend(name)
                                                 : KERN_INVALID_ARGUMENT;
}

kern_return_t mach_port_mod_refs(mach_port_t name, MachPortRight right, int delta) {
    if (delta != -1) {
        return KERN_INVALID_ARGUMENT;
    }
    return right == MachPortRight::kReceive ? PortSpace::shared().dropReceive(name)
                                            : PortSpace::shared().dropSend(name);
}

kern_return_t mach_port_deallocate(mach_port_t name) {
    return PortSpace::shared().dropSend(name);
}

kern_return_t AdoptPortDescriptor(int descriptor, mach_port_t* name) {
    if (descriptor >= ForeignDescriptorLimit()) {
        return KERN_RESOURCE_SHORTAGE;
    }
    OwnedFd send(descriptor);
    const kern_return_t code = PortSpace::shared().addSendRight(std::move(send), name);
    (void)send.release();  // without a name it stays with the caller
    return code;
}

kern_return_t ReadMemoryDescriptor(int descriptor, std::span<std::byte> into) {
    if (!IsSealedMemoryFile(descriptor)) {
        return MIG_BAD_ARGUMENTS;
    }
    // Read, not mapped: what is ours cannot change or fault any more.
    for (std::size_t done = 0; done < into.size();) {
        const auto rest = into.subspan(done);
        const ssize_t length =
            pread(descriptor, rest.data(), rest.size(), static_cast<off_t>(done));
        if (length <= 0) {
            return MIG_BAD_ARGUMENTS;
        }
        done += static_cast<std::size_t>(length);
    }
    return KERN_SUCCESS;
}

std::shared_ptr<MachPort> MachPort::create(mach_port_t name, void* info) {
    const int descriptor = PortSpace::shared().sendSocket(name);
    if (descriptor < 0 || !CanBeWatched(descriptor)) {
        return nullptr;
    }
    auto port = std::make_shared<WatchedPort>(name, descriptor, info);
    RunLoop::current().addSource(port);
    return port;
}

mach_port_t MachPort::port() const {
    return static_cast<const WatchedPort*>(this)->name_;
}

void* MachPort::info() const {
    return static_cast<const WatchedPort*>(this)->info_;
}

bool MachPort::isValid() const {
    return static_cast<const WatchedPort*>(this)->EventSource::isValid();
}

void MachPort::invalidate() {
    static_cast<WatchedPort*>(this)->end();
}

void MachPort::setInvalidationCallBack(MachPortInvalidation callBack) {
    auto& port = static_cast<WatchedPort&>(*this);
    port.callBack_ = callBack;
    if (callBack == nullptr) {
        return;
    }
    if (!port.EventSource::isValid()) {
        std::exchange(port.callBack_, nullptr)(*this, port.info_);
    } else if (port.isDead()) {
        port.end();
    }
}

}  // namespace platform
