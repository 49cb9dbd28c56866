// ServerPortTable: which server a port belongs to, for all ports of the process.
#pragma once

#include "platform/MachPort.h"

struct MobileHelperServer;

/// Makes the table, once per process; it is released when the process exits.
void ServerPortTableCreate();

/// Its lock is taken after the server's where both are held.
void ServerPortTableAdd(platform::mach_port_t port, MobileHelperServer* server);
void ServerPortTableRemove(platform::mach_port_t port);

/// The server that is registered for the port, or null. From any thread.
[[nodiscard]] MobileHelperServer* ServerForPort(platform::mach_port_t port);
