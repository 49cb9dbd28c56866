// The switch of the radio manager's logging.
#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/RadioManager.h"
#include "platform/SystemLog.h"

kern_return_t server_LFMobileHelperSetRadioManagerLogging(mach_port_t /*port*/,
                                                          std::int32_t isEnabled) {
    platform::RadioManagerSetLogToFile(isEnabled != 0);
    // The number as it came, so that the log tells what a client sent.
    platform::SystemLog(
        platform::SystemLogPriority::kError, "Enabling wireless radio manager logs: %d", isEnabled);
    return platform::KERN_SUCCESS;
}
