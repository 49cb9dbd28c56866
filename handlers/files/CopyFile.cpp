// A file put into a carrier-bundle directory and given to the mobile user.
#include <string>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "handlers/carrier/MobileUser.h"
#include "handlers/carrier/PathPolicy.h"
#include "handlers/files/FileSystemManager.h"
#include "platform/PathAccess.h"
#include "platform/SystemLog.h"

using platform::SystemLog;
using platform::SystemLogPriority;

kern_return_t server_LFMobileHelperCopyFile(mach_port_t /*port*/,
                                            String256& sourceDirectory,
                                            String256& destinationDirectory,
                                            String256& name,
                                            std::int32_t& isDone) {
    sourceDirectory.forceTermination();
    destinationDirectory.forceTermination();
    name.forceTermination();
    isDone = 0;
    const std::string destination =
        std::string(destinationDirectory.view()).append("/").append(name.view());
    SystemLog(SystemLogPriority::kNotice,
              "'%s', '%s', '%s'\n",
              sourceDirectory.cString(),
              destinationDirectory.cString(),
              name.cString());
    if (!IsAllowedCarrierPath(destination.c_str())) {
        SystemLog(SystemLogPriority::kError,
                  "Destination directory %s is not within the allowed directories\n",
                  destination.c_str());
        return platform::KERN_SUCCESS;
    }
    FileSystemManager manager;
    if (manager.copyNamedItem(sourceDirectory.view(), destinationDirectory.view(), name.view()) !=
        0) {
        SystemLog(SystemLogPriority::kError,
                  "Failed to copy the file %s to %s\n",
                  sourceDirectory.cString(),
                  destinationDirectory.cString());
        return platform::KERN_SUCCESS;
    }
    // The path lies below the mobile user's folders, where a link could lead the ownership
    // elsewhere: what is given away is the item at the path itself. A copy that could not be given
    // away stays.
    const int error =
        platform::PathAccess(destination).setOwner(_GetMobileUserUID(), _GetMobileUserGID());
    isDone = error == 0 ? 1 : 0;
    return platform::KERN_SUCCESS;
}
