#include "Helper/Shared/Server/CheckInProtocol.h"

#include <cstddef>
#include <cstdint>

#include "Helper/Shared/Server/HelperServerUtils.h"
#include "Helper/Shared/Server/MessageLayouts.h"

using namespace platform;

namespace {

constexpr std::size_t kOffsetOfTrailer = kCheckInRequestSize;
constexpr std::uint32_t kTrailerFormat0 = 0;
constexpr std::uint32_t kSmallestTrailerWithoutToken = 31;

bool IsMalformed(std::span<const std::byte> bytes, const MachMsgHeader& header) {
    return (header.bits & MACH_MSGH_BITS_COMPLEX) == 0 || header.size != kCheckInRequestSize ||
           Load<std::uint32_t>(bytes, kOffsetOfDescriptorCount) != 1;
}

/// A moved send right in a port descriptor; the 16 bits of padding before them are anybody's.
bool IsMovedSendRight(std::span<const std::byte> bytes) {
    return Load<std::uint8_t>(bytes, kOffsetOfPortDisposition) ==
               static_cast<std::uint8_t>(MachMsgType::kMoveSend) &&
           Load<std::uint8_t>(bytes, kOffsetOfDescriptorType) ==
               static_cast<std::uint8_t>(DescriptorType::kPort);
}

kern_return_t CheckIn(ReceivedMessage& request, mach_port_t* privatePort) {
    if (const auto code = MachMessageAccept(request); code != KERN_SUCCESS) {
        return code;
    }
    return server_LFMobileHelperCheckIn(
        request.header().localPort,
        Load<mach_port_t>(request.bytes, kOffsetOfDescriptor),
        privatePort,
        Load<AuditToken>(request.bytes, kOffsetOfTrailer + kOffsetOfTrailerToken));
}

void SetPortReply(ReplyMessage& reply, mach_port_t port) {
    auto header = reply.header();
    header.bits |= MACH_MSGH_BITS_COMPLEX;
    header.size = kCheckInReplySize;
    reply.setHeader(header);
    Store(reply.bytes, kOffsetOfDescriptorCount, std::uint32_t{1});
    Store(reply.bytes, kOffsetOfDescriptor, port);
    Store(reply.bytes, kOffsetOfDescriptor + 4, std::uint32_t{0});  // pad1
    Store(reply.bytes, kOffsetOfDescriptor + 8, std::uint16_t{0});  // pad2
    Store(reply.bytes, kOffsetOfPortDisposition, MachMsgType::kCopySend);
    Store(reply.bytes, kOffsetOfDescriptorType, DescriptorType::kPort);
}

void CheckInStub(ReceivedMessage& request, ReplyMessage& reply) {
    const auto bytes = request.bytes;
    if (IsMalformed(bytes, request.header())) {
        MigSetReturnCode(reply, MIG_BAD_ARGUMENTS);
        return;
    }
    if (!IsMovedSendRight(bytes)) {
        MigSetReturnCode(reply, MIG_TYPE_ERROR);
        return;
    }
    if (Load<std::uint32_t>(bytes, kOffsetOfTrailer) != kTrailerFormat0) {
        // Into the request, not into the reply: the generator has it so, and the reply leaves with
        // the code that the dispatcher preset.
        Store(bytes, kOffsetOfReturnCode, MIG_TRAILER_ERROR);
        return;
    }
    if (Load<std::uint32_t>(bytes, kOffsetOfTrailer + 4) <= kSmallestTrailerWithoutToken) {
        MigSetReturnCode(reply, MIG_TRAILER_ERROR);
        return;
    }
    mach_port_t privatePort = MACH_PORT_NULL;
    if (const auto code = CheckIn(request, &privatePort); code != KERN_SUCCESS) {
        MigSetReturnCode(reply, code);
        return;
    }
    SetPortReply(reply, privatePort);
}

MigStub CheckInServerRoutine(const MachMsgHeader& request) {
    return request.id == kCheckInId ? CheckInStub : nullptr;
}

}  // namespace

constinit const MigSubsystem kCheckInSubsystem{
    .server = CheckInServerRoutine,
    .firstId = kCheckInId,
    .endId = kCheckInId + 1,
    .declaredMaxRequestSize = kCheckInRequestSize,
};
