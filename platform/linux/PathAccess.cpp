#include "platform/PathAccess.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/linux/OwnedFd.h"
#include "platform/linux/PathWalk.h"
#include "platform/linux/PlatformLog.h"

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

/// Opens for fsync(2), which takes files and directories only.
int Synchronize(int directory, const char* name) {
    const OwnedFd file(openat(directory, name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    return ErrorOf(file.isOpen() ? fsync(file.get()) : -1);
}

}  // namespace

struct PathAccess::State {
    std::string path;
    OwnedFd parent;
    std::string last;
    bool endsInSlash = false;
    int error = 0;
};

PathAccess::PathAccess(std::string_view path) : state_(std::make_unique<State>()) {
    const SplitPath split = Split(path);
    Opened parent = OpenParent(path);
    *state_ = {.path = std::string(path),
               .parent = std::move(parent.file),
               .last = std::string(split.last),
               .endsInSlash = split.endsInSlash,
               .error = parent.error};
}

PathAccess::PathAccess(PathAccess&&) noexcept = default;
PathAccess& PathAccess::operator=(PathAccess&&) noexcept = default;
PathAccess::~PathAccess() = default;

int PathAccess::lstat(FileStatus* status) const {
    if (state_->error != 0) {
        return state_->error;
    }
    // With a slash behind it the last step means what a link there leads to.
    return state_->endsInSlash ? stat(status)
                               : StatusOf(OpenPath(state_->parent.get(), state_->last.c_str()),
                                          state_->endsInSlash,
                                          status);
}

int PathAccess::stat(FileStatus* status) const {
    if (state_->error != 0) {
        return state_->error;
    }
    const std::string name = state_->last.substr(0, state_->last.find('/'));
    return StatusOf(PathWalk().step(state_->parent, name), state_->endsInSlash, status);
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

int PathAccess::makeDirectory(std::uint32_t mode) const {
    if (state_->error != 0) {
        return state_->error;
    }
    return ErrorOf(mkdirat(state_->parent.get(), state_->last.c_str(), mode));
}

int PathAccess::moveOnto(const PathAccess& destination) const {
    const State& end = *destination.state_;
    if (state_->error != 0 || end.error != 0) {
        return state_->error != 0 ? state_->error : end.error;
    }
    return ErrorOf(
        renameat(state_->parent.get(), state_->last.c_str(), end.parent.get(), end.last.c_str()));
}

int PathAccess::synchronize() const {
    int error = state_->error;
    if (error == 0) {
        error = Synchronize(state_->parent.get(), state_->last.c_str());
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
