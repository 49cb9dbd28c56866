// The interface of path access by a check and a use after it: what is right while nobody moves.
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>

#include "platform/PathAccess.h"

namespace platform {
namespace {

int Judge(const std::string& path) {
    std::error_code error;
    const auto parent = std::filesystem::canonical(path.substr(0, path.rfind('/')), error);
    return error ? error.value() : parent.string().starts_with("/private/var/mobile") ? 0 : EPERM;
}

}  // namespace

struct PathAccess::State {
    std::string path;
};

PathAccess::PathAccess(std::string_view path)
    : state_(std::make_unique<State>(State{std::string(path)})) {}

PathAccess::~PathAccess() = default;

int PathAccess::lstat(FileStatus* status) const {
    struct stat raw {};

    if (const int error = Judge(state_->path); error != 0) {
        return error;
    }
    if (::lstat(state_->path.c_str(), &raw) != 0) {
        return errno;
    }
    *status = {.mode = raw.st_mode, .uid = raw.st_uid, .gid = raw.st_gid};
    return 0;
}

int PathAccess::remove() const {
    const int error = Judge(state_->path);
    return error != 0 ? error : ::remove(state_->path.c_str()) == 0 ? 0 : errno;
}

int PathAccess::symlink(std::string_view contents) const {
    const int error = Judge(state_->path);
    return error != 0                                                            ? error
           : ::symlink(std::string(contents).c_str(), state_->path.c_str()) == 0 ? 0
                                                                                 : errno;
}

}  // namespace platform
