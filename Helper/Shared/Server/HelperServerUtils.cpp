#include "Helper/Shared/Server/HelperServerUtils.h"

#include <unistd.h>

#include <bit>
#include <limits>
#include <utility>
#include <vector>

#include "Helper/Shared/Server/CheckInProtocol.h"
#include "Helper/Shared/Server/EntitlementCache.h"
#include "platform/Assertion.h"
#include "platform/BuildConstants.h"
#include "platform/Log.h"

using namespace platform;

namespace {

constexpr std::string_view kAllowEntitlement = "com.vendra.Halvane.LinefoldHelper.allow";

/// Takes the service and serves the check-in on it; false leaves what was had in the record.
bool OpenService(MobileHelperServer& server, std::string_view serviceName) {
    if (bootstrap_check_in(serviceName, &server.servicePort) != KERN_SUCCESS) {
        return false;
    }
    ServerPortTableAdd(server.servicePort, &server);
    server.serviceSource = MigCreateRunLoopSource(kCheckInSubsystem, server.servicePort);
    if (server.serviceSource == nullptr) {
        return false;
    }
    RunLoop::current().addSource(server.serviceSource);
    return true;
}

/// The records of destroyed servers. A queue's thread may still come with a hold to take or release
/// while the process ends, so their memory stays; it serves the next server, if there is one.
std::vector<std::unique_ptr<MobileHelperServer>>& RetiredRecords() {
    static auto& records = *new std::vector<std::unique_ptr<MobileHelperServer>>;
    return records;
}

std::unique_ptr<MobileHelperServer> NewRecord() {
    if (RetiredRecords().empty()) {
        return std::make_unique<MobileHelperServer>();
    }
    auto record = std::move(RetiredRecords().back());
    RetiredRecords().pop_back();
    std::destroy_at(record.get());
    std::construct_at(record.get());
    return record;
}

void DropReceiveRight(mach_port_t port) {
    // Failing leaves nothing to release: the name is gone then.
    (void)mach_port_mod_refs(port, MachPortRight::kReceive, -1);
}

void IdleTimerFired(MobileHelperServer* server) {
    // A hold or a client would have cancelled the timer, so neither is looked at again.
    if (server == nullptr || (server->idleHandler && server->idleHandler())) {
        return;
    }
    MobileHelperServerStop(server);
}

}  // namespace

MobileHelperServer* MobileHelperServerCreate(std::string_view serviceName,
                                             const MigSubsystem& requestSubsystem) {
    ServerPortTableCreate();
    auto server = NewRecord();
    if (OpenService(*server, serviceName)) {
        server->requestSubsystem = &requestSubsystem;
        return server.release();
    }
    if (const auto port = std::exchange(server->servicePort, MACH_PORT_NULL);
        MachPortIsValid(port)) {
        ServerPortTableRemove(port);
        DropReceiveRight(port);
    }
    Log(LogLevel::kError, "unable to create server objects - out of resources");
    MobileHelperServerDestroy(server.release());
    return nullptr;
}

void MobileHelperServerSetIdleHandler(MobileHelperServer* server, std::function<bool()> handler) {
    if (server != nullptr && handler) {
        server->idleHandler = std::move(handler);
    }
}

RunLoopResult MobileHelperServerRun(MobileHelperServer* server) {
    server->runLoop = &RunLoop::current();
    auto result = RunLoopResult::kNotRun;
    while (server->stopRequested == 0) {
        result = server->runLoop->run(std::numeric_limits<double>::max(), AfterSource::kReturn);
    }
    return result;
}

int MobileHelperServerStop(MobileHelperServer* server) {
    {
        const std::lock_guard guard(server->lock);
        server->stopRequested = 1;
    }
    if (server->runLoop != nullptr) {
        server->runLoop->stop();
    }
    return 0;
}

void MobileHelperServerDestroy(MobileHelperServer* server) {
    server->idleHandler = nullptr;
    if (server->serviceSource != nullptr) {
        server->serviceSource->invalidate();
        server->serviceSource = nullptr;
    }
    if (MachPortIsValid(server->servicePort)) {
        ServerPortTableRemove(server->servicePort);
        DropReceiveRight(server->servicePort);
    }
    if (server->fd != -1) {
        close(std::exchange(server->fd, -1));
    }
    {
        const std::lock_guard guard(server->lock);
        while (!server->clients.empty()) {
            const auto [watchPortObject, privatePort] = server->clients.front();
            RemoveClient(watchPortObject.get(), privatePort, server);
        }
    }
    RetiredRecords().emplace_back(server);
}

