// A carrier archive expanded, or anything else copied, by the system's archive copier.
#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/MIRCopier.h"
#include "platform/PropertyList.h"
#include "platform/SystemLog.h"

using platform::PropertyList;

namespace {

int SkipFile(platform::MIRCopier* /*copier*/, const char* /*path*/, int /*error*/) {
    return platform::kMIRCopierSkipFile;
}

void LogFatalError(platform::MIRCopier* /*copier*/, const char* /*path*/, int /*error*/) {
    platform::SystemLog(platform::SystemLogPriority::kError, "MIRCopier signaled fatal file error");
}

PropertyList Options() {
    return PropertyList(
        PropertyList::Dictionary{{platform::kMIRCopierExtractPKZip, PropertyList(true)},
                                 {platform::kMIRCopierCopyExtendedAttributes, PropertyList(true)},
                                 {platform::kMIRCopierCopyResources, PropertyList(true)}});
}

}  // namespace

// Neither path is policed, on purpose, and neither field is cut: all 256 bytes count.
kern_return_t server_LFMobileHelperCopyArchive(mach_port_t /*port*/,
                                               String256& source,
                                               String256& destination,
                                               std::int32_t& isDone) {
    isDone = 0;
    const platform::OwnedMIRCopier copier(platform::MIRCopierNew());
    if (copier == nullptr) {
        return platform::KERN_SUCCESS;
    }
    MIRCopierSetFileErrorHandler(copier.get(), SkipFile);
    MIRCopierSetFatalFileErrorHandler(copier.get(), LogFatalError);
    const int result =
        MIRCopierCopyWithOptions(copier.get(), source.cString(), destination.cString(), Options());
    isDone = result == 0 ? 1 : 0;
    return platform::KERN_SUCCESS;
}
