#include "platform/FileManager.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <string>

#include "platform/linux/PathState.h"
#include "platform/linux/PathWalk.h"
#include "platform/linux/PrivateFolder.h"
#include "platform/linux/ReplacementFile.h"
#include "platform/linux/TreeCopy.h"
#include "platform/linux/TreeRemoval.h"

namespace platform {
namespace {

constexpr mode_t kModeBits = 07777;
constexpr mode_t kPermissions = S_IRWXU | S_IRWXG | S_IRWXO;
constexpr mode_t kNewFileMode = 0644;

/// Temporary names are a thread's own, so that none takes another's unfinished work for a leftover;
/// and few, so that whatever a crash leaves behind is found again by the next that writes there.
std::string TemporaryName(const char* purpose) {
    static std::atomic<unsigned> threads = 0;
    static thread_local const unsigned number = threads++;
    return std::string(".linefold-mobile-helper.") + purpose + "-" + std::to_string(number);
}

/// Beside the final name until it is complete, where nobody sees it; goes with the object unless it
/// took its place.
class UnfinishedCopy {
public:
    explicit UnfinishedCopy(const OwnedFd& folder)
        : folder_(folder), privateName_(TemporaryName("copy")) {}

    ~UnfinishedCopy() {
        if (isMade_) {
            (void)RemoveTree(place_.file(), kName);  // what stays is removed by the next copy
        }
    }

    UnfinishedCopy(const UnfinishedCopy&) = delete;
    UnfinishedCopy& operator=(const UnfinishedCopy&) = delete;

    [[nodiscard]] int make(const ItemPlace& source,
                           Folder::Identity* sourceFolder,
                           const LeaveOutHandler& leavesOut) {
        if (const int error = RemoveTree(folder_, privateName_); error != 0 && error != ENOENT) {
            return error;
        }
        if (const int error = place_.make(folder_.get(), privateName_); error != 0) {
            return error;
        }
        isMade_ = true;
        return CopyTree(source, {.folder = place_.file(), .name = kName}, sourceFolder, leavesOut);
    }

    [[nodiscard]] int takePlace(const std::string& name) {
        if (renameat2(place_.file().get(), kName, folder_.get(), name.c_str(), RENAME_NOREPLACE) !=
            0) {
            return errno;
        }
        isMade_ = false;
        return 0;
    }

private:
    static constexpr const char* kName = "copy";

