#include "platform/PathAccess.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <cstring>

#include "platform/linux/OwnedFd.h"
#include "platform/linux/PathState.h"
#include "platform/linux/PathWalk.h"
#include "platform/linux/PlatformLog.h"
#include "platform/linux/WholeFile.h"

namespace platform {
namespace {

int ErrorOf(int result) {
    return result == 0 ? 0 : errno;
}

int StatusOf(const Opened& found, bool mustBeDirectory, FileStatus* status) {
    struct stat raw {};

    if (found.error != 0 || fstat(found.file.get(), &raw) != 0) {
        return found.error != 0 ? found.error : errno;
    }
    if (mustBeDirectory && !S_ISDIR(raw.st_mode)) {
        return ENOTDIR;
    }
    *status = {.mode = raw.st_mode, .uid = raw.st_uid, .gid = raw.st_gid};
    return 0;
}

/// The item itself (O_PATH): ENOTDIR for what has a slash behind its name and is no directory.
Opened OpenItem(const PathAccess::State& state) {
    if (state.error != 0) {
        return {.file = {}, .error = state.error};
    }
    Opened item = OpenPath(state.parent.get(), state.name.c_str());
    FileStatus status;
    if (const int error = StatusOf(item, state.endsInSlash, &status); error != 0) {
        return {.file = {}, .error = error};
    }
    return item;
}

/// What the item leads to (O_PATH).
Opened FollowItem(const PathAccess::State& state) {
    return state.error != 0 ? Opened{.file = {}, .error = state.error}
                            : PathWalk().step(state.parent, state.name);
}

/// What opens, or changes, exactly what a descriptor stands for.
std::string DescriptorPath(const OwnedFd& file) {
    return "/proc/self/fd/" + std::to_string(file.get());
}

int ReadRegularFile(const OwnedFd& file, std::size_t most, std::vector<std::byte>* contents) {
    struct stat status {};

    if (fstat(file.get(), &status) != 0) {
        return errno;
    }
    const auto size = static_cast<std::size_t>(status.st_size);
    std::vector<std::byte> bytes;
    const int error = size > most ? EFBIG : ReadWhole(file, size, most, bytes);
    if (error == 0) {
        *contents = std::move(bytes);
    }
    return error;
}

/// Opens for fsync(2), which takes files and directories only.
int Synchronize(int directory, const char* name) {
    const OwnedFd file(openat(directory, name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    return ErrorOf(file.isOpen() ? fsync(file.get()) : -1);
}

}  // namespace

PathAccess::PathAccess(std::string_view path) : state_(std::make_unique<State>()) {
    const SplitPath split = Split(path);
    Opened parent = OpenParent(path);
    *state_ = {.path = std::string(path),
               .parent = std::move(parent.file),
               .name = std::string(split.last.substr(0, split.last.find('/'))),
               .endsInSlash = split.endsInSlash,
               .error = parent.error};
}

PathAccess::PathAccess(std::unique_ptr<State> state) : state_(std::move(state)) {}

PathAccess::PathAccess(PathAccess&&) noexcept = default;
PathAccess& PathAccess::operator=(PathAccess&&) noexcept = default;
PathAccess::~PathAccess() = default;

int PathAccess::lstat(FileStatus* status) const {
    if (state_->error != 0) {
        return state_->error;
    }
    // With a slash behind it the last step means what a link there leads to.
    return state_->endsInSlash
               ? stat(status)
               : StatusOf(OpenPath(state_->parent.get(), state_->name.c_str()), false, status);
}

int PathAccess::stat(FileStatus* status) const {
    if (state_->error != 0) {
        return state_->error;
    }
    return StatusOf(PathWalk().step(state_->parent, state_->name), state_->endsInSlash, status);
}

int PathAccess::remove() const {
    if (state_->error != 0) {
        return state_->error;
    }
    const int error = ErrorOf(unlinkat(state_->parent.get(), state_->nameAsGiven().c_str(), 0));
    return error == EISDIR ? removeDirectory() : error;
}

int PathAccess::removeDirectory() const {
    if (state_->error != 0) {
        return state_->error;
    }
    return ErrorOf(unlinkat(state_->parent.get(), state_->nameAsGiven().c_str(), AT_REMOVEDIR));
}

int PathAccess::symlink(std::string_view contents) const {
    if (state_->error != 0) {
        return state_->error;
    }
    return ErrorOf(symlinkat(
        std::string(contents).c_str(), state_->parent.get(), state_->nameAsGiven().c_str()));
}

int PathAccess::readLink(std::string* contents) const {
    const Opened item = OpenItem(*state_);
    if (item.error != 0) {
        return item.error;
    }
    std::array<char, PATH_MAX> text{};
    const ssize_t length = readlinkat(item.file.get(), "", text.data(), text.size());
    if (length < 0) {
        return errno == ENOENT ? EINVAL : errno;  // what is no link has no path of its own, either
    }
    contents->assign(text.data(), static_cast<std::size_t>(length));
    return 0;
}

int PathAccess::realPath(std::string* path) const {
    const Opened found = FollowItem(*state_);
    FileStatus status;
    if (const int error = StatusOf(found, state_->endsInSlash, &status); error != 0) {
        return error;
    }
    std::array<char, PATH_MAX> text{};
    const ssize_t length = readlink(DescriptorPath(found.file).c_str(), text.data(), text.size());
    if (length < 0) {
        return errno;
    }
    path->assign(text.data(), static_cast<std::size_t>(length));
    return 0;
}

int PathAccess::read(std::size_t most, std::vector<std::byte>* contents) const {
    const Opened found = FollowItem(*state_);
    FileStatus status;
    if (const int error = StatusOf(found, state_->endsInSlash, &status); error != 0) {
        return error;
    }
    if (!S_ISREG(status.mode)) {
        return EINVAL;
    }
    // Exactly what was judged is opened. Without waiting: somebody may hold a lease on the file.
    const OwnedFd file(
        open(DescriptorPath(found.file).c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    return file.isOpen() ? ReadRegularFile(file, most, contents) : errno;
}

int PathAccess::setOwner(std::uint32_t uid, std::uint32_t gid) const {
    const Opened item = OpenItem(*state_);
    return item.error != 0 ? item.error
                           : ErrorOf(fchownat(item.file.get(), "", uid, gid, AT_EMPTY_PATH));
}

int PathAccess::setMode(std::uint32_t mode) const {
    const Opened item = OpenItem(*state_);
    FileStatus status;
    if (const int error = StatusOf(item, state_->endsInSlash, &status); error != 0) {
        return error;
    }
    return S_ISLNK(status.mode) ? EOPNOTSUPP
                                : ErrorOf(chmod(DescriptorPath(item.file).c_str(), mode));
}

int PathAccess::makeDirectory(std::uint32_t mode) const {
    if (state_->error != 0) {
        return state_->error;
    }
    return ErrorOf(mkdirat(state_->parent.get(), state_->nameAsGiven().c_str(), mode));
}

int PathAccess::moveOnto(const PathAccess& destination) const {
    const State& end = *destination.state_;
    if (state_->error != 0 || end.error != 0) {
        return state_->error != 0 ? state_->error : end.error;
    }
    return ErrorOf(renameat(state_->parent.get(),
                            state_->nameAsGiven().c_str(),
                            end.parent.get(),
                            end.nameAsGiven().c_str()));
}

int PathAccess::synchronize() const {
    int error = state_->error;
    if (error == 0) {
        error = Synchronize(state_->parent.get(), state_->nameAsGiven().c_str());
    }
    if (error == 0) {
        error = Synchronize(state_->parent.get(), ".");
    }
    if (error != 0) {
        // Whoever asked has no line for this, and the disk is an operator's to mend.
        PlatformLog(LogLevel::kError,
                    "path access: %s could not be brought to disk: %s",
                    state_->path.c_str(),
                    std::strerror(error));
    }
    return error;
}

}  // namespace platform
