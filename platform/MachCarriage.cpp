#include "platform/MachCarriage.h"

#include <cstring>

#include "platform/VirtualMemory.h"

namespace platform {
namespace {

bool IsComplex(const MachMsgHeader& header) {
    return (header.bits & MACH_MSGH_BITS_COMPLEX) != 0;
}

DescriptorType TypeOfDescriptor(std::span<const std::byte> bytes) {
    return static_cast<DescriptorType>(Load<std::uint8_t>(bytes, kOffsetOfDescriptorType));
}

/// A message carries a descriptor of ours only where it lies wholly inside the message.
bool BringsDescriptor(std::span<const std::byte> message, DescriptorType type, std::uint32_t end) {
    return message.size() >= end && IsComplex(Load<MachMsgHeader>(message, 0)) &&
           Load<std::uint32_t>(message, kOffsetOfDescriptorCount) == 1 &&
           TypeOfDescriptor(message) == type;
}

bool BringsPort(std::span<const std::byte> message) {
    return BringsDescriptor(message, DescriptorType::kPort, kPortDescriptorEnd);
}

bool BringsData(std::span<const std::byte> message) {
    return BringsDescriptor(message, DescriptorType::kOutOfLine, kOutOfLineDescriptorEnd);
}

/// Bytes that a message says ride behind it.
std::size_t AnnouncedInlineData(std::span<const std::byte> message, DescriptorArrival arrival) {
    if (arrival != DescriptorArrival::kNone || !BringsData(message)) {
        return 0;
    }
    const auto size = Load<std::uint32_t>(message, kOffsetOfOutOfLineSize);
    return size <= kMaxInlineData ? size : 0;
}

kern_return_t AcceptPort(ReceivedMessage& message) {
    if (message.arrival != DescriptorArrival::kOne) {
        return MIG_BAD_ARGUMENTS;
    }
    mach_port_t name = MACH_PORT_NULL;
    const kern_return_t result = AdoptPortDescriptor(message.descriptor, &name);
    if (result == KERN_SUCCESS) {
        message.descriptor = -1;
        Store(message.bytes, kOffsetOfDescriptor, name);
    }
    return result;
}

void StoreAddress(ReceivedMessage& message, const std::byte* address) {
    Store(message.bytes, kOffsetOfDescriptor, reinterpret_cast<std::uintptr_t>(address));
}

kern_return_t AcceptDataFromDescriptor(ReceivedMessage& message, std::uint32_t size) {
    void* memory = nullptr;
    if (vm_allocate(&memory, size) != KERN_SUCCESS) {
        return KERN_RESOURCE_SHORTAGE;
    }
    const std::span<std::byte> region(static_cast<std::byte*>(memory), size);
    const kern_return_t result = ReadMemoryDescriptor(message.descriptor, region);
    if (result != KERN_SUCCESS) {
        vm_deallocate(memory, size);
        return result;
    }
    message.memory = region;
    StoreAddress(message, region.data());
    return KERN_SUCCESS;
}

kern_return_t AcceptData(ReceivedMessage& message) {
    const auto size = Load<std::uint32_t>(message.bytes, kOffsetOfOutOfLineSize);
    if (size > kMaxRequestData) {
        return KERN_RESOURCE_SHORTAGE;
    }
    if (message.arrival == DescriptorArrival::kOne) {
        return size == 0 ? MIG_BAD_ARGUMENTS : AcceptDataFromDescriptor(message, size);
    }
    if (message.inlineData.size() != size) {
        return MIG_BAD_ARGUMENTS;
    }
    StoreAddress(message, message.inlineData.data());
    return KERN_SUCCESS;
}

}  // namespace

ReceivedMessage MakeReceivedMessage(std::span<std::byte> buffer,
                                    std::size_t arrived,
                                    DescriptorArrival arrival,
                                    int descriptor,
                                    const MessageOrigin& origin) {
    const bool wasCut = arrived > kReceiveCapacity;
    const auto datagram = buffer.first(wasCut ? kReceiveCapacity : arrived);
    auto header = Load<MachMsgHeader>(datagram, 0);

    std::size_t dataSize = 0;
    const bool claimFits = header.size >= sizeof header && header.size <= datagram.size();
    if (claimFits) {
        dataSize = AnnouncedInlineData(datagram.first(header.size), arrival);
    }
    if (wasCut || !claimFits || header.size + dataSize != arrived) {
        header.size = static_cast<std::uint32_t>(arrived);
        dataSize = 0;
    }
    header.localPort = origin.localPort;
    header.remotePort = origin.replyRoute;
    header.voucherPort = MACH_PORT_NULL;
    Store(datagram, 0, header);

    // A message longer than the buffer keeps its true size and is refused by it: its trailer
    // only has to lie inside.
    const std::size_t messageSize = wasCut ? datagram.size() : header.size;
    const std::size_t trailerAt = (messageSize + 3) & ~std::size_t{3};
    const std::size_t end = trailerAt + sizeof(MachMsgAuditTrailer);
    if (dataSize != 0) {
        std::memmove(
            buffer.subspan(end, dataSize).data(), buffer.subspan(messageSize).data(), dataSize);
    }
    const auto message = datagram.first(messageSize);
    if (BringsPort(message)) {
        Store(message, kOffsetOfDescriptor, MACH_PORT_NULL);
    } else if (BringsData(message)) {
        Store(message, kOffsetOfDescriptor, std::uint64_t{0});
    }
    Store(buffer,
          trailerAt,
          MachMsgAuditTrailer{.sequenceNumber = origin.sequenceNumber,
                              .senderUser = audit_token_to_identity(*origin.sender).euid,
                              .senderGroup = audit_token_to_identity(*origin.sender).egid,
                              .token = *origin.sender});
    return {.bytes = buffer.first(end),
            .inlineData = buffer.subspan(end, dataSize),
            .memory = {},
            .arrival = arrival,
            .descriptor = descriptor};
}

kern_return_t MachMessageAccept(ReceivedMessage& message) {
    switch (message.arrival) {
        case DescriptorArrival::kTableFull:
            return KERN_RESOURCE_SHORTAGE;
        case DescriptorArrival::kSurplus:
            return MIG_BAD_ARGUMENTS;
        case DescriptorArrival::kNone:
        case DescriptorArrival::kOne:
            break;
    }
    const auto bytes = message.bytes.first(message.header().size);
    if (BringsPort(bytes)) {
        return AcceptPort(message);
    }
    if (BringsData(bytes)) {
        return AcceptData(message);
    }
    return message.arrival == DescriptorArrival::kNone ? KERN_SUCCESS : MIG_BAD_ARGUMENTS;
}

void MachMessageReleaseMemory(ReceivedMessage& message) {
    if (!message.memory.empty()) {
        vm_deallocate(message.memory.data(), message.memory.size());
        message.memory = {};
    }
}

void MachMessageDestroy(ReceivedMessage& message) {
    MachMessageReleaseMemory(message);
    const auto header = message.header();
    if (header.size <= message.bytes.size() && BringsPort(message.bytes.first(header.size))) {
        // Releasing a name that a handler released already is harmless.
        mach_port_deallocate(Load<mach_port_t>(message.bytes, kOffsetOfDescriptor));
        Store(message.bytes, kOffsetOfDescriptor, MACH_PORT_NULL);
    }
}

}  // namespace platform
