#include "platform/OutputFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "platform/linux/OwnedFd.h"
#include "platform/linux/PathWalk.h"

namespace platform {
namespace {

constexpr mode_t kModeOfNewFiles = 0666;

/// How often a file may come and go between two looks at it.
constexpr int kTriesMax = 3;

int JudgeStatus(int file) {
    struct stat status {};

    if (fstat(file, &status) != 0) {
        return errno;
    }
    switch (status.st_mode & S_IFMT) {
        case S_IFREG:
            return status.st_nlink > 1 ? EMLINK : 0;
        case S_IFDIR:
            return EISDIR;
        case S_IFLNK:
            return ELOOP;
        default:
            return EINVAL;
    }
}

/// What stands there is judged before it is opened, since opening may already do something, and the
/// opened file again, since it may be another. Only then it is emptied.
Opened OpenExisting(int directory, const char* name) {
    const Opened found = OpenPath(directory, name);
    const int verdict = found.error != 0 ? found.error : JudgeStatus(found.file.get());
    if (verdict != 0) {
        return {.file = {}, .error = verdict};
    }
    OwnedFd file(
        openat(directory, name, O_WRONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (!file.isOpen()) {
        return {.file = {}, .error = errno};
    }
    const int second = JudgeStatus(file.get());
    if (second != 0 || ftruncate(file.get(), 0) != 0) {
        return {.file = {}, .error = second != 0 ? second : errno};
    }
    return {.file = std::move(file), .error = 0};
}

Opened OpenOrMake(int directory, const char* name) {
    Opened opened{.file = {}, .error = ENOENT};
    for (int tries = 0; tries < kTriesMax && opened.error == ENOENT; ++tries) {
        OwnedFd made(
            openat(directory, name, O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, kModeOfNewFiles));
        if (made.isOpen()) {
            return {.file = std::move(made), .error = 0};
        }
        if (errno != EEXIST) {
            return {.file = {}, .error = errno};
        }
        opened = OpenExisting(directory, name);
    }
    return opened;
}

int Open(std::string_view path, OwnedFd* file) {
    const Opened parent = OpenParent(path);
    if (parent.error != 0) {
        return parent.error;
    }
    const SplitPath split = Split(path);
    if (split.endsInSlash) {
        return EISDIR;
    }
    Opened opened = OpenOrMake(parent.file.get(), std::string(split.last).c_str());
    *file = std::move(opened.file);
    return opened.error;
}

}  // namespace

struct OutputFile::State {
    OwnedFd file;
};

OutputFile::OutputFile() : state_(std::make_unique<State>()) {}

OutputFile::OutputFile(OutputFile&&) noexcept = default;
OutputFile& OutputFile::operator=(OutputFile&&) noexcept = default;
OutputFile::~OutputFile() = default;

int OutputFile::open(std::string_view path) {
    state_->file.reset();
    return Open(path, &state_->file);
}

int OutputFile::write(std::span<const std::byte> bytes) {
    while (!bytes.empty()) {
        const ssize_t written = ::write(state_->file.get(), bytes.data(), bytes.size());
        if (written < 0 && errno == EINTR) {
            continue;
        }
        if (written <= 0) {
            return written < 0 ? errno : EIO;
        }
        bytes = bytes.subspan(static_cast<std::size_t>(written));
    }
    return state_->file.isOpen() ? 0 : EBADF;
}

int OutputFile::close() {
    // Linux closes the descriptor whatever close(2) says.
    return ::close(state_->file.release()) == 0 ? 0 : errno;
}

}  // namespace platform
