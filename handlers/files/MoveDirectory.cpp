// A directory moved to its place among the carrier bundles.
#include <string>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "handlers/carrier/PathPolicy.h"
#include "handlers/files/FileSystemManager.h"
#include "platform/SystemLog.h"

using platform::SystemLog;
using platform::SystemLogPriority;

namespace {

constexpr std::uint32_t kNewDirectoryMode = 0755;

/// 0, or why it is neither there nor could be made.
int MakeIfMissing(FileSystemManager& manager, std::string_view directory) {
    return manager.exists(directory)
               ? 0
               : manager.createDirectory(
                     directory, kNewDirectoryMode, FileSystemManager::Intermediates::kCreate);
}

}  // namespace

kern_return_t server_LFMobileHelperMoveDirectory(mach_port_t /*port*/,
                                                 String256& source,
                                                 String256& destinationDirectory,
                                                 String256& name,
                                                 std::int32_t& isDone) {
    source.forceTermination();
    destinationDirectory.forceTermination();
    name.forceTermination();
    isDone = 0;
    SystemLog(SystemLogPriority::kNotice,
              "'%s', '%s'\n",
              source.cString(),
              destinationDirectory.cString());
    FileSystemManager manager;
    // Before the path is judged, on purpose: a refused destination has its directory all the same,
    // and callers count on finding it.
    if (const int result = MakeIfMissing(manager, destinationDirectory.view()); result != 0) {
        SystemLog(SystemLogPriority::kNotice,
                  "Failed to create CarrierBundles Dir  to %s. Error: %d\n",
                  destinationDirectory.cString(),
                  result);
        return platform::KERN_SUCCESS;
    }
    const std::string destination =
        std::string(destinationDirectory.view()).append("/").append(name.view());
    SystemLog(SystemLogPriority::kNotice,
              "'%s', '%s', '%s'\n",
              source.cString(),
              destinationDirectory.cString(),
              name.cString());
    if (!IsAllowedCarrierPath(destination.c_str())) {
        SystemLog(SystemLogPriority::kError,
                  "Destination directory %s is not within the allowed directories\n",
                  destination.c_str());
        return platform::KERN_SUCCESS;
    }
    const int result = manager.moveFile(source.cString(), destination.c_str());
    if (result != 0) {
        SystemLog(SystemLogPriority::kError,
                  "Failed to move the directory %s to %s. Error: %d\n",
                  source.cString(),
                  destinationDirectory.cString(),
                  result);
    }
    isDone = result == 0 ? 1 : 0;
    return platform::KERN_SUCCESS;
}
