#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <fstream>

#include "tests/attack/NaivePath.h"

namespace platform {

int ErrorOf(int result) {
    return result == 0 ? 0 : errno;
}

namespace {

int Look(const std::string& path, int (*look)(const char*, struct stat*), FileStatus* status) {
    struct stat raw {};

    if (const int error = Judge(path); error != 0) {
        return error;
    }
    if (look(path.c_str(), &raw) != 0) {
        return errno;
    }
    *status = {.mode = raw.st_mode, .uid = raw.st_uid, .gid = raw.st_gid};
    return 0;
}

}  // namespace

PathAccess::PathAccess(std::string_view path)
    : state_(std::make_unique<State>(State{std::string(path)})) {}

PathAccess::PathAccess(std::unique_ptr<State> state) : state_(std::move(state)) {}

PathAccess::PathAccess(PathAccess&&) noexcept = default;
PathAccess& PathAccess::operator=(PathAccess&&) noexcept = default;
PathAccess::~PathAccess() = default;

int PathAccess::lstat(FileStatus* status) const {
    return Look(state_->path, ::lstat, status);
}

int PathAccess::stat(FileStatus* status) const {
    return Look(state_->path, ::stat, status);
}

int PathAccess::remove() const {
    const int error = Judge(state_->path);
    return error != 0 ? error : ErrorOf(::remove(state_->path.c_str()));
}

int PathAccess::removeDirectory() const {
    const int error = Judge(state_->path);
    return error != 0 ? error : ErrorOf(rmdir(state_->path.c_str()));
}

int PathAccess::symlink(std::string_view contents) const {
    const int error = Judge(state_->path);
    return error != 0 ? error
                      : ErrorOf(::symlink(std::string(contents).c_str(), state_->path.c_str()));
}

int PathAccess::readLink(std::string* contents) const {
    std::error_code error;
    *contents = std::filesystem::read_symlink(state_->path, error).string();
    return error.value();
}

int PathAccess::realPath(std::string* path) const {
    std::error_code error;
    *path = std::filesystem::canonical(state_->path, error).string();
    return error.value();
}

int PathAccess::read(std::size_t most, std::vector<std::byte>* contents) const {
    std::ifstream file(state_->path, std::ios::binary);
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    const auto bytes = std::as_bytes(std::span(text));
    contents->assign(bytes.begin(), bytes.end());
    return text.size() > most ? EFBIG : 0;
}

int PathAccess::setOwner(std::uint32_t uid, std::uint32_t gid) const {
    const int error = Judge(state_->path);
    return error != 0 ? error : ErrorOf(chown(state_->path.c_str(), uid, gid));
}

int PathAccess::setMode(std::uint32_t mode) const {
    const int error = Judge(state_->path);
    return error != 0 ? error : ErrorOf(chmod(state_->path.c_str(), mode));
}

}  // namespace platform
