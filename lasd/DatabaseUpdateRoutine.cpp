// The check for newer service databases.
#include "Helper/Shared/Server/RequestProtocol.h"

kern_return_t server_LFMobileHelperCheckForDatabaseUpdate(mach_port_t /*port*/,
                                                          std::int32_t /*types*/) {
    return platform::KERN_NOT_SUPPORTED;
}
