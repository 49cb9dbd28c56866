// The copy of a tree is closed to everybody but its owner until it is complete: each folder is made
// 0700 and gets its own mode last, when the walk leaves it, and the top of all the very last. So
// nobody can put a link in the way of what is still to be copied, or exchange what a hard link is
// to be made to.
#include "platform/linux/TreeCopy.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <map>
#include <utility>
#include <vector>

#include "platform/linux/FileCopy.h"
#include "platform/linux/PathWalk.h"

namespace platform {
namespace {

constexpr mode_t kModeWhileUnfinished = S_IRWXU;
constexpr int kSourceFlags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
constexpr int kNewFileFlags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
constexpr std::size_t kHardLinkBytesMax = 64U << 20;

/// Where the first copies of files with several names are, below the top of the copy.
class HardLinks {
public:
    /// Makes the copy a further name of what was copied before. False when nothing was.
    bool linkAgain(const struct stat& status,
                   const OwnedFd& top,
                   const ItemPlace& copy,
                   int* error);

    /// E2BIG when remembering them all takes more than 64 MiB.
    int remember(const struct stat& status, std::string path);

private:
    std::map<std::pair<dev_t, ino_t>, std::string> firstCopies_;
    std::size_t bytes_ = 0;
};

bool HardLinks::linkAgain(const struct stat& status,
                          const OwnedFd& top,
                          const ItemPlace& copy,
                          int* error) {
    const auto first = firstCopies_.find({status.st_dev, status.st_ino});
    if (first == firstCopies_.end()) {
        return false;
    }
    const SplitPath path = Split(first->second);
    const Opened folder = OpenBelow(top.get(), path.parent);
    *error = folder.error;
    if (folder.error == 0 && linkat(folder.file.get(),
                                    std::string(path.last).c_str(),
                                    copy.folder.get(),
                                    copy.name.c_str(),
                                    0) != 0) {
        *error = errno;
    }
    // The most names that a file may have here are fewer than there: the next copy is the first
    // again.
    return *error != EMLINK;
}

int HardLinks::remember(const struct stat& status, std::string path) {
    constexpr std::size_t kOverhead = 96;
    bytes_ += path.size() + kOverhead;
    firstCopies_.insert_or_assign({status.st_dev, status.st_ino}, std::move(path));
    return bytes_ > kHardLinkBytesMax ? E2BIG : 0;
}

class TreeCopy {
public:
    TreeCopy(const ItemPlace& source, const ItemPlace& copy, const LeaveOutHandler& leavesOut)
        : source_(source), copy_(copy), leavesOut_(leavesOut) {}

    int copy(Folder::Identity* sourceFolder);

private:
    struct Level {
        Folder source{};
        Folder copy{};

        struct stat status {};

        std::size_t pathLength = 0;  ///< of path_, without this folder
    };

    int copyFolders();
    int copyFolder(const ItemPlace& source, const ItemPlace& copy);
    int enter(const ItemPlace& source, const ItemPlace& copy);
    int refuseItself(const struct stat& status);
    int beginWith(const Folder& top);
    int copyEntries();
    int finish();
    int copyEntry(const ItemPlace& source, const ItemPlace& copy, unsigned char type);
    int copyFile(const ItemPlace& source, const ItemPlace& copy);
    int copyLink(const ItemPlace& source, const ItemPlace& copy);
    int leaveOut(const ItemPlace& source);
    int rememberName(const struct stat& status, const std::string& name);
    int leaveOut(const ItemPlace& copy, int error);

