#include "platform/linux/PropertyListFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "platform/Assertion.h"
#include "platform/PropertyListXml.h"
#include "platform/linux/OwnedFd.h"

namespace platform {
namespace {

using Contents = PropertyListFile::Contents;
using State = PropertyListFile::State;

/// One name for all files of a folder: whatever a crash leaves behind, the next write removes.
constexpr const char* kTemporaryName = ".linefold-mobile-helper.tmp";
constexpr const char* kNotRegular = "is not a regular file";

std::string ErrorText(int error) {
    return strerrordesc_np(error);
}

Contents Unusable(State state, std::string complaint) {
    return {.state = state, .complaint = std::move(complaint)};
}

Contents NotOpened(int error, PropertyListFile::Links links) {
    if (error == ENOENT) {
        return {};
    }
    const bool isLink = error == ELOOP && links == PropertyListFile::Links::kRefused;
    return Unusable(State::kUnreadable,
                    isLink ? kNotRegular : "cannot be read: " + ErrorText(error));
}

/// The bytes of a file of at most the largest size, or an errno value. Files can grow while they
/// are read.
int ReadWhole(const OwnedFd& file, std::size_t size, std::vector<std::byte>& bytes) {
    constexpr std::size_t kMost = kPropertyListLimits.bytes;
    bytes.resize(size + 1);
    std::size_t length = 0;
    for (;;) {
        if (length > kMost) {
            return EFBIG;
        }
        if (length == bytes.size()) {
            bytes.resize(std::min(length * 2, kMost + 1));
        }
        const ssize_t count = ::read(file.get(), bytes.data() + length, bytes.size() - length);
        if (count < 0 && errno != EINTR) {
            return errno;
        }
        if (count == 0) {
            bytes.resize(length);
            return 0;
        }
        length += count > 0 ? static_cast<std::size_t>(count) : 0;
    }
}

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

/// A folder is opened for reading to be synced; where that is not allowed, what was done in it is
/// as sure as the file system makes it.
int SyncFolder(int folder) {
    const OwnedFd readable(openat(folder, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return readable.isOpen() && fsync(readable.get()) != 0 ? errno : 0;
}

/// A complete new file beside the old one; goes with the object unless it took the old one's place.
class Replacement {
public:
    explicit Replacement(int folder) : folder_(folder) {}

    ~Replacement() {
        if (isMade_) {
            unlinkat(folder_, kTemporaryName, 0);
        }
    }

    Replacement(const Replacement&) = delete;
    Replacement& operator=(const Replacement&) = delete;

    /// Nobody can have us write through what they put there: it is removed, and made anew by us.
    [[nodiscard]] int make(const PropertyList& entries, mode_t mode) {
        // What stays in the way all the same fails the creation.
        (void)unlinkat(folder_, kTemporaryName, 0);
        const OwnedFd file(openat(folder_,
                                  kTemporaryName,
                                  O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC,
                                  S_IRUSR | S_IWUSR));
        if (!file.isOpen()) {
            return errno;
        }
        isMade_ = true;
        if (fchmod(file.get(), mode) != 0) {
            return errno;
        }
        Output output(file);
        WriteXmlPropertyList(entries, [&output](std::string_view text) { output.put(text); });
        return output.finish();
    }

    [[nodiscard]] int takePlaceOf(const std::string& name) {
        if (renameat(folder_, kTemporaryName, folder_, name.c_str()) != 0) {
            return errno;
        }
        isMade_ = false;
        return SyncFolder(folder_);
    }

private:
    const int folder_;
    bool isMade_ = false;
};

std::string KeptName(const std::string& name) {
    return name + ".damaged";
}

/// Gives the damaged file a second name, since the new one is about to take its first. One that was
/// kept earlier goes.
int KeepDamaged(int folder, const std::string& name) {
    const std::string kept = KeptName(name);
    if (unlinkat(folder, kept.c_str(), 0) != 0 && errno != ENOENT) {
        return errno;
    }
    if (linkat(folder, name.c_str(), folder, kept.c_str(), 0) == 0) {
        return 0;
    }
    // Where it may not have two names, as a file of somebody else's, it changes its one. Should the
    // system stop now, the file counts as empty, as it did.
    return renameat(folder, name.c_str(), folder, kept.c_str()) == 0 ? 0 : errno;
}

}  // namespace

Contents PropertyListFile::read(Links links) const {
    // Whatever it is, opening it must not wait: a FIFO without a writer would hold us for ever.
    const int refusal = links == Links::kRefused ? O_NOFOLLOW : 0;
    const OwnedFd file(
        openat(folder_, name_.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC | refusal));
    if (!file.isOpen()) {
        return NotOpened(errno, links);
    }

    struct stat status {};

    if (fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) {
        return Unusable(State::kUnreadable, kNotRegular);
    }
    std::vector<std::byte> bytes;
    const bool isTooLarge = status.st_size > static_cast<off_t>(kPropertyListLimits.bytes);
    const int error =
        isTooLarge ? EFBIG : ReadWhole(file, static_cast<std::size_t>(status.st_size), bytes);
    if (error != 0) {
        return Unusable(State::kUnreadable, "cannot be read: " + ErrorText(error));
    }
    auto entries = PropertyListCreateWithData(bytes);
    if (!entries || entries->kind() != PropertyList::Kind::kDictionary) {
        return Unusable(State::kDamaged, "is damaged: it holds no property list with a dictionary");
    }
    return {.state = State::kRead, .entries = std::move(*entries), .fileSize = bytes.size()};
}

std::string PropertyListFile::replace(const Contents& contents, mode_t mode) const {
    PLATFORM_ASSERT(contents.state != State::kUnreadable);
    if (!XmlPropertyListSize(contents.entries)) {
        return "cannot be written: it would hold more than 16 MiB or 200,000 objects, or "
               "characters that XML cannot hold";
    }
    Replacement replacement(folder_);
    int error = replacement.make(contents.entries, mode);
    if (error == 0 && contents.state == State::kDamaged) {
        error = KeepDamaged(folder_, name_);
    }
    if (error == 0) {
        error = replacement.takePlaceOf(name_);
    }
    return error == 0 ? std::string() : "cannot be written: " + ErrorText(error);
}

bool PropertyListFile::removeKept() const {
    bool isRemoved = false;
    for (const std::string& name : {KeptName(name_), std::string(kTemporaryName)}) {
        if (unlinkat(folder_, name.c_str(), 0) == 0) {
            isRemoved = true;
        } else if (errno != ENOENT) {
            return false;
        }
    }
    return !isRemoved || SyncFolder(folder_) == 0;
}

}  // namespace platform
