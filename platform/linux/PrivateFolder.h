// A folder of ours inside one of a stranger's, where things are made that must not be seen before
// they are whole and belong to whom they shall.
#pragma once

#include <string>

#include "platform/linux/OwnedFd.h"

namespace platform {

/// Nobody but its owner looks into it, and it goes with the object, if it is empty by then.
class PrivateFolder {
public:
    PrivateFolder() = default;
    ~PrivateFolder();
    PrivateFolder(const PrivateFolder&) = delete;
    PrivateFolder& operator=(const PrivateFolder&) = delete;

    /// Makes it, or takes one of that name that a killed process of ours has left. The parent stays
    /// its owner's and outlives this. 0 or an errno value; EEXIST when something else is in its
    /// place.
    [[nodiscard]] int make(int parent, std::string name);

    [[nodiscard]] const OwnedFd& file() const { return file_; }

private:
    int parent_ = -1;
    std::string name_;
    bool isOurs_ = false;
    OwnedFd file_;
};

}  // namespace platform
