// The cellular heartbeat.
#include "Helper/Shared/Server/HelperServerUtils.h"
#include "Helper/Shared/Server/RequestProtocol.h"
#include "heartbeat/HeartbeatMonitor.h"

kern_return_t server_LFMobileHelperSetHeartbeatEnabled(mach_port_t port, std::int32_t isEnabled) {
    MobileHelperServer* const server = ServerForPort(port);
    const auto work = isEnabled != 0 ? HeartbeatStart : HeartbeatStop;
    TheHeartbeatMonitor().queue.async([work, server] { work(server); });
    return platform::KERN_SUCCESS;
}
