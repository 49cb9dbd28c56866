// Voicemail tokens and the subscription query.
#include "Helper/Shared/Server/RequestProtocol.h"

kern_return_t server_LFMobileHelperSetVoicemailToken(mach_port_t /*port*/, String256& /*token*/) {
    return platform::KERN_NOT_SUPPORTED;
}

kern_return_t server_LFMobileHelperSetVoicemailTokenForKey(mach_port_t /*port*/,
                                                           String256& /*key*/,
                                                           String256& /*token*/) {
    return platform::KERN_NOT_SUPPORTED;
}

kern_return_t server_LFMobileHelperClearVoicemailToken(mach_port_t /*port*/) {
    return platform::KERN_NOT_SUPPORTED;
}

kern_return_t server_LFMobileHelperRemoveAllVoicemailRecords(mach_port_t /*port*/) {
    return platform::KERN_NOT_SUPPORTED;
}

kern_return_t server_LFMobileHelperCopyVoicemailTokenForKey(mach_port_t /*port*/,
                                                            String256& /*key*/,
                                                            OutString<256>& /*token*/) {
    return platform::KERN_NOT_SUPPORTED;
}

kern_return_t server_LFMobileHelperCopyVoicemailToken(mach_port_t /*port*/,
                                                      OutString<256>& /*token*/) {
    return platform::KERN_NOT_SUPPORTED;
}

kern_return_t server_LFMobileHelperIsVoicemailSubscribed(mach_port_t /*port*/,
                                                         std::int32_t& /*isSubscribed*/) {
    return platform::KERN_NOT_SUPPORTED;
}
