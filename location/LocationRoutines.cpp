// Country code, civic address and WAN address.
#include "Helper/Shared/Server/RequestProtocol.h"

kern_return_t server_LFMobileHelperRequestCountryCodeFromLocation(mach_port_t /*port*/,
                                                                  double /*latitude*/,
                                                                  double /*longitude*/) {
    return platform::KERN_NOT_SUPPORTED;
}

kern_return_t server_LFMobileHelperCopyCountryCode(mach_port_t /*port*/,
                                                   OutString<64>& /*countryCode*/) {
    return platform::KERN_NOT_SUPPORTED;
}

kern_return_t server_LFMobileHelperRequestWanIPFromLocation(mach_port_t /*port*/) {
    return platform::KERN_NOT_SUPPORTED;
}
