#include "platform/PathAccess.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>

#include "platform/linux/OwnedFd.h"

namespace platform {
namespace {

constexpr int kMaxLinks = 40;

/// An open file or directory, or why there is none.
struct Opened {
    OwnedFd file;
    int error = 0;
};

Opened OpenPath(int directory, const char* name) {
    OwnedFd file(openat(directory, name, O_PATH | O_NOFOLLOW | O_CLOEXEC));
    const int error = file.isOpen() ? 0 : errno;
    return {.file = std::move(file), .error = error};
}

/// One walk along a path. All the links that it meets, nested ones too, count together.
class Walk {
public:
    /// Where the path leads from `from`, links in the last step followed as well.
    Opened follow(std::string_view path, int from) {
        Opened place = OpenPath(from, path.starts_with('/') ? "/" : ".");
        while (place.error == 0) {
            const auto start = path.find_first_not_of('/');
            if (start == std::string_view::npos) {
                break;
            }
            path.remove_prefix(start);
            const std::string name(path.substr(0, path.find('/')));
            path.remove_prefix(name.size());
            if (name != ".") {
                place = step(place.file, name);
            }
        }
        return place;
    }

    Opened step(const OwnedFd& directory, const std::string& name) {
        Opened found = OpenPath(directory.get(), name.c_str());

        struct stat status {};

        if (found.error == 0 && fstat(found.file.get(), &status) != 0) {
            found.error = errno;
        }
        if (found.error != 0 || !S_ISLNK(status.st_mode)) {
            return found;
        }
        return followLink(directory, found.file, status.st_uid);
    }

private:
    /// A link is read from its own descriptor, and its target judged by its: nothing that is put in
    /// their places meanwhile counts.
    Opened followLink(const OwnedFd& directory, const OwnedFd& link, uid_t linkOwner) {
        std::array<char, PATH_MAX> text{};
        const ssize_t length = readlinkat(link.get(), "", text.data(), text.size());
        if (length < 0) {
            return {.file = {}, .error = errno};
        }
        if (--linksLeft_ < 0) {
            return {.file = {}, .error = ELOOP};
        }
        Opened target = follow({text.data(), static_cast<std::size_t>(length)}, directory.get());

        struct stat status {};

        if (target.error == 0 && fstat(target.file.get(), &status) != 0) {
            target.error = errno;
        }
        // The mobile user may lead us to what is the mobile user's, and nowhere else.
        if (target.error == 0 && linkOwner != 0 && status.st_uid != linkOwner) {
            return {.file = {}, .error = EPERM};
        }
        return target;
    }

    int linksLeft_ = kMaxLinks;
};

/// A path up to its last step, and that step with the slashes behind it.
struct SplitPath {
    std::string_view parent;
    std::string_view last;
    bool endsInSlash = false;
};

SplitPath Split(std::string_view path) {
    const auto lastByte = path.find_last_not_of('/');
    if (lastByte == std::string_view::npos) {
        return {.parent = path, .last = "."};
    }
    const auto slash = path.rfind('/', lastByte);
    const auto start = slash == std::string_view::npos ? 0 : slash + 1;
    return {.parent = path.substr(0, start),
            .last = path.substr(start),
            .endsInSlash = lastByte + 1 != path.size()};
}

int ErrorOf(int result) {
    return result == 0 ? 0 : errno;
}

}  // namespace

struct PathAccess::State {
    OwnedFd parent;
    std::string last;
    bool endsInSlash = false;
    int error = 0;
};

PathAccess::PathAccess(std::string_view path) : state_(std::make_unique<State>()) {
    const SplitPath split = Split(path);
    Opened parent = Walk().follow(split.parent, AT_FDCWD);
    *state_ = {.parent = std::move(parent.file),
               .last = std::string(split.last),
               .endsInSlash = split.endsInSlash,
               .error = path.empty() ? ENOENT : parent.error};
}

PathAccess::PathAccess(PathAccess&&) noexcept = default;
PathAccess& PathAccess::operator=(PathAccess&&) noexcept = default;
PathAccess::~PathAccess() = default;

int PathAccess::lstat(FileStatus* status) const {
    if (state_->error != 0) {
        return state_->error;
    }
    // With a slash behind it the last step means what a link there leads to.
    const Opened found =
        state_->endsInSlash
            ? Walk().step(state_->parent, state_->last.substr(0, state_->last.find('/')))
            : OpenPath(state_->parent.get(), state_->last.c_str());

    struct stat raw {};

    if (found.error != 0 || fstat(found.file.get(), &raw) != 0) {
        return found.error != 0 ? found.error : errno;
    }
    if (state_->endsInSlash && !S_ISDIR(raw.st_mode)) {
        return ENOTDIR;
    }
    *status = {.mode = raw.st_mode, .uid = raw.st_uid, .gid = raw.st_gid};
    return 0;
}

int PathAccess::remove() const {
    if (state_->error != 0) {
        return state_->error;
    }
    const int error = ErrorOf(unlinkat(state_->parent.get(), state_->last.c_str(), 0));
    return error == EISDIR
               ? ErrorOf(unlinkat(state_->parent.get(), state_->last.c_str(), AT_REMOVEDIR))
               : error;
}

int PathAccess::symlink(std::string_view contents) const {
    if (state_->error != 0) {
        return state_->error;
    }
    return ErrorOf(
        symlinkat(std::string(contents).c_str(), state_->parent.get(), state_->last.c_str()));
}

}  // namespace platform
