#include "platform/linux/MessageSource.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/uio.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <memory>
#include <utility>

#include "platform/VirtualMemory.h"
#include "platform/linux/DescriptorKind.h"
#include "platform/linux/FreedMemory.h"
#include "platform/linux/PortSpace.h"

namespace platform {
namespace {

/// A client that pipelines gets this many answers before the others have their turn.
constexpr int kMessagesPerTurn = 16;

/// Holds one descriptor. Its padding would hold a second one, so a receiver offers the kernel no
/// more than kRoomForOneDescriptor: what comes beyond is cut, and told.
union ControlBuffer {
    cmsghdr header;
    std::array<std::byte, CMSG_SPACE(sizeof(int))> bytes;
};

constexpr std::size_t kRoomForOneDescriptor = CMSG_LEN(sizeof(int));

/// One buffer serves all sources of a thread: a message is handled before the next is received. It
/// is made when first used, for the loader would touch each page of it at the start of each thread.
std::span<std::byte> ReceiveBuffer() {
    using Buffer = std::array<std::byte, kReceiveBufferSize>;
    static thread_local const auto buffer = std::make_unique_for_overwrite<Buffer>();
    return *buffer;
}

int TakeDescriptor(msghdr& message) {
    const cmsghdr* const control = CMSG_FIRSTHDR(&message);
    if (control == nullptr || control->cmsg_level != SOL_SOCKET ||
        control->cmsg_type != SCM_RIGHTS || control->cmsg_len < CMSG_LEN(sizeof(int))) {
        return -1;
    }
    int descriptor = -1;
    std::memcpy(&descriptor, CMSG_DATA(control), sizeof descriptor);
    return descriptor;
}

DescriptorArrival ArrivalOf(const msghdr& message, int descriptor) {
    const bool wasCut = (message.msg_flags & MSG_CTRUNC) != 0;
    if (descriptor >= 0) {
        return wasCut ? DescriptorArrival::kSurplus : DescriptorArrival::kOne;
    }
    return wasCut ? DescriptorArrival::kTableFull : DescriptorArrival::kNone;
}

OwnedFd SealedMemoryFile(std::span<const std::byte> data) {
    OwnedFd file(memfd_create("reply", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    while (file.isOpen() && !data.empty()) {
        const ssize_t written = write(file.get(), data.data(), data.size());
        if (written <= 0) {
            return {};
        }
        data = data.subspan(static_cast<std::size_t>(written));
    }
    constexpr int kSeals = F_SEAL_WRITE | F_SEAL_GROW | F_SEAL_SHRINK | F_SEAL_SEAL;
    return file.isOpen() && fcntl(file.get(), F_ADD_SEALS, kSeals) == 0 ? std::move(file)
                                                                        : OwnedFd();
}

}  // namespace

/// A reply on its way out, with what leaves beside it.
class MessageSource::Outgoing {
public:
    explicit Outgoing(const ReplyMessage& reply) : reply_(reply) {}

    Outgoing(Outgoing&& other) noexcept
        : reply_(other.reply_),
          descriptor_(std::move(other.descriptor_)),
          memory_(std::exchange(other.memory_, {})),
          isBulk_(other.isBulk_) {}

    ~Outgoing() { releaseMemory(); }

    Outgoing(const Outgoing&) = delete;
    Outgoing& operator=(const Outgoing&) = delete;
    Outgoing& operator=(Outgoing&&) = delete;

    /// Takes over what the reply's descriptor names. A reply that cannot leave with it becomes an
    /// error reply.
    void load() {
        auto header = reply_.header();
        if ((header.bits & MACH_MSGH_BITS_COMPLEX) == 0) {
            return;
        }
        const auto type =
            static_cast<DescriptorType>(Load<std::uint8_t>(reply_.bytes, kOffsetOfDescriptorType));
        if (type == DescriptorType::kPort ? loadPort() : loadData()) {
            return;
        }
        header.bits = 0;
        header.size = kErrorReplySize;
        reply_.setHeader(header);
        Store(reply_.bytes, kOffsetOfNdr, kNdrRecord);
        Store(reply_.bytes, kOffsetOfReturnCode, KERN_RESOURCE_SHORTAGE);
    }

    /// 0 when the kernel has taken the whole of it, else an errno value.
    [[nodiscard]] int send(int socket) {
        std::array<iovec, 2> parts{
            iovec{.iov_base = reply_.bytes.data(), .iov_len = reply_.header().size},
            iovec{.iov_base = memory_.data(),
                  .iov_len = descriptor_.isOpen() ? 0 : memory_.size()}};
        msghdr message{};
        message.msg_iov = parts.data();
        message.msg_iovlen = parts[1].iov_len == 0 ? 1 : 2;
        ControlBuffer control{};
        if (descriptor_.isOpen()) {
            control.header = {.cmsg_len = CMSG_LEN(sizeof(int)),
                              .cmsg_level = SOL_SOCKET,
                              .cmsg_type = SCM_RIGHTS};
            const int descriptor = descriptor_.get();
            std::memcpy(CMSG_DATA(&control.header), &descriptor, sizeof descriptor);
            message.msg_control = &control;
            message.msg_controllen = sizeof control;
        }
        for (;;) {
            if (sendmsg(socket, &message, MSG_DONTWAIT | MSG_NOSIGNAL) >= 0) {
                return 0;
            }
            if (errno != EINTR) {
                return errno;
            }
        }
    }

    [[nodiscard]] const ReplyMessage& reply() const { return reply_; }

    /// Whether the data beside it is too large to ride behind it.
    [[nodiscard]] bool isBulk() const { return isBulk_; }

private:
    bool loadPort() {
        const auto name = Load<mach_port_t>(reply_.bytes, kOffsetOfDescriptor);
        descriptor_ = PortSpace::shared().takePeer(name);
        return descriptor_.isOpen();
    }

    bool loadData() {
        const auto address = Load<std::uintptr_t>(reply_.bytes, kOffsetOfDescriptor);
        const auto size = Load<std::uint32_t>(reply_.bytes, kOffsetOfOutOfLineSize);
        Store(reply_.bytes, kOffsetOfDescriptor, std::uint64_t{0});  // addresses of ours stay here
        memory_ = {reinterpret_cast<std::byte*>(address), size};
        isBulk_ = size > kMaxInlineData;
        if (isBulk_) {
            descriptor_ = SealedMemoryFile(memory_);
            releaseMemory();
            return descriptor_.isOpen();
        }
        return true;
    }

    void releaseMemory() {
        vm_deallocate(memory_.data(), memory_.size());
        memory_ = {};
    }

    ReplyMessage reply_;
    OwnedFd descriptor_;
    std::span<std::byte> memory_;
    bool isBulk_ = false;
};

MessageSource::MessageSource(int descriptor, const Service& service)
    : EventSource(descriptor, EPOLLIN), port_(service.port), receiver_(service.receiver) {}

MessageSource::~MessageSource() = default;

void MessageSource::close() {
    leaveLoop();
    pending_ = nullptr;
    closeSocket();
}

void MessageSource::ready(std::uint32_t /*events*/) {
    auto step = Step::kGoOn;
    if (pending_ != nullptr) {
        const auto pending = std::exchange(pending_, nullptr);
        step = sendOrKeep(std::move(*pending));
    }
    for (int served = 0; step == Step::kGoOn && served < kMessagesPerTurn && isValid(); ++served) {
        step = serveOne();
    }
    if (step == Step::kClose && isValid()) {
        close();
    }
}

MessageSource::Step MessageSource::sendOrKeep(Outgoing&& reply) {
    const int error = reply.send(descriptor());
    if (error == EAGAIN) {
        setInterest(EPOLLOUT);
        pending_ = std::make_unique<Outgoing>(std::move(reply));
        return Step::kWait;
    }
    setInterest(EPOLLIN);
    return error != 0 || isLastReply(reply.reply()) ? Step::kClose : Step::kGoOn;
}

MessageSource::Step MessageSource::serveOne() {
    ControlBuffer control;
    iovec part{.iov_base = ReceiveBuffer().data(), .iov_len = kReceiveCapacity};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = &control;
    message.msg_controllen = kRoomForOneDescriptor;
    const ssize_t arrived =
        recvmsg(descriptor(), &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC | MSG_TRUNC);
    if (arrived < 0) {
        return errno == EAGAIN ? Step::kWait : errno == EINTR ? Step::kGoOn : Step::kClose;
    }
    OwnedFd foreign(TakeDescriptor(message));
    const auto arrival = ArrivalOf(message, foreign.get());
    const auto length = static_cast<std::size_t>(arrived);
    if (length < sizeof(MachMsgHeader)) {
        // No message at all, which is also how the end looks.
        CloseForeignDescriptor(std::move(foreign));
        return Step::kClose;
    }
    return answer(length, arrival, foreign.release());
}

MessageSource::Step MessageSource::answer(std::size_t arrived,
                                          DescriptorArrival arrival,
                                          int descriptor) {
    auto request = MakeReceivedMessage(ReceiveBuffer(),
                                       arrived,
                                       arrival,
                                       descriptor,
                                       {.localPort = port_,
                                        .replyRoute = port_,
                                        .sequenceNumber = sequenceNumber_++,
                                        .sender = &sender()});
    ReplyMessage reply;
    receiver_->callout(request, reply, receiver_->context);
    Outgoing outgoing(reply);
    outgoing.load();
    // A memory file that came is still here; a port would have become a name.
    const bool wasBulk = request.descriptor >= 0 || outgoing.isBulk();
    const Step step = isValid() ? sendOrKeep(std::move(outgoing)) : Step::kClose;
    CloseForeignDescriptor(OwnedFd(request.descriptor));
    if (wasBulk) {
        ReturnFreedMemory();
    }
    return step;
}

}  // namespace platform
