// Sources that receive messages: one connection for a private port, many for a service.
#include <algorithm>
#include <array>
#include <limits>
#include <map>
#include <utility>

#include "platform/MachCarriage.h"
#include "platform/VirtualMemory.h"
#include "platform/sim/MainLoop.h"
#include "platform/sim/Ports.h"
#include "platform/sim/World.h"

using namespace platform;

namespace sim {
namespace {

/// Connections to a service at the same time, of one user and of all.
constexpr std::size_t kConnectionsPerUserMax = 64;
constexpr std::size_t kConnectionsMax = 512;

/// Bytes that nobody wrote: whoever believes them is found out.
constexpr std::byte kNobodysByte{0xA5};

struct Connection {
    std::shared_ptr<Endpoint> endpoint;
    AuditToken sender = kUnknownSender;
    std::uint32_t sequenceNumber = 0;
    std::optional<Datagram> reply{};  // waits for the other side to read

    [[nodiscard]] bool isReady() const {
        if (reply.has_value()) {
            const auto other = endpoint->other.lock();
            return other == nullptr || other->hasRoom();
        }
        return !endpoint->inbox.empty() || endpoint->isHungUp();
    }
};

AuditToken TokenOf(const Identity& identity) {
    return {identity.uid,
            identity.uid,
            identity.gid,
            identity.uid,
            identity.gid,
            static_cast<std::uint32_t>(identity.pid),
            0,
            0};
}

/// The bulk data of a reply: behind the message when small, in a memory file else.
void MoveDataOut(std::span<std::byte> message, Datagram& datagram) {
    const auto address = Load<std::uintptr_t>(message, kOffsetOfDescriptor);
    const auto size = Load<std::uint32_t>(message, kOffsetOfOutOfLineSize);
    Store(std::span(datagram.bytes), kOffsetOfDescriptor, std::uint64_t{0});
    if (size == 0) {
        return;
    }
    auto* const memory = reinterpret_cast<std::byte*>(address);
    const std::span<const std::byte> data(memory, size);
    if (size <= kMaxInlineData) {
        datagram.bytes.insert(datagram.bytes.end(), data.begin(), data.end());
    } else {
        datagram.descriptors.push_back(std::make_shared<MemoryFile>(data, true));
    }
    vm_deallocate(memory, size);
}

/// The send right of a reply leaves with it; the daemon's own is bookkeeping from then on.
void MoveRightOut(std::span<std::byte> message, Datagram& datagram) {
    const auto name = Load<mach_port_t>(message, kOffsetOfDescriptor);
    Store(std::span(datagram.bytes), kOffsetOfDescriptor, MACH_PORT_NULL);
    if (Port* const port = FindPort(name); port != nullptr && port->send != nullptr) {
        datagram.descriptors.push_back(std::exchange(port->send, nullptr));
    }
}

Datagram DatagramOf(ReplyMessage& reply) {
    auto header = reply.header();
    header.remotePort = MACH_PORT_NULL;
    header.localPort = MACH_PORT_NULL;
    header.voucherPort = MACH_PORT_NULL;
    reply.setHeader(header);
    if (header.size < kErrorReplySize || header.size > kMaxReplySize) {
        throw ContractBroken("a reply of an impossible size");
    }
    const auto message = std::span(reply.bytes).first(header.size);
    Datagram datagram{.bytes = {message.begin(), message.end()}, .descriptors = {}};
    if ((header.bits & MACH_MSGH_BITS_COMPLEX) != 0) {
        const auto type =
            static_cast<DescriptorType>(Load<std::uint8_t>(message, kOffsetOfDescriptorType));
        type == DescriptorType::kOutOfLine ? MoveDataOut(message, datagram)
                                           : MoveRightOut(message, datagram);
    }
    return datagram;
}

class MessageSource final : public Source {
public:
    MessageSource(mach_port_t port, MachMessageCallout callout, const void* context)
        : port_(port), callout_(callout), context_(context) {
        service_ = FindPort(port)->service;
        if (service_.empty()) {
            connections_.push_back({.endpoint = FindPort(port)->receive});
        }
    }

    [[nodiscard]] std::size_t readyCount() const override {
        const auto ready = std::ranges::count_if(
            connections_, [](const Connection& connection) { return connection.isReady(); });
        return static_cast<std::size_t>(ready) + (isWaitedFor() ? 1 : 0);
    }

    void serve(std::size_t which) override {
        if (isWaitedFor() && which-- == 0) {
            accept();
            return;
        }
        for (std::size_t i = 0; i < connections_.size(); ++i) {
            if (connections_[i].isReady() && which-- == 0) {
                serveConnection(i);
                return;
            }
        }
    }

    void left() override {
        while (!connections_.empty()) {
            close(connections_.size() - 1);
        }
    }

private:
    [[nodiscard]] bool isWaitedFor() const {
        return !service_.empty() && HasWaitingConnection(service_);
    }

