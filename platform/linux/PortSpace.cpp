#include "platform/linux/PortSpace.h"

#include <utility>

#include "platform/linux/DescriptorKind.h"

namespace platform {
namespace {

constexpr unsigned kIndexBits = 20;
constexpr std::uint32_t kIndexMask = (1U << kIndexBits) - 1;
constexpr std::uint16_t kGenerationMask = 0x0FFF;
constexpr std::size_t kMaxPorts = kIndexMask - 1;  // neither MACH_PORT_NULL nor MACH_PORT_DEAD
/// While fewer slots than this are free new ones are made, so that names come round slowly.
constexpr std::size_t kSlotsAhead = 16;

}  // namespace

PortSpace& PortSpace::shared() {
    static auto* const space = new PortSpace;  // ports outlive static objects
    return *space;
}

PortSpace::Slot* PortSpace::find(mach_port_t name) {
    const std::size_t index = (name & kIndexMask) - 1;
    if ((name & kIndexMask) == 0 || index >= slots_.size()) {
        return nullptr;
    }
    Slot& slot = slots_[index];
    return slot.isTaken && slot.generation == name >> kIndexBits ? &slot : nullptr;
}

kern_return_t PortSpace::takeSlot(Slot** slot, mach_port_t* name) {
    if (freeSlots_.size() < kSlotsAhead && slots_.size() < kMaxPorts) {
        freeSlots_.push_front(static_cast<std::uint32_t>(slots_.size()));
        slots_.emplace_back();
    } else if (freeSlots_.empty()) {
        return KERN_RESOURCE_SHORTAGE;
    }
    const std::uint32_t index = freeSlots_.front();
    freeSlots_.pop_front();
    *slot = &slots_[index];
    (*slot)->isTaken = 1;
    *name = static_cast<mach_port_t>((*slot)->generation) << kIndexBits | (index + 1);
    return KERN_SUCCESS;
}

void PortSpace::freeIfUnused(Slot& slot) {
    if (slot.hasReceive || slot.sendRights != 0) {
        return;
    }
    slot.receive.reset();
    // A send right without a receive right is a stranger's descriptor, and may be slow to close.
    CloseForeignDescriptor(std::move(slot.send));
    slot.isTaken = 0;
    slot.generation = static_cast<std::uint16_t>((slot.generation + 1) & kGenerationMask);
    freeSlots_.push_back(static_cast<std::uint32_t>(&slot - slots_.data()));
}

kern_return_t PortSpace::addReceiveRight(OwnedFd receive, OwnedFd peer, mach_port_t* name) {
    const std::lock_guard guard(lock_);
    Slot* slot = nullptr;
    if (const auto code = takeSlot(&slot, name); code != KERN_SUCCESS) {
        return code;
    }
    slot->receive = std::move(receive);
    slot->send = std::move(peer);
    slot->hasReceive = 1;
    return KERN_SUCCESS;
}

kern_return_t PortSpace::addSendRight(OwnedFd&& send, mach_port_t* name) {
    const std::lock_guard guard(lock_);
    Slot* slot = nullptr;
    if (const auto code = takeSlot(&slot, name); code != KERN_SUCCESS) {
        return code;
    }
    slot->send = std::move(send);
    slot->sendRights = 1;
    return KERN_SUCCESS;
}

kern_return_t PortSpace::find(mach_port_t name, MachPortRight right, Slot** slot) {
    *slot = find(name);
    if (*slot == nullptr) {
        return KERN_INVALID_NAME;
    }
    const bool isHeld =
        right == MachPortRight::kReceive ? (*slot)->hasReceive : (*slot)->sendRights != 0;
    return isHeld ? KERN_SUCCESS : KERN_INVALID_RIGHT;
}

kern_return_t PortSpace::makeSend(mach_port_t name) {
    const std::lock_guard guard(lock_);
    Slot* slot = nullptr;
    const kern_return_t code = find(name, MachPortRight::kReceive, &slot);
    if (code == KERN_SUCCESS) {
        ++slot->sendRights;
    }
    return code;
}

kern_return_t PortSpace::dropReceive(mach_port_t name) {
    const std::lock_guard guard(lock_);
    Slot* slot = nullptr;
    const kern_return_t code = find(name, MachPortRight::kReceive, &slot);
    if (code == KERN_SUCCESS) {
        slot->hasReceive = 0;
        slot->receive.reset();
        slot->send.reset();
        freeIfUnused(*slot);
    }
    return code;
}

kern_return_t PortSpace::dropSend(mach_port_t name) {
    const std::lock_guard guard(lock_);
    Slot* slot = nullptr;
    const kern_return_t code = find(name, MachPortRight::kSend, &slot);
    if (code == KERN_SUCCESS) {
        --slot->sendRights;
        freeIfUnused(*slot);
    }
    return code;
}

int PortSpace::receiveSocket(mach_port_t name) {
    const std::lock_guard guard(lock_);
    Slot* const slot = find(name);
    return slot != nullptr && slot->hasReceive ? slot->receive.get() : -1;
}

int PortSpace::sendSocket(mach_port_t name) {
    const std::lock_guard guard(lock_);
    Slot* const slot = find(name);
    return slot != nullptr && slot->sendRights != 0 ? slot->send.get() : -1;
}

OwnedFd PortSpace::takePeer(mach_port_t name) {
    const std::lock_guard guard(lock_);
    Slot* const slot = find(name);
    return slot != nullptr && slot->hasReceive ? std::move(slot->send) : OwnedFd();
}

void PortSpace::silence(mach_port_t name) {
    const std::lock_guard guard(lock_);
    if (Slot* const slot = find(name); slot != nullptr) {
        slot->receive.reset();
    }
}

}  // namespace platform
