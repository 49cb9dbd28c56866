// The listening socket of a service: handed over by the service manager, or bound by us.
#pragma once

#include <string>
#include <string_view>

#include "platform/MachPort.h"
#include "platform/linux/OwnedFd.h"

namespace platform {

/// Where services are found; root's, mode 0755.
inline constexpr std::string_view kServiceDirectory = "/run/linefold";

/// The socket that the service manager handed over under this name (LISTEN_PID, LISTEN_FDS,
/// LISTEN_FDNAMES, as sd_listen_fds(3) has them); closed when there is none.
[[nodiscard]] OwnedFd TakeActivatedSocket(std::string_view serviceName);

/// Binds /run/linefold/<name> itself. Closed when somebody alive holds the service, or the path
/// cannot be had. The path goes when the process exits, unless somebody else has taken it.
[[nodiscard]] OwnedFd BindServiceSocket(std::string_view serviceName);

}  // namespace platform
