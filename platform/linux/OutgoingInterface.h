// Which network interface the kernel would send something by, and which of them are cellular.
#pragma once

#include <sys/socket.h>

#include <string>
#include <string_view>

namespace platform {

/// The name of the interface that packets to this address leave by, as the kernel's routing says
/// now; empty when no route leads there. An address that is bound to a source by its route, or to
/// an interface by its scope, is no exception.
[[nodiscard]] std::string OutgoingInterface(const sockaddr& address);

/// Told by its name (pdp_ip, wwan, rmnet), or by the type that sysfs gives. An interface that sysfs
/// says nothing of counts as one.
[[nodiscard]] bool IsCellular(const std::string& interface);

/// The rule behind it, for a name, the number in sysfs's "type" and the text of its "uevent".
[[nodiscard]] bool IsCellularKind(std::string_view name, int type, std::string_view event);

}  // namespace platform
