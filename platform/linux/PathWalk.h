// A path followed step by step from an open directory, by the rule for links that strangers own.
#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

#include "platform/linux/OwnedFd.h"

namespace platform {

/// An open file or directory (O_PATH), or why there is none.
struct Opened {
    OwnedFd file;
    int error = 0;
};

/// One walk along a path. A symbolic link is followed if root owns it, or if it leads to something
/// that its own owner owns; otherwise EPERM. All the links that it meets, nested ones too, count
/// together.
class PathWalk {
public:
    /// Where the path leads from `from` (AT_FDCWD or a directory), links in the last step followed
    /// as well.
    Opened follow(std::string_view path, int from);

    /// The same for one name in a directory.
    Opened step(const OwnedFd& directory, const std::string& name);

private:
    Opened followLink(const OwnedFd& directory, const OwnedFd& link, uid_t linkOwner);

    int linksLeft_ = 40;
};

/// A path up to its last step, and that step with the slashes behind it. The path "/" has the last
/// step ".".
struct SplitPath {
    std::string_view parent;
    std::string_view last;
    bool endsInSlash = false;
};

[[nodiscard]] SplitPath Split(std::string_view path);

/// Opens the folder that a path's last step lies in; an empty path is ENOENT.
[[nodiscard]] Opened OpenParent(std::string_view path);

/// Opens a folder below another (O_PATH), following no link: ENOTDIR for one on the way. An empty
/// path is the folder itself.
[[nodiscard]] Opened OpenBelow(int folder, std::string_view path);

/// Opens one name with O_PATH, not following a link there.
[[nodiscard]] Opened OpenPath(int directory, const char* name);

}  // namespace platform
