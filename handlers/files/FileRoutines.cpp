// Directory, copy and archive operations.
#include "Helper/Shared/Server/RequestProtocol.h"

kern_return_t server_LFMobileHelperCopyFile(mach_port_t /*port*/,
                                            String256& /*sourceDirectory*/,
                                            String256& /*destinationDirectory*/,
                                            String256& /*name*/,
                                            std::int32_t& /*isDone*/) {
    return platform::KERN_NOT_SUPPORTED;
}

kern_return_t server_LFMobileHelperCopyLogDirectory(mach_port_t /*port*/,
                                                    String256& /*source*/,
                                                    std::int32_t& /*isDone*/) {
    return platform::KERN_NOT_SUPPORTED;
}

kern_return_t server_LFMobileHelperMoveDirectory(mach_port_t /*port*/,
                                                 String256& /*source*/,
                                                 String256& /*destinationDirectory*/,
                                                 String256& /*name*/,
                                                 std::int32_t& /*isDone*/) {
    return platform::KERN_NOT_SUPPORTED;
}

kern_return_t server_LFMobileHelperCopyArchive(mach_port_t /*port*/,
                                               String256& /*source*/,
                                               String256& /*destination*/,
                                               std::int32_t& /*isDone*/) {
    return platform::KERN_NOT_SUPPORTED;
}

kern_return_t server_LFMobileHelperLoadPlistFile(mach_port_t /*port*/,
                                                 String256& /*path*/,
                                                 OutOfLineData& /*data*/) {
    return platform::KERN_NOT_SUPPORTED;
}
