#include "platform/linux/TreeRemoval.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <vector>

namespace platform {
namespace {

/// How often a folder is read again that is not empty after all was removed from it: somebody puts
/// things there, or a file system lost its place in the list that changed under it.
constexpr int kReadingsMax = 8;

class TreeRemoval {
public:
    explicit TreeRemoval(const OwnedFd& parent) : parent_(parent) {}

    int remove(const std::string& name, const Folder::Identity* only);

private:
    struct Level {
        Folder folder{};
        std::string name;
        int readings = 0;
    };

    int enter(const std::string& name);
    int empty(Level& level);
    int finish();

    const OwnedFd& parent_;
    std::vector<Level> levels_;
    PendingFolders pending_;
};

int TreeRemoval::remove(const std::string& name, const Folder::Identity* only) {
    int error = enter(name);
    Folder::Identity found;
    if (error == 0 && only != nullptr) {
        error = levels_.back().folder.identify(&found);
        error = error == 0 && found != *only ? ESTALE : error;
    }
    if (error == 0) {
        error = empty(levels_.back());
    }
    std::string below;
    while (error == 0 && !levels_.empty()) {
        if (!pending_.next(&below)) {
            error = finish();
            continue;
        }
        error = enter(below);
        if (error == 0) {
            error = empty(levels_.back());
        } else if (error == ENOENT) {
            error = 0;  // gone by itself
        }
    }
    return error;
}

int TreeRemoval::enter(const std::string& name) {
    const int above = levels_.empty() ? parent_.get() : levels_.back().folder.file().get();
    Level level{.name = name};
    if (const int error = level.folder.open(above, name.c_str()); error != 0) {
        return error;
    }
    levels_.push_back(std::move(level));
    if (levels_.size() > kOpenFoldersMax) {
        if (const int error = levels_[levels_.size() - 1 - kOpenFoldersMax].folder.leave();
            error != 0) {
            return error;
        }
    }
    return pending_.enter();
}

/// Removes the files, and notes the folders.
int TreeRemoval::empty(Level& level) {
    ++level.readings;
    const int folder = level.folder.file().get();
    return ForEachEntry(level.folder.file(), [this, folder](const char* name, unsigned char type) {
        if (type == DT_DIR) {
            return pending_.add(name);
        }
        return unlinkat(folder, name, 0) == 0 || errno == ENOENT ? 0 : errno;
    });
}

/// The folder that was entered last is empty now, and goes.
int TreeRemoval::finish() {
    Level& level = levels_.back();
    const bool isTop = levels_.size() == 1;
    if (!isTop) {
        if (const int error = levels_[levels_.size() - 2].folder.comeBackFrom(level.folder);
            error != 0) {
            return error;
        }
    }
    const int above = isTop ? parent_.get() : levels_[levels_.size() - 2].folder.file().get();
    if (unlinkat(above, level.name.c_str(), AT_REMOVEDIR) != 0 && errno != ENOENT) {
        const int error = errno;
        const bool mayTryAgain = error == ENOTEMPTY && level.readings < kReadingsMax &&
                                 lseek(level.folder.file().get(), 0, SEEK_SET) == 0;
        return mayTryAgain ? empty(level) : error;
    }
    levels_.pop_back();
    pending_.leave();
    return 0;
}

}  // namespace

int RemoveTree(const OwnedFd& parent, const std::string& name, const Folder::Identity* only) {
    if (only == nullptr) {
        // Most are files.
        const int error = unlinkat(parent.get(), name.c_str(), 0) == 0 ? 0 : errno;
        if (error != EISDIR) {
            return error;
        }
    }
    return TreeRemoval(parent).remove(name, only);
}

}  // namespace platform
