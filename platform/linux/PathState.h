// What a resolved path is: its folder, held open, and the name of its last step.
#pragma once

#include <string>

#include "platform/PathAccess.h"
#include "platform/linux/OwnedFd.h"

namespace platform {

struct PathAccess::State {
    std::string path;  ///< as it was given
    OwnedFd parent;
    std::string name;          ///< "." for the path "/"
    bool endsInSlash = false;  ///< what must then be a directory
    int error = 0;

    /// The name with a slash behind it where the path had one: what calls are given that judge it
    /// themselves, and follow no link all the same.
    [[nodiscard]] std::string nameAsGiven() const { return endsInSlash ? name + "/" : name; }
};

}  // namespace platform
