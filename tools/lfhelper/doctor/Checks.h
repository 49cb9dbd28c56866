// The checks, in the order in which they are made. None changes anything.
#pragma once

#include "tools/lfhelper/doctor/Finding.h"

namespace lfhelper::doctor {

/// The socket of the service: there, a socket, root's, open to all.
[[nodiscard]] Findings CheckServiceSocket(const Subject& subject);

/// The group that the caller takes: it exists, and its file grants the entitlement.
[[nodiscard]] Findings CheckEntitlement(const Subject& subject);

/// The mobile user and the home.
[[nodiscard]] Findings CheckMobileUser(const Subject& subject);

/// The folders that the service works in.
[[nodiscard]] Findings CheckFolders(const Subject& subject);

/// What the heartbeat needs: interface, right to echo sockets, protocol.
[[nodiscard]] Findings CheckHeartbeat(const Subject& subject);

/// The platform's configuration.
[[nodiscard]] Findings CheckConfiguration(const Subject& subject);

/// The libraries that are loaded when they are needed.
[[nodiscard]] Findings CheckLibraries(const Subject& subject);

/// Whether the service answers. The last one: it takes the group for good.
[[nodiscard]] Findings CheckAnswer(const Subject& subject);

}  // namespace lfhelper::doctor
