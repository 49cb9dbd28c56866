#include "Helper/Shared/Server/MigSubsystem.h"

#include "Helper/Shared/Server/MessageLayouts.h"

using namespace platform;

namespace {

void PresetReply(const MachMsgHeader& request, ReplyMessage& reply) {
    reply.setHeader({.size = kErrorReplySize, .id = ReplyId(request.id)});
    MigSetNdrRecord(reply);
    // A stub that sets no code must not read as success.
    MigSetReturnCode(reply, MIG_BAD_ID);
}

bool IsSuccess(const ReplyMessage& reply) {
    // Only success makes a reply complex, and then no return code stands in it.
    return (reply.header().bits & MACH_MSGH_BITS_COMPLEX) != 0 ||
           Load<kern_return_t>(reply.bytes, kOffsetOfReturnCode) == KERN_SUCCESS;
}

void DispatchCallout(ReceivedMessage& request, ReplyMessage& reply, const void* context) {
    MigDispatch(*static_cast<const MigSubsystem*>(context), request, reply);
}

}  // namespace

void MigDispatch(const MigSubsystem& subsystem, ReceivedMessage& request, ReplyMessage& reply) {
    PresetReply(request.header(), reply);
    if (const MigStub stub = subsystem.server(request.header()); stub != nullptr) {
        stub(request, reply);
    }
    if (IsSuccess(reply)) {
        MachMessageReleaseMemory(request);
    } else {
        MachMessageDestroy(request);
    }
}

std::shared_ptr<RunLoopSource> MigCreateRunLoopSource(const MigSubsystem& subsystem,
                                                      mach_port_t port) {
    return MachPortCreateRunLoopSource(port, DispatchCallout, &subsystem);
}

void MigSetReturnCode(ReplyMessage& reply, kern_return_t code) {
    Store(reply.bytes, kOffsetOfReturnCode, code);
}

void MigSetNdrRecord(ReplyMessage& reply) {
    Store(reply.bytes, kOffsetOfNdr, kNdrRecord);
}
