// The preference domains of the mobile user.
#include "Helper/Shared/Server/RequestProtocol.h"
#include "handlers/carrier/PathPolicy.h"
#include "handlers/carrier/PreferenceCaches.h"
#include "platform/PathAccess.h"
#include "platform/Preferences.h"
#include "platform/SystemLog.h"
#include "platform/Utf8.h"

using platform::SystemLog;
using platform::SystemLogPriority;

void FlushPreferenceCaches(std::string_view domain) {
    const auto identifier = platform::IsUtf8(domain) ? std::optional(domain) : std::nullopt;
    platform::PreferencesFlushCachesForIdentifier(identifier, platform::PreferencesUser::kAny);
}

kern_return_t server_LFMobileHelperRemovePreferenceDomain(mach_port_t /*port*/,
                                                          String1024& path,
                                                          String1024& domain) {
    path.forceTermination();
    domain.forceTermination();
    if (!domain.empty()) {
        SystemLog(SystemLogPriority::kNotice, "Removing domain: %s\n", domain.cString());
        FlushPreferenceCaches(domain.view());
    }
    // A refusal comes after the flush, which is not undone.
    if (!IsAllowedCarrierPath(path.cString())) {
        return platform::KERN_NO_ACCESS;
    }
    return platform::PathAccess(path.view()).remove() == 0 ? platform::KERN_SUCCESS
                                                           : platform::KERN_FAILURE;
}
