// Waiting for a result that the service pushes to the telephony daemon instead of replying it.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "tools/NamedPort.h"
#include "tools/lfhelper/Subcommands.h"

namespace lfhelper {

struct PushedResult {
    /// The telephony daemon's port at which it arrives.
    std::string_view port;
    int secondsMax = 10;
    /// Makes the request that brings the result about. Its answer is that of the command unless it
    /// is a success.
    Request ask;
    /// Looks at one message that arrived, and answers it if its sender waits. Gives the command's
    /// answer when nothing more has to come.
    std::function<std::optional<Answer>(tools::NamedPort& port, const tools::PortMessage& message)>
        take;
};

/// Owns the port in the telephony daemon's place, asks, says on standard error that it waits, and
/// waits. While somebody else owns the port nothing is asked: the problem of the answer says so
/// (exit status 3), as it does when the time is over (1).
[[nodiscard]] Answer AwaitPushedResult(LFMobileHelper* helper, const PushedResult& result);

}  // namespace lfhelper
