// A socket that brings requests and takes their replies, one datagram each, in order.
#pragma once

#include <sys/socket.h>

#include <cstddef>
#include <cstdint>
#include <memory>

#include "platform/MachCarriage.h"
#include "platform/linux/EventLoop.h"

namespace platform {

class MessageSource : public EventSource {
public:
    /// Who answers. All sources that are served alike share one, which outlives them.
    struct Receiver {
        MachMessageCallout callout = nullptr;
        const void* context = nullptr;

        bool operator==(const Receiver&) const = default;
    };

    struct Service {
        mach_port_t port = MACH_PORT_NULL;
        const Receiver* receiver = nullptr;
    };

    MessageSource(int descriptor, const Service& service);
    ~MessageSource() override;
    MessageSource(const MessageSource&) = delete;
    MessageSource& operator=(const MessageSource&) = delete;

    void ready(std::uint32_t events) final;

protected:
    [[nodiscard]] mach_port_t port() const { return port_; }

    /// The socket is of no more use: close it. The source is out of the loop already.
    virtual void closeSocket() = 0;

    [[nodiscard]] virtual const AuditToken& sender() const { return kUnknownSender; }

    /// Whether a reply that has left ends the conversation.
    [[nodiscard]] virtual bool isLastReply(const ReplyMessage& /*reply*/) const { return false; }

private:
    class Outgoing;

    enum class Step : std::uint8_t { kGoOn, kWait, kClose };

    [[nodiscard]] Step serveOne();
    [[nodiscard]] Step answer(std::size_t arrived, DescriptorArrival arrival, int descriptor);
    [[nodiscard]] Step sendOrKeep(Outgoing&& reply);
    void close();

    const mach_port_t port_;
    std::uint32_t sequenceNumber_ = 0;
    const Receiver* const receiver_;
    /// A reply that did not fit. This client's requests wait until it reads; nobody else notices.
    std::unique_ptr<Outgoing> pending_;
};

}  // namespace platform
