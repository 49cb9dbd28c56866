// The port space: the names of this process, and the sockets behind them.
#pragma once

#include <cstdint>
#include <deque>
#include <mutex>
#include <vector>

#include "platform/MachPort.h"
#include "platform/linux/OwnedFd.h"

namespace platform {

/// Process-wide. A name is an index and the number of times that the index was given out, so it
/// comes again only after 4,095 others.
class PortSpace {
public:
    static PortSpace& shared();

    /// A port of ours: we receive on one end, the other one waits to be given away.
    [[nodiscard]] kern_return_t addReceiveRight(OwnedFd receive, OwnedFd peer, mach_port_t* name);

    /// A right that came from somewhere else; without a name left it stays with the caller.
    [[nodiscard]] kern_return_t addSendRight(OwnedFd&& send, mach_port_t* name);

    [[nodiscard]] kern_return_t makeSend(mach_port_t name);
    kern_return_t dropReceive(mach_port_t name);
    kern_return_t dropSend(mach_port_t name);

    /// The socket to receive on, or to watch a send right by; -1 when there is none. It stays the
    /// space's own.
    [[nodiscard]] int receiveSocket(mach_port_t name);
    [[nodiscard]] int sendSocket(mach_port_t name);

    /// The peer's end of a port of ours, which leaves with a message. Our send right is
    /// bookkeeping from then on.
    [[nodiscard]] OwnedFd takePeer(mach_port_t name);

    /// Closes the receiving socket and keeps the right: a port that fell silent.
    void silence(mach_port_t name);

private:
    struct Slot {
        OwnedFd receive;
        OwnedFd send;
        std::uint16_t generation = 1;
        std::uint16_t sendRights : 14 = 0;
        std::uint16_t hasReceive : 1 = 0;
        std::uint16_t isTaken : 1 = 0;
    };

    static_assert(sizeof(Slot) == 12, "a port costs twelve bytes");

    [[nodiscard]] Slot* find(mach_port_t name);

    /// The slot of a name with a right of that kind. KERN_INVALID_NAME, KERN_INVALID_RIGHT.
    [[nodiscard]] kern_return_t find(mach_port_t name, MachPortRight right, Slot** slot);
    [[nodiscard]] kern_return_t takeSlot(Slot** slot, mach_port_t* name);
    void freeIfUnused(Slot& slot);

    std::mutex lock_;
    std::vector<Slot> slots_;
    std::deque<std::uint32_t> freeSlots_;  // the longest unused one first
};

}  // namespace platform
