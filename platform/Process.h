// The process itself: how it settles in, and how it is asked to leave.
#pragma once

#include <cstdint>
#include <functional>
#include <string_view>

namespace platform {

/// Called first in main: umask 022, broken pipes are errors and no signals, and as many
/// descriptors as the system lets us have.
void ProcessSettleIn();

/// The process's own user and group: whom the files belong to that it makes.
[[nodiscard]] std::uint32_t ProcessUserId();
[[nodiscard]] std::uint32_t ProcessGroupId();

/// `handler` runs on the current loop when the process is asked to end (SIGTERM, SIGINT).
void ProcessOnTerminationRequest(std::function<void()> handler);

/// Ends a process that cannot start: says why in one line at error level, exit status 1.
[[noreturn]] void ProcessRefuseToStart(const char* format, std::string_view argument);

}  // namespace platform
