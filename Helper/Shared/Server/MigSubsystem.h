// A subsystem: numbered routines behind one port, each with a stub that answers its messages.
#pragma once

#include <cstdint>
#include <memory>

#include "platform/MachMessage.h"
#include "platform/RunLoop.h"

/// Checks a request, calls the routine and fills the reply, which the dispatcher has preset.
using MigStub = void (*)(platform::ReceivedMessage& request, platform::ReplyMessage& reply);

struct MigSubsystem {
    /// The stub for a message, or null when the subsystem has no such routine.
    MigStub (*server)(const platform::MachMsgHeader& request) = nullptr;
    std::int32_t firstId = 0;
    std::int32_t endId = 0;
    /// As declared by the interface; no buffer is sized by it.
    std::uint32_t declaredMaxRequestSize = 0;
};

/// Answers one message: presets the reply with MIG_BAD_ID, runs the stub if there is one, and
/// destroys what the request brought when the reply's code is not success.
void MigDispatch(const MigSubsystem& subsystem,
                 platform::ReceivedMessage& request,
                 platform::ReplyMessage& reply);

/// A run-loop source that serves the subsystem on a port. Null when it cannot be made.
[[nodiscard]] std::shared_ptr<platform::RunLoopSource> MigCreateRunLoopSource(
    const MigSubsystem& subsystem, platform::mach_port_t port);

/// Makes the reply the plain error reply with this code.
void MigSetReturnCode(platform::ReplyMessage& reply, platform::kern_return_t code);

/// Puts the NDR record where a simple reply has it.
void MigSetNdrRecord(platform::ReplyMessage& reply);