    const OwnedFd& folder_;
    const std::string privateName_;
    PrivateFolder place_;
    bool isMade_ = false;
};

/// Both ends as they are before anything changes.
int LookAtEnds(const PathAccess::State& source, const PathAccess::State& destination) {
    if (source.error != 0) {
        return source.error;
    }

    struct stat status {};

    if (fstatat(source.parent.get(), source.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
        return errno;
    }
    const bool isDirectory = S_ISDIR(status.st_mode);
    if (source.endsInSlash && !isDirectory) {
        return ENOTDIR;
    }
    if (destination.error != 0) {
        return destination.error;
    }
    if (fstatat(destination.parent.get(), destination.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) ==
        0) {
        return EEXIST;
    }
    if (errno != ENOENT) {
        return errno;
    }
    return destination.endsInSlash && !isDirectory ? ENOTDIR : 0;
}

int Copy(const PathAccess::State& source,
         const PathAccess::State& destination,
         Folder::Identity* sourceFolder,
         const LeaveOutHandler& leavesOut = {}) {
    UnfinishedCopy copy(destination.parent);
    const int error =
        copy.make({.folder = source.parent, .name = source.name}, sourceFolder, leavesOut);
    return error != 0 ? error : copy.takePlace(destination.name);
}

/// To another file system. A folder is removed only if it is the one that was copied.
int CopyAndRemove(const PathAccess::State& source, const PathAccess::State& destination) {
    Folder::Identity folder;
    if (const int error = Copy(source, destination, &folder); error != 0) {
        return error;
    }
    const bool isFolder = folder != Folder::Identity();
    return RemoveTree(source.parent, source.name, isFolder ? &folder : nullptr);
}

/// A directory that nobody has made before. Its mode is set whole, whatever the mask says.
int MakeDirectory(int parent, const std::string& name, const FileAttributes& attributes) {
    const mode_t mode = attributes.permissions.value_or(kPermissions);
    if (mkdirat(parent, name.c_str(), mode & kPermissions) != 0) {
        return errno;
    }
    Folder made;

    struct stat status {};

    if (const int error = made.open(parent, name.c_str()); error != 0) {
        return error;
    }
    const int folder = made.file().get();
    if (fstat(folder, &status) != 0 || status.st_uid != geteuid()) {
        return ESTALE;  // somebody has put another one in its place
    }
    constexpr std::uint32_t kAsItIs = 0xFFFFFFFF;
    if ((attributes.owner || attributes.group || status.st_gid != getegid()) &&
        fchown(folder, attributes.owner.value_or(kAsItIs), attributes.group.value_or(getegid())) !=
            0) {
        return errno;
    }
    const bool hasMode = !attributes.permissions || (status.st_mode & kModeBits) == mode;
    return hasMode || fchmod(folder, mode & kModeBits) == 0 ? 0 : errno;
}

/// The next folder on the way, made if it is missing.
Opened StepOrMake(PathWalk& walk,
                  const OwnedFd& parent,
                  const std::string& name,
                  const FileAttributes& attributes) {
    Opened next = walk.step(parent, name);
    if (next.error != ENOENT) {
        return next;
    }
    // Not there, or a link to what is not there: then the second step says so again.
    if (const int error = MakeDirectory(parent.get(), name, attributes);
        error != 0 && error != EEXIST) {
        return {.file = {}, .error = error};
    }
    return walk.step(parent, name);
}

bool IsDirectory(const OwnedFd& file) {
    struct stat status {};

    return fstat(file.get(), &status) == 0 && S_ISDIR(status.st_mode);
}

int MakeWithIntermediates(std::string_view path, const FileAttributes& attributes) {
    PathWalk walk;
    Opened place = OpenPath(AT_FDCWD, path.starts_with('/') ? "/" : ".");
    while (place.error == 0) {
        const auto start = path.find_first_not_of('/');
        if (start == std::string_view::npos) {
            break;
        }
        path.remove_prefix(start);
        const std::string name(path.substr(0, path.find('/')));
        path.remove_prefix(name.size());
        place = StepOrMake(walk, place.file, name, attributes);
    }
    return place.error != 0 ? place.error : IsDirectory(place.file) ? 0 : EEXIST;
}

/// What a new file is given: the permissions of the regular file that it replaces.
int ModeFor(const PathAccess::State& item, mode_t* mode) {
    struct stat status {};

    if (fstatat(item.parent.get(), item.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
        *mode = kNewFileMode;
        return errno == ENOENT ? 0 : errno;
    }
    *mode = S_ISREG(status.st_mode) ? status.st_mode & kPermissions : kNewFileMode;
    return S_ISDIR(status.st_mode) ? EISDIR : 0;
}

}  // namespace

int FileManagerCopyItem(const PathAccess& source,
                        const PathAccess& destination,
                        const LeaveOutHandler& leavesOut) {
    Folder::Identity folder;
    const int error = LookAtEnds(source.state(), destination.state());
    return error != 0 ? error : Copy(source.state(), destination.state(), &folder, leavesOut);
}

int FileManagerMoveItem(const PathAccess& source, const PathAccess& destination) {
    const PathAccess::State& from = source.state();
    const PathAccess::State& to = destination.state();
    if (const int error = LookAtEnds(from, to); error != 0) {
        return error;
    }
    if (renameat2(from.parent.get(),
                  from.name.c_str(),
                  to.parent.get(),
                  to.name.c_str(),
                  RENAME_NOREPLACE) == 0) {
        return 0;
    }
    return errno == EXDEV ? CopyAndRemove(from, to) : errno;
}

int FileManagerRemoveItem(const PathAccess& item) {
    const PathAccess::State& state = item.state();
    if (state.error != 0) {
        return state.error;
    }
    // Emptied first and then found to have no name to take away: never.
    if (state.name == "." || state.name == "..") {
        return EINVAL;
    }

    struct stat status {};

    if (fstatat(state.parent.get(), state.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
        return errno;
    }
    if (state.endsInSlash && !S_ISDIR(status.st_mode)) {
        return ENOTDIR;
    }
    return RemoveTree(state.parent, state.name);
}

int FileManagerSetAttributes(const FileAttributes& attributes, const PathAccess& item) {
    constexpr std::uint32_t kAsItIs = 0xFFFFFFFF;
    if (attributes.owner || attributes.group) {
        if (const int error = item.setOwner(attributes.owner.value_or(kAsItIs),
                                            attributes.group.value_or(kAsItIs));
            error != 0) {
            return error;
        }
    }
    if (!attributes.permissions) {
        return 0;
    }
    const int error = item.setMode(*attributes.permissions);
    return error == EOPNOTSUPP ? 0 : error;
}

int FileManagerCreateDirectory(std::string_view path,
                               IntermediateDirectories intermediates,
                               const FileAttributes& attributes) {
    if (path.empty()) {
        return ENOENT;
    }
    if (intermediates == IntermediateDirectories::kAreMade) {
        return MakeWithIntermediates(path, attributes);
    }
    const PathAccess item(path);
    const PathAccess::State& state = item.state();
    return state.error != 0 ? state.error
                            : MakeDirectory(state.parent.get(), state.name, attributes);
}

int FileManagerReplaceContents(const PathAccess& item, std::span<const std::byte> contents) {
    const PathAccess::State& state = item.state();
    mode_t mode = 0;
    if (state.error != 0 || state.endsInSlash) {
        return state.error != 0 ? state.error : ENOTDIR;
    }
    if (const int error = ModeFor(state, &mode); error != 0) {
        return error;
    }
    ReplacementFile file(state.parent.get(), TemporaryName("new"));
    const int error = file.make(mode, [contents](const ReplacementFile::Put& put) {
        put({reinterpret_cast<const char*>(contents.data()), contents.size()});
    });
    return error != 0 ? error : file.takePlace(state.name);
}

}  // namespace platform
