#include "platform/linux/ExpandedTree.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cerrno>

#include "platform/linux/ArchiveNames.h"

namespace platform {
namespace {

constexpr mode_t kFolderMode = 0755;

int ErrorOf(int result) {
    return result == 0 ? 0 : errno;
}

/// An open folder, or why there is none.
struct Folder {
    OwnedFd file;
    int error = 0;
    bool isNew = false;
};

/// What is no folder, a link to one included, is ENOTDIR.
Folder OpenFolder(int parent, const char* name) {
    OwnedFd file(openat(parent, name, O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    const int error = file.isOpen() ? 0 : errno;
    return {.file = std::move(file), .error = error};
}

Folder OpenOrMake(int parent, const char* name, mode_t mode) {
    Folder folder = OpenFolder(parent, name);
    if (folder.error != ENOENT) {
        return folder;
    }
    const bool isNew = mkdirat(parent, name, mode) == 0;
    if (!isNew && errno != EEXIST) {  // of two that make a folder at once the slower one finds it
        return {.file = {}, .error = errno};
    }
    folder = OpenFolder(parent, name);
    folder.isNew = isNew;
    return folder;
}

}  // namespace

int ExpandedTree::openFolder(std::span<const std::string> steps, OwnedFd* folder) {
    Folder place = OpenFolder(folder_, ".");
    for (const std::string& step : steps) {
        if (place.error != 0) {
            break;
        }
        place = OpenOrMake(place.file.get(), step.c_str(), kFolderMode);
        impliedFolders_ += place.isNew ? 1 : 0;
    }
    *folder = std::move(place.file);
    return place.error;
}

int ExpandedTree::makeFolder(const Steps& steps, mode_t mode) {
    if (steps.empty()) {
        return 0;
    }
    OwnedFd parent;
    const int error = openFolder(std::span(steps).first(steps.size() - 1), &parent);
    return error != 0 ? error : OpenOrMake(parent.get(), steps.back().c_str(), mode).error;
}

int ExpandedTree::makeLink(const Steps& steps, const std::string& target) {
    OwnedFd parent;
    if (steps.empty()) {
        return EISDIR;
    }
    if (const int error = openFolder(std::span(steps).first(steps.size() - 1), &parent);
        error != 0) {
        return error;
    }
    (void)unlinkat(parent.get(), kUnfinishedName, 0);  // of a process that was killed
    if (symlinkat(target.c_str(), parent.get(), kUnfinishedName) != 0) {
        return errno;
    }
    const int error =
        ErrorOf(renameat(parent.get(), kUnfinishedName, parent.get(), steps.back().c_str()));
    if (error != 0) {
        (void)unlinkat(parent.get(), kUnfinishedName, 0);
    }
    return error;
}

UnfinishedFile::~UnfinishedFile() {
    if (file_.isOpen()) {
        (void)unlinkat(folder_.get(), kUnfinishedName, 0);
    }
}

int UnfinishedFile::create(ExpandedTree& tree, const ExpandedTree::Steps& steps, mode_t mode) {
    if (steps.empty()) {
        return EISDIR;
    }
    if (const int error = tree.openFolder(std::span(steps).first(steps.size() - 1), &folder_);
        error != 0) {
        return error;
    }
    name_ = steps.back();
    (void)unlinkat(folder_.get(), kUnfinishedName, 0);  // of a process that was killed
    file_.reset(openat(folder_.get(),
                       kUnfinishedName,
                       O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC,
                       mode));
    return file_.isOpen() ? 0 : errno;
}

int UnfinishedFile::write(std::span<const std::byte> bytes) {
    while (!bytes.empty()) {
        const ssize_t written = ::write(file_.get(), bytes.data(), bytes.size());
        if (written <= 0) {
            return written < 0 ? errno : EIO;
        }
        bytes = bytes.subspan(static_cast<std::size_t>(written));
    }
    return 0;
}

int UnfinishedFile::finish(const timespec& modified) {
    const std::array<timespec, 2> times{timespec{.tv_sec = 0, .tv_nsec = UTIME_OMIT}, modified};
    (void)futimens(file_.get(), times.data());  // a time that the disk cannot keep is no reason
    const int error =
        ErrorOf(renameat(folder_.get(), kUnfinishedName, folder_.get(), name_.c_str()));
    if (error == 0) {
        file_.reset();
    }
    return error;
}

}  // namespace platform
