#include "platform/linux/Folder.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <string_view>

namespace platform {
namespace {

constexpr int kOpenFolder = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
constexpr std::size_t kPendingBytesMax = 64U << 20;
/// What a name or a level costs beside its letters.
constexpr std::size_t kOverhead = 64;

bool IsItselfOrAbove(std::string_view name) {
    return name == "." || name == "..";
}

unsigned char TypeOf(const OwnedFd& folder, const dirent64& entry) {
    struct stat status {};

    if (entry.d_type == DT_UNKNOWN &&
        fstatat(folder.get(), entry.d_name, &status, AT_SYMLINK_NOFOLLOW) == 0) {
        return static_cast<unsigned char>(IFTODT(status.st_mode));
    }
    return entry.d_type;
}

}  // namespace

int Folder::open(int parent, const char* name) {
    file_.reset(openat(parent, name, kOpenFolder));
    return file_.isOpen() ? 0 : errno;
}

int Folder::identify(Identity* identity) const {
    struct stat status {};

    if (fstat(file_.get(), &status) != 0) {
        return errno;
    }
    *identity = {.device = status.st_dev, .inode = status.st_ino};
    return 0;
}

int Folder::leave() {
    const int error = identify(&identity_);
    file_.reset();
    return error;
}

int Folder::comeBackFrom(const Folder& below) {
    if (file_.isOpen()) {
        return 0;
    }
    Identity found;
    int error = open(below.file().get(), "..");
    if (error == 0) {
        error = identify(&found);
    }
    return error == 0 && found != identity_ ? ESTALE : error;
}

int ForEachEntry(const OwnedFd& folder, const EntryVisitor& visit) {
    constexpr std::size_t kBufferSize = 32U << 10;
    alignas(dirent64) std::array<char, kBufferSize> buffer;  // not cleared: it need not be
    for (;;) {
        const ssize_t length = getdents64(folder.get(), buffer.data(), buffer.size());
        if (length <= 0) {
            return length < 0 ? errno : 0;
        }
        for (const char* at = buffer.data(); at < buffer.data() + length;) {
            const auto* const entry = reinterpret_cast<const dirent64*>(at);
            at += entry->d_reclen;
            if (IsItselfOrAbove(entry->d_name)) {
                continue;
            }
            if (const int error = visit(entry->d_name, TypeOf(folder, *entry)); error != 0) {
                return error;
            }
        }
    }
}

int PendingFolders::enter() {
    counts_.push_back(0);
    return take(kOverhead);
}

int PendingFolders::add(const char* name) {
    names_.emplace_back(name);
    ++counts_.back();
    return take(names_.back().size() + kOverhead);
}

bool PendingFolders::next(std::string* name) {
    if (counts_.back() == 0) {
        return false;
    }
    --counts_.back();
    bytes_ -= names_.back().size() + kOverhead;
    *name = std::move(names_.back());
    names_.pop_back();
    return true;
}

void PendingFolders::leave() {
    counts_.pop_back();
    bytes_ -= kOverhead;
}

int PendingFolders::take(std::size_t bytes) {
    bytes_ += bytes;
    return bytes_ > kPendingBytesMax ? E2BIG : 0;
}

}  // namespace platform
