// An item copied with all that lies below it.
#pragma once

#include <string>

#include "platform/FileManager.h"
#include "platform/linux/Folder.h"

namespace platform {

/// Where an item is, or is to be.
struct ItemPlace {
    const OwnedFd& folder;
    const std::string& name;
};

/// Copies to a name that is free; what a failure leaves there is for the caller to remove.
/// `*sourceFolder` becomes the identity of a source that is a folder. 0 or an errno
/// value.
[[nodiscard]] int CopyTree(const ItemPlace& source,
                           const ItemPlace& copy,
                           Folder::Identity* sourceFolder,
                           const LeaveOutHandler& leavesOut);

}  // namespace platform
