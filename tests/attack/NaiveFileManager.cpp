#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>

#include "platform/DirectoryAccess.h"
#include "platform/FileManager.h"
#include "platform/linux/OwnedFd.h"
#include "tests/attack/NaivePath.h"

namespace platform {
namespace {

namespace fs = std::filesystem;

const std::string& PathOf(const PathAccess& access) {
    return access.state().path;
}

int JudgeBoth(const PathAccess& source, const PathAccess& destination) {
    const int error = Judge(PathOf(source));
    return error != 0 ? error : Judge(PathOf(destination));
}

/// The calls of the library throw where a folder vanishes under them.
template <typename Work>
int Guarded(const Work& work) {
    try {
        return work();
    } catch (const fs::filesystem_error& error) {
        return error.code().value();
    }
}

}  // namespace

int FileManagerCopyItem(const PathAccess& source,
                        const PathAccess& destination,
                        const LeaveOutHandler& /*leavesOut*/) {
    const int refusal = JudgeBoth(source, destination);
    return refusal != 0 ? refusal : Guarded([&] {
        if (fs::exists(fs::symlink_status(PathOf(destination)))) {
            return EEXIST;
        }
        fs::copy(PathOf(source),
                 PathOf(destination),
                 fs::copy_options::recursive | fs::copy_options::copy_symlinks);
        return 0;
    });
}

int FileManagerMoveItem(const PathAccess& source, const PathAccess& destination) {
    const int refusal = JudgeBoth(source, destination);
    return refusal != 0 ? refusal
                        : ErrorOf(std::rename(PathOf(source).c_str(), PathOf(destination).c_str()));
}

int FileManagerRemoveItem(const PathAccess& item) {
    const int refusal = Judge(PathOf(item));
    return refusal != 0 ? refusal
                        : Guarded([&] { return fs::remove_all(PathOf(item)) != 0 ? 0 : ENOENT; });
}

int FileManagerSetAttributes(const FileAttributes& attributes, const PathAccess& item) {
    int error = 0;
    if (attributes.owner) {
        error = item.setOwner(*attributes.owner, attributes.group.value_or(0));
    }
    return attributes.permissions ? item.setMode(*attributes.permissions) : error;
}

int FileManagerCreateDirectory(std::string_view path,
                               IntermediateDirectories /*intermediates*/,
                               const FileAttributes& /*attributes*/) {
    const int refusal = Judge(std::string(path));
    return refusal != 0 ? refusal : Guarded([&] {
        fs::create_directories(path);
        return 0;
    });
}

int FileManagerReplaceContents(const PathAccess& item, std::span<const std::byte> contents) {
    if (const int refusal = Judge(PathOf(item)); refusal != 0) {
        return refusal;
    }
    // It may be led astray; it must not wait for ever on a FIFO.
    constexpr int kFlags = O_WRONLY | O_CREAT | O_TRUNC | O_NONBLOCK | O_CLOEXEC;
    const OwnedFd file(open(PathOf(item).c_str(), kFlags, 0644));
    const ssize_t written = write(file.get(), contents.data(), contents.size());
    return written == static_cast<ssize_t>(contents.size()) ? 0 : EIO;
}

struct DirectoryAccess::State {
    std::string path;
};

DirectoryAccess::DirectoryAccess(const PathAccess& path)
    : state_(std::make_unique<State>(State{PathOf(path)})) {}

DirectoryAccess::~DirectoryAccess() = default;

int DirectoryAccess::list(std::vector<std::string>* names) const {
    return Guarded([&] {
        for (const auto& entry : fs::directory_iterator(state_->path)) {
            names->push_back(entry.path().filename());
        }
        return 0;
    });
}

int DirectoryAccess::subpaths(std::vector<std::string>* paths) const {
    return Guarded([&] {
        for (const auto& entry : fs::recursive_directory_iterator(state_->path)) {
            paths->push_back(entry.path().lexically_relative(state_->path));
        }
        return 0;
    });
}

PathAccess DirectoryAccess::item(std::string_view subpath) const {
    return PathAccess(state_->path + "/" + std::string(subpath));
}

int DirectoryAccess::makeDirectories(std::string_view subpath) const {
    return FileManagerCreateDirectory(
        state_->path + "/" + std::string(subpath), IntermediateDirectories::kAreMade, {});
}

}  // namespace platform
