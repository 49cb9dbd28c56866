#include "platform/linux/ReplacementFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "platform/linux/OwnedFd.h"

namespace platform {
namespace {

constexpr mode_t kModeWhileUnfinished = S_IRUSR | S_IWUSR;

/// Gathers the pieces of the text and writes them to a file.
class Output {
public:
    explicit Output(const OwnedFd& file) : file_(file) { buffer_.reserve(kBufferSize); }

    void put(std::string_view text) {
        if (buffer_.size() + text.size() > kBufferSize) {
            flush();
        }
        if (text.size() > kBufferSize) {
            write(text);
        } else {
            buffer_ += text;
        }
    }

    /// 0 when everything reached the disk.
    [[nodiscard]] int finish() {
        flush();
        return error_ == 0 && fsync(file_.get()) != 0 ? errno : error_;
    }

private:
    static constexpr std::size_t kBufferSize = 64U << 10;

    void flush() {
        write(buffer_);
        buffer_.clear();
    }

    void write(std::string_view text) {
        while (error_ == 0 && !text.empty()) {
            const ssize_t count = ::write(file_.get(), text.data(), text.size());
            if (count < 0 && errno != EINTR) {
                error_ = errno;
            }
            text.remove_prefix(count > 0 ? static_cast<std::size_t>(count) : 0);
        }
    }

    const OwnedFd& file_;
    std::string buffer_;
    int error_ = 0;
};

}  // namespace

ReplacementFile::~ReplacementFile() {
    if (isMade_) {
        unlinkat(folder_, temporaryName_.c_str(), 0);
    }
}

/// Nobody can have us write through what they put there: it is removed, and made anew by us.
int ReplacementFile::make(mode_t mode, const std::function<void(const Put&)>& produce) {
    // What stays in the way all the same fails the creation.
    (void)unlinkat(folder_, temporaryName_.c_str(), 0);
    const OwnedFd file(openat(folder_,
                              temporaryName_.c_str(),
                              O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC,
                              kModeWhileUnfinished));
    if (!file.isOpen()) {
        return errno;
    }
    isMade_ = true;
    if (fchmod(file.get(), mode) != 0) {
        return errno;
    }
    Output output(file);
    produce([&output](std::string_view text) { output.put(text); });
    return output.finish();
}

int ReplacementFile::takePlace(const std::string& name) {
    if (renameat(folder_, temporaryName_.c_str(), folder_, name.c_str()) != 0) {
        return errno;
    }
    isMade_ = false;
    return SyncFolder(folder_);
}

int SyncFolder(int folder) {
    const OwnedFd readable(openat(folder, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return readable.isOpen() && fsync(readable.get()) != 0 ? errno : 0;
}

}  // namespace platform