    const ItemPlace source_;
    const ItemPlace copy_;
    const LeaveOutHandler& leavesOut_;
    std::vector<Level> levels_;
    Folder::Identity place_;  ///< of the folder that the copy is made in
    PendingFolders pending_;
    ModeMask mask_;
    HardLinks hardLinks_;
    std::string path_;  ///< of the folder that the walk is in, below the top
};

int TreeCopy::copy(Folder::Identity* sourceFolder) {
    struct stat status {};

    if (fstatat(source_.folder.get(), source_.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
        return errno;
    }
    switch (status.st_mode & S_IFMT) {
        case S_IFREG:
            return copyFile(source_, copy_);
        case S_IFLNK:
            return copyLink(source_, copy_);
        case S_IFDIR:
            break;
        default:
            return EOPNOTSUPP;
    }
    if (fstat(copy_.folder.get(), &status) != 0) {
        return errno;
    }
    place_ = {.device = status.st_dev, .inode = status.st_ino};
    if (const int error = enter(source_, copy_); error != 0) {
        return error;
    }
    *sourceFolder = {.device = levels_[0].status.st_dev, .inode = levels_[0].status.st_ino};
    const int error = copyEntries();
    return error != 0 ? error : copyFolders();
}

int TreeCopy::copyFolders() {
    std::string name;
    while (!levels_.empty()) {
        int error = 0;
        if (!pending_.next(&name)) {
            error = finish();
        } else {
            const Level& level = levels_.back();
            error = copyFolder({.folder = level.source.file(), .name = name},
                               {.folder = level.copy.file(), .name = name});
        }
        if (error != 0) {
            return error;
        }
    }
    return 0;
}

/// A folder that cannot be entered has no level of its own, so it can be left out.
int TreeCopy::copyFolder(const ItemPlace& source, const ItemPlace& copy) {
    const std::size_t depth = levels_.size();
    const int error = enter(source, copy);
    if (error != 0 && levels_.size() == depth) {
        return leaveOut(copy, error);
    }
    return error != 0 ? error : copyEntries();
}

/// Goes down into a folder of the source and makes its copy.
int TreeCopy::enter(const ItemPlace& source, const ItemPlace& copy) {
    Level level{.pathLength = path_.size()};
    int error = level.source.open(source.folder.get(), source.name.c_str());
    if (error == 0 && fstat(level.source.file().get(), &level.status) != 0) {
        error = errno;
    }
    if (error == 0) {
        error = refuseItself(level.status);
    }
    if (error == 0 && mkdirat(copy.folder.get(), copy.name.c_str(), kModeWhileUnfinished) != 0) {
        error = errno;
    }
    if (error == 0) {
        error = level.copy.open(copy.folder.get(), copy.name.c_str());
    }
    if (error == 0) {
        error = CopyUserAttributes(level.source.file(), level.copy.file());
    }
    if (error != 0) {
        return error;
    }
    if (levels_.empty()) {
        error = beginWith(level.copy);
    } else {
        path_ += source.name + "/";
    }
    levels_.push_back(std::move(level));
    if (error == 0 && levels_.size() > kOpenFoldersMax) {
        Level& above = levels_[levels_.size() - 1 - kOpenFoldersMax];
        // The top of the copy stays: hard links are found from there.
        error = above.source.leave();
        if (error == 0 && &above != &levels_.front()) {
            error = above.copy.leave();
        }
    }
    return error != 0 ? error : pending_.enter();
}

/// The top of the copy. A folder with the set-group-id bit hands that and its group down: what is
/// made here has neither from anybody.
int TreeCopy::beginWith(const Folder& top) {
    const int folder = top.file().get();
    if (fchown(folder, static_cast<uid_t>(-1), getegid()) != 0 ||
        fchmod(folder, kModeWhileUnfinished) != 0) {
        return errno;
    }
    mask_ = MaskOfNewFiles(top.file());
    return 0;
}

/// A copy that lies inside its source would never end: it is met in the folder that it is made in.
int TreeCopy::refuseItself(const struct stat& status) {
    const Folder::Identity identity{.device = status.st_dev, .inode = status.st_ino};
    return identity == place_ ? EINVAL : 0;
}

/// The files and links of the folder that was entered last; its folders are noted.
int TreeCopy::copyEntries() {
    const Level& level = levels_.back();
    std::string name;
    return ForEachEntry(
        level.source.file(), [this, &level, &name](const char* found, unsigned char type) {
            if (type == DT_DIR) {
                return pending_.add(found);
            }
            name = found;
            const ItemPlace copy{.folder = level.copy.file(), .name = name};
            return leaveOut(copy,
                            copyEntry({.folder = level.source.file(), .name = name}, copy, type));
        });
}

int TreeCopy::copyEntry(const ItemPlace& source, const ItemPlace& copy, unsigned char type) {
    switch (type) {
        case DT_REG:
            return copyFile(source, copy);
        case DT_LNK:
            return copyLink(source, copy);
        default:
            return leavesOut_ ? EOPNOTSUPP : 0;  // no device node, socket or FIFO comes along
    }
}

/// Leaves the folder that was entered last, complete.
int TreeCopy::finish() {
    const Level level = std::move(levels_.back());
    levels_.pop_back();
    pending_.leave();
    path_.resize(level.pathLength);
    if (!levels_.empty()) {
        int error = levels_.back().source.comeBackFrom(level.source);
        if (error == 0) {
            error = levels_.back().copy.comeBackFrom(level.copy);
        }
        if (error != 0) {
            return error;
        }
    }
    return FinishFolder(level.copy.file(), level.status);
}

int TreeCopy::copyFile(const ItemPlace& source, const ItemPlace& copy) {
    const OwnedFd file(openat(source.folder.get(), source.name.c_str(), kSourceFlags));
    if (!file.isOpen()) {
        const int error = errno;
        return error == ENXIO ? leaveOut(source) : error;
    }

    struct stat status {};

    if (fstat(file.get(), &status) != 0) {
        return errno;
    }
    if (!S_ISREG(status.st_mode)) {
        return leaveOut(source);
    }
    if (int error = 0; status.st_nlink > 1 && !levels_.empty() &&
                       hardLinks_.linkAgain(status, levels_.front().copy.file(), copy, &error)) {
        return error;
    }
    const OwnedFd made(openat(copy.folder.get(),
                              copy.name.c_str(),
                              kNewFileFlags,
                              status.st_mode & (S_IRWXU | S_IRWXG | S_IRWXO)));
    if (!made.isOpen()) {
        return errno;
    }
    int error = CopyContents(file, status, made);
    if (error == 0) {
        error = CopyUserAttributes(file, made);
    }
    if (error == 0) {
        error = FinishFile(made, status, mask_);
    }
    return error != 0 ? error : rememberName(status, copy.name);
}

/// What its folder called a file and is none: a mount point, or put there just now.
int TreeCopy::leaveOut(const ItemPlace& source) {
    struct stat status {};

    if (fstatat(source.folder.get(), source.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
        return errno;
    }
    if (S_ISREG(status.st_mode) || S_ISDIR(status.st_mode) || S_ISLNK(status.st_mode)) {
        return ESTALE;
    }
    return levels_.empty() ? EOPNOTSUPP : 0;
}

int TreeCopy::copyLink(const ItemPlace& source, const ItemPlace& copy) {
    // Its contents and its times are those of one and the same link.
    const Opened link = OpenPath(source.folder.get(), source.name.c_str());

    struct stat status {};

    if (link.error != 0 || fstat(link.file.get(), &status) != 0) {
        return link.error != 0 ? link.error : errno;
    }
    if (int error = 0; status.st_nlink > 1 && !levels_.empty() &&
                       hardLinks_.linkAgain(status, levels_.front().copy.file(), copy, &error)) {
        return error;
    }
    std::array<char, PATH_MAX> text{};
    const ssize_t length = readlinkat(link.file.get(), "", text.data(), text.size() - 1);
    if (length < 0) {
        return errno == ENOENT ? ESTALE : errno;  // no link any more
    }
    const int folder = copy.folder.get();
    const std::array times{status.st_atim, status.st_mtim};
    if (symlinkat(text.data(), folder, copy.name.c_str()) != 0 ||
        utimensat(folder, copy.name.c_str(), times.data(), AT_SYMLINK_NOFOLLOW) != 0) {
        return errno;
    }
    if (levels_.empty() &&
        fchownat(
            folder, copy.name.c_str(), static_cast<uid_t>(-1), getegid(), AT_SYMLINK_NOFOLLOW) !=
            0) {
        return errno;
    }
    // A link of root's is one that leads us: this one stays whose it was. Nobody sees it before.
    if (status.st_uid != geteuid() &&
        fchownat(folder, copy.name.c_str(), status.st_uid, status.st_gid, AT_SYMLINK_NOFOLLOW) !=
            0) {
        return errno;
    }
    return rememberName(status, copy.name);
}

int TreeCopy::rememberName(const struct stat& status, const std::string& name) {
    return status.st_nlink > 1 && !levels_.empty() ? hardLinks_.remember(status, path_ + name) : 0;
}

/// 0 if whoever asked for the copy does without this item, of which nothing stays.
int TreeCopy::leaveOut(const ItemPlace& copy, int error) {
    if (error == 0 || !leavesOut_ || ConcernsAllItems(error) ||
        !leavesOut_(path_ + copy.name, error)) {
        return error;
    }
    const int result = unlinkat(copy.folder.get(), copy.name.c_str(), 0);
    if (result != 0 && errno == EISDIR) {
        (void)unlinkat(copy.folder.get(), copy.name.c_str(), AT_REMOVEDIR);
    }
    return 0;
}

}  // namespace

int CopyTree(const ItemPlace& source,
             const ItemPlace& copy,
             Folder::Identity* sourceFolder,
             const LeaveOutHandler& leavesOut) {
    return TreeCopy(source, copy, leavesOut).copy(sourceFolder);
}

}  // namespace platform
