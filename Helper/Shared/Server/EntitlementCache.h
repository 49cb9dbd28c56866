// Which processes hold an entitlement, remembered for as long as they live.
#pragma once

#include <cstdint>
#include <string_view>

#include "platform/MachMessage.h"

/// True when the entitlement's value for the sender is the boolean true. Anything else, and any
/// failure to learn, is false. A yes is remembered per process id until that process exits.
[[nodiscard]] bool HasEntitlement(std::string_view entitlement,
                                  const platform::AuditToken& auditToken);
