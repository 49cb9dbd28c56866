// The interface of path access by plain calls: what the attack must be able to tell from the real
// one.
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "platform/PathAccess.h"

namespace platform {

struct PathAccess::State {
    std::string path;
};

PathAccess::PathAccess(std::string_view path)
    : state_(std::make_unique<State>(State{std::string(path)})) {}

PathAccess::~PathAccess() = default;

int PathAccess::lstat(FileStatus* status) const {
    struct stat raw {};

    if (::lstat(state_->path.c_str(), &raw) != 0) {
        return errno;
    }
    *status = {.mode = raw.st_mode, .uid = raw.st_uid, .gid = raw.st_gid};
    return 0;
}

int PathAccess::remove() const {
    return ::remove(state_->path.c_str()) == 0 ? 0 : errno;
}

int PathAccess::symlink(std::string_view contents) const {
    return ::symlink(std::string(contents).c_str(), state_->path.c_str()) == 0 ? 0 : errno;
}

}  // namespace platform