std::uint32_t ServerHoldAcquire(MobileHelperServer* server) {
    const std::lock_guard guard(server->lock);
    // With all 32 bits taken the shift wraps and the first bit is handed out again. Callers live
    // with the alias; a 33rd token of its own has no bit to be.
    const auto heldFromBitZero = static_cast<std::uint32_t>(std::countr_one(server->holdMask));
    const std::uint32_t token = 1U << (heldFromBitZero % 32);
    server->holdMask |= token;
    CancelIdleTimer(server);
    return token;
}

bool ServerHoldRelease(MobileHelperServer* server, std::uint32_t token) {
    if (!std::has_single_bit(token)) {
        return false;
    }
    const std::lock_guard guard(server->lock);
    server->holdMask &= ~token;
    if (server->holdMask == 0 && server->clients.empty()) {
        ArmIdleTimer(server);
    }
    return true;
}

void ArmIdleTimer(MobileHelperServer* server) {
    if (server->idleTimer != nullptr) {
        return;
    }
    server->idleTimer = RunLoopTimer::create(AbsoluteTimeGetCurrent() + kIdleInterval,
                                             kIdleInterval,
                                             [server] { IdleTimerFired(server); });
    if (server->idleTimer == nullptr) {
        // Better to leave now and be started again than to live on without a way to leave.
        server->lock.unlock();
        MobileHelperServerStop(server);
        server->lock.lock();
        return;
    }
    if (server->runLoop != nullptr) {
        server->runLoop->addTimer(server->idleTimer);
    }
}

void CancelIdleTimer(MobileHelperServer* server) {
    if (server->idleTimer != nullptr) {
        server->idleTimer->invalidate();
        server->idleTimer = nullptr;
    }
}

kern_return_t server_LFMobileHelperCheckIn(mach_port_t servicePort,
                                           mach_port_t watchPort,
                                           mach_port_t* privatePort,
                                           const AuditToken& auditToken) {
    if (!HasEntitlement(kAllowEntitlement, auditToken)) {
        return KERN_INVALID_SECURITY;
    }
    MobileHelperServer* const server = ServerForPort(servicePort);

    mach_port_t port = MACH_PORT_NULL;
    if (const auto code = mach_port_allocate(MachPortRight::kReceive, &port);
        code != KERN_SUCCESS) {
        return code;
    }
    if (const auto code = mach_port_insert_right(port, MachMsgType::kMakeSend);
        code != KERN_SUCCESS) {
        DropReceiveRight(port);
        return code;
    }
    auto source = MigCreateRunLoopSource(*server->requestSubsystem, port);
    if (source == nullptr) {
        DropReceiveRight(port);
        mach_port_deallocate(port);
        return KERN_FAILURE;
    }
    auto watchPortObject = MachPort::create(watchPort, server);
    if (watchPortObject == nullptr) {
        source->invalidate();
        DropReceiveRight(port);
        mach_port_deallocate(port);
        return KERN_FAILURE;
    }
    ServerPortTableAdd(port, server);
    ServerPortTableAdd(watchPort, server);
    {
        const std::lock_guard guard(server->lock);
        server->clients.set(watchPortObject, port);
        server->clientSources.set(port, source);
    }
    RunLoop::current().addSource(source);

    // A watch port that is dead already removes the client again, here and now.
    watchPortObject->setInvalidationCallBack(MachPortInvalidationCallBack);
    auto result = KERN_FAILURE;
    if (watchPortObject->isValid()) {
        *privatePort = port;
        result = KERN_SUCCESS;
    }
    // The cancel also happens for a client that was dead on arrival, whose removal may just have
    // armed the timer. It is kept: the next client's end, or the next hold's, arms it again.
    const std::lock_guard guard(server->lock);
    CancelIdleTimer(server);
    return result;
}

void MachPortInvalidationCallBack(MachPort& watchPortObject, void* info) {
    auto* server = static_cast<MobileHelperServer*>(info);
    if (server == nullptr) {
        server = ServerForPort(watchPortObject.port());
    }
    PLATFORM_ASSERT(server);
    const std::lock_guard guard(server->lock);
    RemoveClient(&watchPortObject, server->clients.get(&watchPortObject), server);
    if (server->holdMask == 0 && server->clients.empty()) {
        ArmIdleTimer(server);
    }
}

void RemoveClient(MachPort* watchPortObject, mach_port_t privatePort, MobileHelperServer* server) {
    if (watchPortObject != nullptr) {
        watchPortObject->setInvalidationCallBack(nullptr);
        watchPortObject->invalidate();
        ServerPortTableRemove(watchPortObject->port());
        mach_port_deallocate(watchPortObject->port());
        server->clients.erase(watchPortObject);  // the last step: it may end the object
    }
    if (const auto source = server->clientSources.get(privatePort); source != nullptr) {
        source->invalidate();
        server->clientSources.erase(privatePort);
    }
    if (MachPortIsValid(privatePort)) {
        ServerPortTableRemove(privatePort);
        DropReceiveRight(privatePort);
        mach_port_deallocate(privatePort);
    }
}
