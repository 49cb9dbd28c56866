// The links that select the active carrier and operator bundles.
#include "Helper/Shared/Server/RequestProtocol.h"
#include "handlers/carrier/PathPolicy.h"
#include "handlers/carrier/PreferenceCaches.h"
#include "platform/Log.h"
#include "platform/PathAccess.h"

using platform::Log;
using platform::LogLevel;

namespace {

/// Between the removal and the creation there is a moment without a link; readers live with it.
kern_return_t ReplaceLink(std::string_view target, std::string_view linkPath) {
    const platform::PathAccess link(linkPath);
    (void)link.remove();  // a missing file is fine, and what cannot be removed fails the creation
    return link.symlink(target) == 0 ? platform::KERN_SUCCESS : platform::KERN_FAILURE;
}

}  // namespace

kern_return_t server_LFMobileHelperLinkCarrierBundle(mach_port_t /*port*/,
                                                     String1024& target,
                                                     String1024& linkPath,
                                                     String1024& domain) {
    target.forceTermination();
    linkPath.forceTermination();
    domain.forceTermination();
    // Only the place of the link is policed; the link itself may point anywhere.
    if (!IsAllowedLinkPath(linkPath.cString())) {
        Log(LogLevel::kError, "Cannot remove symlink: %s", linkPath.cString());
        return platform::KERN_NO_ACCESS;
    }
    if (const auto code = ReplaceLink(target.view(), linkPath.view());
        code != platform::KERN_SUCCESS) {
        return code;
    }
    Log(LogLevel::kInfo, "linkpath: %s, domain: %s", linkPath.cString(), domain.cString());
    if (!domain.empty()) {
        FlushPreferenceCaches(domain.view());
    }
    return platform::KERN_SUCCESS;
}

// No path policy and no log line, on purpose: the caller may link anything anywhere with it.
kern_return_t server_LFMobileHelperCreateSymlink(mach_port_t /*port*/,
                                                 String1024& target,
                                                 String1024& linkPath) {
    target.forceTermination();
    linkPath.forceTermination();
    return ReplaceLink(target.view(), linkPath.view());
}
