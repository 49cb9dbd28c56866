// An item removed with all that lies below it.
#pragma once

#include <string>

#include "platform/linux/Folder.h"

namespace platform {

/// Stops at the first item that cannot be removed. `only`: a folder of another identity is left
/// alone (ESTALE). 0 or an errno value.
[[nodiscard]] int RemoveTree(const OwnedFd& parent,
                             const std::string& name,
                             const Folder::Identity* only = nullptr);

}  // namespace platform
