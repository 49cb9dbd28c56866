// Logs copied into the mobile user's crash-report folder.
#include <string>
#include <string_view>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "handlers/carrier/MobileUser.h"
#include "handlers/files/FileSystemManager.h"
#include "platform/SystemLog.h"

using platform::SystemLog;
using platform::SystemLogPriority;

namespace {

constexpr std::string_view kCrashReports = "Library/Logs/CrashReporter/";

/// Exactly one slash stands between the parts, however the home is spelled.
std::string CrashReportFolder() {
    const auto end = MobileUserHome.find_last_not_of('/');
    return MobileUserHome.substr(0, end + 1).append("/").append(kCrashReports);
}

}  // namespace

// The source is not policed: the fixed destination alone limits what this routine can write.
kern_return_t server_LFMobileHelperCopyLogDirectory(mach_port_t /*port*/,
                                                    String256& source,
                                                    std::int32_t& isDone) {
    const std::string destination = CrashReportFolder();
    source.forceTermination();
    SystemLog(SystemLogPriority::kNotice, "'%s', '%s'\n", source.cString(), destination.c_str());
    const int result = FileSystemManager().copyItem(source.cString(), destination.c_str());
    if (result != 0) {
        // A notice and no error, on purpose: who watches for errors of this daemon does not expect
        // one for each log that is not there.
        SystemLog(SystemLogPriority::kNotice,
                  "Failed to copy the directory %s to %s. Error: %d\n",
                  source.cString(),
                  destination.c_str(),
                  result);
    }
    isDone = result == 0 ? 1 : 0;
    return platform::KERN_SUCCESS;
}
