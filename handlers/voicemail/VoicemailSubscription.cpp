#include "handlers/voicemail/VoicemailSubscription.h"

#include <string>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/BuildConstants.h"
#include "platform/DynamicLibrary.h"

bool VoicemailSubscription::isSubscribed() {
    std::call_once(isLookedUp_, &VoicemailSubscription::lookUp, this);
    return function_ != nullptr && function_() != 0;
}

void VoicemailSubscription::lookUp() {
    const auto library = platform::DynamicLibrary::open(std::string(platform::kLibraryDirectory) +
                                                        "/libVisualVoicemail.so");
    function_ = library.function<IsSubscribed>("_MBSharedServiceIsSubscribed");
}

kern_return_t server_LFMobileHelperIsVoicemailSubscribed(mach_port_t /*port*/,
                                                         std::int32_t& isSubscribed) {
    static VoicemailSubscription subscription;
    isSubscribed = subscription.isSubscribed() ? 1 : 0;
    return platform::KERN_SUCCESS;
}
