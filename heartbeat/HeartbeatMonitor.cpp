#include "heartbeat/HeartbeatMonitor.h"

#include <cstdlib>

#include "Helper/Shared/Server/HelperServerUtils.h"
#include "heartbeat/EchoProbe.h"
#include "platform/Assertion.h"
#include "platform/BuildConstants.h"

namespace {

constexpr double kInterval = 2.0;
constexpr double kLeeway = 5e-6;

/// Made with its queue when the process starts. Its reference to the queue goes with the process:
/// dropped earlier, it would be taken from under the thread that may just read it.
HeartbeatMonitor& theMonitor = []() -> HeartbeatMonitor& {
    (void)std::atexit(HeartbeatCleanUp);  // without it the process ends just as well
    return *new HeartbeatMonitor;
}();

void Beat() {
    // The traffic is the purpose: what became of the request is of no interest to anybody.
    (void)SendEchoProbe(platform::kHeartbeatHost);
}

void CancelTimer() {
    if (theMonitor.timer != nullptr) {
        theMonitor.timer->cancel();
        theMonitor.timer = nullptr;
    }
}

}  // namespace

HeartbeatMonitor& TheHeartbeatMonitor() {
    return theMonitor;
}

void HeartbeatStart(MobileHelperServer* server) {
    PLATFORM_ASSERT(theMonitor.queue.isCurrent());
    if (server == nullptr) {
        return;
    }
    theMonitor.server = server;
    CancelTimer();
    // It is due from now on, and what is due waits until this task is done: the first beat of the
    // timer follows right behind the one made here.
    theMonitor.timer = theMonitor.queue.repeat(0, kInterval, kLeeway, Beat);
    Beat();
    theMonitor.hold = ServerHoldAcquire(server);
}

void HeartbeatStop(MobileHelperServer* server) {
    PLATFORM_ASSERT(theMonitor.queue.isCurrent());
    CancelTimer();
    if (server != nullptr) {
        ServerHoldRelease(server, theMonitor.hold);
    }
    theMonitor.hold = 0;
}

void HeartbeatCleanUp() {
    // The server is read on the queue, where it is written.
    theMonitor.queue.async([] { HeartbeatStop(theMonitor.server); });
}
