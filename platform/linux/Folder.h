// Folders that a walk through a tree goes down into and comes back to.
#pragma once

#include <dirent.h>
#include <sys/types.h>

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

#include "platform/linux/OwnedFd.h"

namespace platform {

/// A folder is open while the walk is near it. Far below, its descriptor is given back: however
/// deep a tree is, walking it takes few.
class Folder {
public:
    Folder() = default;

    /// Opens one that is no link. 0 or an errno value.
    [[nodiscard]] int open(int parent, const char* name);

    [[nodiscard]] const OwnedFd& file() const { return file_; }

    /// Its identity among all folders.
    struct Identity {
        dev_t device = 0;
        ino_t inode = 0;
        bool operator==(const Identity&) const = default;
    };

    [[nodiscard]] int identify(Identity* identity) const;

    /// Closes it until the walk comes back.
    [[nodiscard]] int leave();

    /// Opens it again from the folder below, unless it never was closed. ESTALE when somebody has
    /// moved that folder elsewhere meanwhile.
    [[nodiscard]] int comeBackFrom(const Folder& below);

private:
    OwnedFd file_;
    Identity identity_;
};

/// How many folders of a walk are open at most, of each tree that it walks.
inline constexpr std::size_t kOpenFoldersMax = 12;

/// Calls `visit` with the name and the type (DT_DIR, …; never DT_UNKNOWN) of each entry but for
/// "." and "..", until it gives an error. 0, or that error, or an errno value of ours.
using EntryVisitor = std::function<int(const char* name, unsigned char type)>;
[[nodiscard]] int ForEachEntry(const OwnedFd& folder, const EntryVisitor& visit);

/// The subfolders that a walk still has before it, of all the folders that it is in. E2BIG when
/// remembering them would take more than 64 MiB.
class PendingFolders {
public:
    [[nodiscard]] int enter();

    [[nodiscard]] int add(const char* name);

    /// The next one in the folder that was entered last.
    [[nodiscard]] bool next(std::string* name);

    void leave();

private:
    [[nodiscard]] int take(std::size_t bytes);

    std::vector<std::string> names_;
    std::vector<std::size_t> counts_;
    std::size_t bytes_ = 0;
};

}  // namespace platform
