// What a resolved path is in the simulated file tree.
#pragma once

#include <string>

#include "platform/PathAccess.h"
#include "platform/sim/FileTree.h"

namespace platform {

struct PathAccess::State {
    std::string path;
    sim::Place place;
    int error = 0;

    /// What stands there. 0 or an errno value.
    int find(sim::Node** found) const;
    int find(const sim::Node** found) const;

    /// The same, where a link means what it leads to.
    int findBehindLink(const sim::Node** found) const;

    /// Takes a file, a link or an empty directory out of its folder.
    [[nodiscard]] int removeEntry(const sim::Node& node) const;

    /// Whether the last step is a name, and not the folder itself or the one above it.
    [[nodiscard]] bool namesAnEntry() const;
};

}  // namespace platform