    void accept() {
        auto endpoint = AcceptConnection(service_);
        if (DescriptorTableIsFull()) {
            return;  // accepted with the spare descriptor, and closed: never spun on
        }
        CountConnection(1);
        const AuditToken sender = TokenOf(endpoint->peer);
        connections_.push_back({.endpoint = std::move(endpoint), .sender = sender});
        closeOneTooMany();
    }

    /// The oldest connection of the user who holds most makes room.
    void closeOneTooMany() {
        std::map<std::uint32_t, std::size_t> held;
        for (const Connection& connection : connections_) {
            ++held[connection.endpoint->peer.uid];
        }
        const auto most =
            std::ranges::max_element(held, {}, [](const auto& entry) { return entry.second; });
        if (most->second <= kConnectionsPerUserMax && connections_.size() <= kConnectionsMax) {
            return;
        }
        const auto oldest = std::ranges::find_if(connections_, [&](const Connection& connection) {
            return connection.endpoint->peer.uid == most->first;
        });
        close(static_cast<std::size_t>(oldest - connections_.begin()));
    }

    void close(std::size_t index) {
        if (!service_.empty()) {
            CountConnection(-1);
        } else if (Port* const port = FindPort(port_); isValid() && port != nullptr) {
            port->receive = nullptr;  // silent from here on; the entry lives on
        }
        const Connection closed = std::move(connections_[index]);
        connections_.erase(connections_.begin() + static_cast<std::ptrdiff_t>(index));
    }

    void serveConnection(std::size_t index) {
        Connection& connection = connections_[index];
        if (connection.reply.has_value()) {
            send(connection, *std::exchange(connection.reply, std::nullopt));
            return;
        }
        if (connection.endpoint->inbox.empty() ||
            connection.endpoint->inbox.front().bytes.size() < sizeof(MachMsgHeader)) {
            close(index);
            return;
        }
        auto datagram = std::move(connection.endpoint->inbox.front());
        connection.endpoint->inbox.pop_front();
        answer(connection, std::move(datagram));
    }

    static void send(Connection& connection, Datagram reply) {
        const auto other = connection.endpoint->other.lock();
        if (other == nullptr) {
            return;  // nobody reads it any more
        }
        if (other->hasRoom()) {
            other->inbox.push_back(std::move(reply));
        } else {
            connection.reply = std::move(reply);
        }
    }

    static DescriptorArrival take(std::vector<Descriptor>& descriptors, int* number) {
        if (descriptors.empty()) {
            return DescriptorArrival::kNone;
        }
        if (DescriptorTableIsFull()) {
            return DescriptorArrival::kTableFull;
        }
        *number = AddDescriptor(std::move(descriptors.front()));
        return descriptors.size() == 1 ? DescriptorArrival::kOne : DescriptorArrival::kSurplus;
    }

    void answer(Connection& connection, Datagram datagram) {
        std::vector<std::byte> buffer(kReceiveBufferSize, kNobodysByte);
        const std::size_t received = std::min(datagram.bytes.size(), kReceiveCapacity);
        std::ranges::copy(std::span(datagram.bytes).first(received), buffer.begin());
        int number = -1;
        const auto arrival = take(datagram.descriptors, &number);
        datagram.descriptors.clear();
        auto request = MakeReceivedMessage(buffer,
                                           datagram.bytes.size(),
                                           arrival,
                                           number,
                                           {.localPort = port_,
                                            .replyRoute = MACH_PORT_NULL,
                                            .sequenceNumber = connection.sequenceNumber++,
                                            .sender = &connection.sender});
        ReplyMessage reply;
        // The callout may end this source; the connection that waits for the answer stays till
        // then.
        Connection answered = connection;
        callout_(request, reply, context_);
        if (request.descriptor != -1) {
            CloseDescriptor(request.descriptor);
        }
        if (!request.memory.empty()) {
            throw ContractBroken("memory that a request brought is still there after its reply");
        }
        send(isValid() ? connection : answered, DatagramOf(reply));
    }

    const mach_port_t port_;
    const MachMessageCallout callout_;
    const void* const context_;
    std::string service_;
    std::vector<Connection> connections_;
};

}  // namespace
}  // namespace sim

namespace platform {

std::shared_ptr<RunLoopSource> MachPortCreateRunLoopSource(mach_port_t port,
                                                           MachMessageCallout callout,
                                                           const void* context) {
    const sim::Port* const receiver = sim::FindPort(port);
    if (sim::CallFails("MachPortCreateRunLoopSource") || receiver == nullptr ||
        !receiver->hasReceive) {
        return nullptr;
    }
    return std::make_shared<sim::MessageSource>(port, callout, context);
}

}  // namespace platform
