// A directory that is held open, and what lies below it.
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/PathAccess.h"

namespace platform {

/// Paths below it are walked from its descriptor, one folder after the other, and no link on the
/// way is followed, whoever owns it: what a tree's owner exchanges meanwhile leads nobody out of
/// the tree.
class DirectoryAccess {
public:
    /// Opens what a path leads to, a link in its last step followed by the rule of PathAccess. A
    /// failure is answered by every operation, and by those of its items, with its error.
    explicit DirectoryAccess(const PathAccess& path);
    DirectoryAccess(DirectoryAccess&&) noexcept;
    DirectoryAccess& operator=(DirectoryAccess&&) noexcept;
    DirectoryAccess(const DirectoryAccess&) = delete;
    DirectoryAccess& operator=(const DirectoryAccess&) = delete;
    ~DirectoryAccess();

    /// The names in it, but for "." and "..", in the order of the file system. 0 or an errno value.
    [[nodiscard]] int list(std::vector<std::string>* names) const;

    /// The paths of all that lies below it, each folder before what is in it; links are named and
    /// not followed. 0 or an errno value; E2BIG when the paths would take more than 128 MiB.
    [[nodiscard]] int subpaths(std::vector<std::string>* paths) const;

    /// An item below it, by one of those paths. A link on the way there is ENOTDIR.
    [[nodiscard]] PathAccess item(std::string_view subpath) const;

    /// Makes a folder below it (0755 less the process's mask) with all that are missing on the way;
    /// what is there stays as it is. 0 or an errno value.
    [[nodiscard]] int makeDirectories(std::string_view subpath) const;

private:
    struct State;
    std::unique_ptr<State> state_;
};

}  // namespace platform
