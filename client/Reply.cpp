#include "client/Reply.h"

#include <array>

#include "client/linefold_helper.h"

namespace linefold_client {
namespace {

using platform::Load;

using Bytes = std::span<const std::byte>;

bool HasNdrRecord(Bytes bytes, std::size_t offset) {
    return Load<std::array<std::uint8_t, 8>>(bytes, offset) == platform::kNdrRecord;
}

/// Header, return code and arrival of a reply that carries nothing but an inline value.
bool IsSimpleReply(Bytes bytes, const IncomingMessage& incoming) {
    return bytes.size() >= platform::kErrorReplySize &&
           Load<platform::MachMsgHeader>(bytes, 0).bits == 0 &&
           Load<platform::MachMsgHeader>(bytes, 0).size == bytes.size() &&
           HasNdrRecord(bytes, platform::kOffsetOfNdr) &&
           incoming.arrival == Arrival::kNothingBeside;
}

bool IsComplexReply(Bytes bytes, std::uint32_t messageSize, platform::DescriptorType type) {
    return bytes.size() >= messageSize &&
           Load<platform::MachMsgHeader>(bytes, 0).bits == platform::MACH_MSGH_BITS_COMPLEX &&
           Load<platform::MachMsgHeader>(bytes, 0).size == messageSize &&
           Load<std::uint32_t>(bytes, platform::kOffsetOfDescriptorCount) == 1 &&
           Load<platform::DescriptorType>(bytes, platform::kOffsetOfDescriptorType) == type;
}

bool IsReplyTo(std::int32_t requestId, Bytes bytes) {
    if (bytes.size() < sizeof(platform::MachMsgHeader)) {
        return false;
    }
    const auto header = Load<platform::MachMsgHeader>(bytes, 0);
    return header.id == ReplyId(requestId) && header.remotePort == platform::MACH_PORT_NULL &&
           header.localPort == platform::MACH_PORT_NULL &&
           header.voucherPort == platform::MACH_PORT_NULL;
}

/// The size stands three times: in the descriptor, in the count behind it, and in what arrived.
bool ParseData(Bytes bytes, const IncomingMessage& incoming, Reply& reply) {
    const auto size = Load<std::uint32_t>(bytes, platform::kOffsetOfOutOfLineSize);
    if (Load<std::uint32_t>(bytes, platform::kOffsetOfOutOfLineFlags) != kOutOfLineReplyFlags ||
        !HasNdrRecord(bytes, kOffsetOfOutOfLineReplyNdr) ||
        Load<std::uint32_t>(bytes, kOffsetOfOutOfLineReplyCount) != size) {
        return false;
    }
    const Bytes behind = bytes.subspan(kOutOfLineReplySize);
    reply.dataSize = size;
    if (incoming.arrival == Arrival::kOneDescriptor) {
        return behind.empty() && size != 0 && size <= platform::kMaxReplyData;
    }
    reply.inlineData = behind;
    return behind.size() == size && size <= platform::kMaxInlineData;
}

bool ParseSimple(const RoutineLayout& layout, Bytes bytes, Reply& reply) {
    reply.returnCode = Load<std::int32_t>(bytes, platform::kOffsetOfReturnCode);
    if (reply.returnCode != LF_MOBILE_HELPER_SUCCESS) {
        return bytes.size() == platform::kErrorReplySize;
    }
    reply.value = bytes.subspan(kOutValueOffset);
    return layout.reply != Field::kData && bytes.size() == layout.replySize;
}

/// Bytes that arrived; none when the message was cut, which no valid reply is.
Bytes ArrivedBytes(Bytes buffer, const IncomingMessage& incoming) {
    return incoming.size <= buffer.size() ? buffer.first(incoming.size) : Bytes{};
}

}  // namespace

std::int32_t ParseReply(const RoutineLayout& layout,
                        Bytes buffer,
                        const IncomingMessage& incoming,
                        Reply& reply) {
    reply = Reply{};
    if (incoming.arrival == Arrival::kTableFull) {
        return LF_MOBILE_HELPER_ERROR_NO_RESOURCES;
    }
    const Bytes bytes = ArrivedBytes(buffer, incoming);
    bool isValid = incoming.arrival != Arrival::kSurplusDescriptors && IsReplyTo(layout.id, bytes);
    if (isValid && IsSimpleReply(bytes, incoming)) {
        isValid = ParseSimple(layout, bytes, reply);
    } else if (isValid) {
        isValid =
            layout.reply == Field::kData &&
            IsComplexReply(bytes, kOutOfLineReplySize, platform::DescriptorType::kOutOfLine) &&
            ParseData(bytes, incoming, reply);
    }
    return isValid ? LF_MOBILE_HELPER_SUCCESS : LF_MOBILE_HELPER_ERROR_INVALID_REPLY;
}

std::int32_t ParseCheckInReply(Bytes buffer,
                               const IncomingMessage& incoming,
                               std::int32_t& returnCode) {
    if (incoming.arrival == Arrival::kTableFull) {
        return LF_MOBILE_HELPER_ERROR_NO_RESOURCES;
    }
    const Bytes bytes = ArrivedBytes(buffer, incoming);
    if (!IsReplyTo(kCheckInId, bytes)) {
        return LF_MOBILE_HELPER_ERROR_INVALID_REPLY;
    }
    if (IsSimpleReply(bytes, incoming)) {
        returnCode = Load<std::int32_t>(bytes, platform::kOffsetOfReturnCode);
        const bool isFailure =
            bytes.size() == platform::kErrorReplySize && returnCode != LF_MOBILE_HELPER_SUCCESS;
        return isFailure ? LF_MOBILE_HELPER_SUCCESS : LF_MOBILE_HELPER_ERROR_INVALID_REPLY;
    }
    const bool isPort = bytes.size() == kCheckInReplySize &&
                        IsComplexReply(bytes, kCheckInReplySize, platform::DescriptorType::kPort) &&
                        Load<platform::MachMsgType>(bytes, platform::kOffsetOfPortDisposition) ==
                            platform::MachMsgType::kCopySend &&
                        incoming.arrival == Arrival::kOneDescriptor &&
                        IsMessageSocket(incoming.descriptor.get());
    returnCode = LF_MOBILE_HELPER_SUCCESS;
    return isPort ? LF_MOBILE_HELPER_SUCCESS : LF_MOBILE_HELPER_ERROR_INVALID_REPLY;
}

}  // namespace linefold_client
