// The cellular heartbeat.
#include "Helper/Shared/Server/RequestProtocol.h"

kern_return_t server_LFMobileHelperSetHeartbeatEnabled(mach_port_t /*port*/,
                                                       std::int32_t /*isEnabled*/) {
    return platform::KERN_NOT_SUPPORTED;
}
