// The server record of the process: its clients, its holds and its idle exit.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string_view>

#include "Helper/Shared/Server/MigSubsystem.h"
#include "Helper/Shared/Server/ServerPortTable.h"
#include "Helper/Shared/Server/SortedTable.h"
#include "platform/MachPort.h"
#include "platform/RunLoop.h"

/// One per process, from MobileHelperServerCreate to MobileHelperServerDestroy.
struct MobileHelperServer {
    platform::mach_port_t servicePort = platform::MACH_PORT_NULL;
    std::shared_ptr<platform::RunLoopSource> serviceSource;
    platform::RunLoop* runLoop = nullptr;               ///< recorded when the run starts
    std::shared_ptr<platform::RunLoopTimer> idleTimer;  ///< null when not armed
    std::int32_t fd = -1;  ///< nothing writes it but creation and teardown
    /// From the object that wraps a client's watch port to the client's private port.
    SortedTable<std::shared_ptr<platform::MachPort>, platform::mach_port_t> clients;
    /// From a private port to the source that serves it.
    SortedTable<platform::mach_port_t, std::shared_ptr<platform::RunLoopSource>> clientSources;
    /// Guards holdMask, stopRequested, idleTimer and both tables; taken before ServerPortTable's.
    std::mutex lock;
    std::mutex spareLock;  ///< never locked
    const MigSubsystem* requestSubsystem = nullptr;
    std::uint32_t holdMask = 0;                    ///< one bit for each outstanding hold
    std::atomic<std::uint32_t> stopRequested = 0;  ///< set once; read without the lock
    std::function<bool()> idleHandler;             ///< true while something else keeps us busy
};

/// Checks in the service and attaches the check-in subsystem to it. Null, with an error line, when
/// the service cannot be had. The idle timer is not armed: without a client the server runs on.
[[nodiscard]] MobileHelperServer* MobileHelperServerCreate(std::string_view serviceName,
                                                           const MigSubsystem& requestSubsystem);

/// Has the idle timer ask `handler` whether to stay. Does nothing without server or handler.
void MobileHelperServerSetIdleHandler(MobileHelperServer* server, std::function<bool()> handler);

/// Serves on the current run loop until stopped, and returns the last result of the loop; kNotRun
/// when the stop had been requested before.
platform::RunLoopResult MobileHelperServerRun(MobileHelperServer* server);

/// From any thread. Returns 0.
int MobileHelperServerStop(MobileHelperServer* server);

/// Removes all clients and retires the record, whose memory stays: queues may still release holds
/// on it. The idle timer is left: the process ends right after.
void MobileHelperServerDestroy(MobileHelperServer* server);

/// Keeps the process alive until the token is released; cancels a pending idle exit. From any
/// thread. A token is one set bit; the 33rd concurrent hold gets the first one's again, on purpose.
[[nodiscard]] std::uint32_t ServerHoldAcquire(MobileHelperServer* server);

/// False, and nothing changes, for a token that is not one set bit. The last hold arms the idle
/// timer when no client is left. A bit that is not held is not noticed. From any thread.
bool ServerHoldRelease(MobileHelperServer* server, std::uint32_t token);

/// Admits a client whose sender holds the entitlement: `*privatePort` becomes a port of its own,
/// and the server watches `watchPort`, which it owns on success.
/// 35 not entitled, 5 no source or a dead watch port, or the code of the port operations.
[[nodiscard]] platform::kern_return_t server_LFMobileHelperCheckIn(
    platform::mach_port_t servicePort,
    platform::mach_port_t watchPort,
    platform::mach_port_t* privatePort,
    const platform::AuditToken& auditToken);

/// Forgets a client and releases its ports, with the server's lock held. The object may be null.
void RemoveClient(platform::MachPort* watchPortObject,
                  platform::mach_port_t privatePort,
                  MobileHelperServer* server);

/// A client's watch port died. `info` is the server, or null to look it up by the port.
void MachPortInvalidationCallBack(platform::MachPort& watchPortObject, void* info);

/// Arms or cancels the pending idle exit, with the server's lock held.
void ArmIdleTimer(MobileHelperServer* server);
void CancelIdleTimer(MobileHelperServer* server);
