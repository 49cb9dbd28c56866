#include "platform/linux/FileCopy.h"

#include <fcntl.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <span>
#include <string_view>
#include <vector>

namespace platform {
namespace {

/// To this size reading and writing is quicker than having the kernel move pages.
constexpr off_t kSmallFile = 64 << 10;
constexpr std::size_t kBufferSize = 64 << 10;
constexpr off_t kMostAtOnce = 1 << 30;
constexpr off_t kBytesOfBlock = 512;
constexpr std::string_view kUserAttributes = "user.";
constexpr auto kAsItIs = static_cast<uid_t>(-1);

/// What a kernel or a pair of file systems answers that cannot copy for us.
bool IsUnableToCopy(int error) {
    return error == EXDEV || error == EINVAL || error == ENOSYS || error == EOPNOTSUPP ||
           error == EBADF || error == EPERM || error == ETXTBSY;
}

int WriteAll(const OwnedFd& file, std::span<const std::byte> bytes) {
    while (!bytes.empty()) {
        const ssize_t count = write(file.get(), bytes.data(), bytes.size());
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count <= 0) {
            return count < 0 ? errno : EIO;
        }
        bytes = bytes.subspan(static_cast<std::size_t>(count));
    }
    return 0;
}

/// Between where both descriptors stand. A file that has become shorter ends it.
int ReadAndWrite(const OwnedFd& source, off_t length, const OwnedFd& copy) {
    std::array<std::byte, kBufferSize> buffer;  // not cleared: it need not be
    while (length > 0) {
        const auto wanted = std::min(static_cast<std::size_t>(length), buffer.size());
        const ssize_t count = read(source.get(), buffer.data(), wanted);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count <= 0) {
            return count < 0 ? errno : 0;
        }
        const auto taken = static_cast<std::size_t>(count);
        if (const int error = WriteAll(copy, std::span(buffer).first(taken)); error != 0) {
            return error;
        }
        length -= count;
    }
    return 0;
}

/// The same by the kernel, which shares the blocks where it can.
int CopyRange(const OwnedFd& source, off_t length, const OwnedFd& copy) {
    while (length > 0) {
        const auto wanted = static_cast<std::size_t>(std::min(length, kMostAtOnce));
        const ssize_t count =
            copy_file_range(source.get(), nullptr, copy.get(), nullptr, wanted, 0);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count < 0) {
            return IsUnableToCopy(errno) ? ReadAndWrite(source, length, copy) : errno;
        }
        if (count == 0) {
            // The end, or a file system that cannot say so: reading tells.
            return ReadAndWrite(source, length, copy);
        }
        length -= count;
    }
    return 0;
}

/// Piece by piece between the holes; then the size, since a file may end with one.
int CopySparse(const OwnedFd& source, off_t size, const OwnedFd& copy) {
    for (off_t at = 0; at < size;) {
        const off_t start = lseek(source.get(), at, SEEK_DATA);
        if (start < 0 && errno != ENXIO) {
            return errno;
        }
        if (start < 0 || start >= size) {
            break;
        }
        const off_t end = lseek(source.get(), start, SEEK_HOLE);
        if (end < 0 || lseek(source.get(), start, SEEK_SET) < 0 ||
            lseek(copy.get(), start, SEEK_SET) < 0) {
            return errno;
        }
        at = std::min(end, size);
        if (const int error = CopyRange(source, at - start, copy); error != 0) {
            return error;
        }
    }
    return ftruncate(copy.get(), size) == 0 ? 0 : errno;
}

int CopyAttribute(const OwnedFd& source, const char* name, const OwnedFd& copy) {
    std::vector<char> value(XATTR_SIZE_MAX);
    const ssize_t size = fgetxattr(source.get(), name, value.data(), value.size());
    if (size < 0) {
        return errno == ENODATA ? 0 : errno;  // somebody has just taken it away
    }
    return fsetxattr(copy.get(), name, value.data(), static_cast<std::size_t>(size), 0) == 0
               ? 0
               : errno;
}

int SetTimes(const OwnedFd& copy, const struct stat& status) {
    const std::array times{status.st_atim, status.st_mtim};
    return futimens(copy.get(), times.data()) == 0 ? 0 : errno;
}

}  // namespace

int CopyContents(const OwnedFd& source, const struct stat& status, const OwnedFd& copy) {
    const off_t size = status.st_size;
    if (size == 0) {
        return 0;
    }
    if (status.st_blocks * kBytesOfBlock < size) {
        return CopySparse(source, size, copy);
    }
    return size <= kSmallFile ? ReadAndWrite(source, size, copy) : CopyRange(source, size, copy);
}

int CopyUserAttributes(const OwnedFd& source, const OwnedFd& copy) {
    std::array<char, 256> few{};
    std::vector<char> many;
    std::span<char> names(few);
    ssize_t length = flistxattr(source.get(), names.data(), names.size());
    if (length < 0 && errno == ERANGE) {
        many.resize(XATTR_LIST_MAX);
        names = many;
        length = flistxattr(source.get(), names.data(), names.size());
    }
    if (length < 0) {
        return errno == EOPNOTSUPP ? 0 : errno;
    }
    for (const char* name = names.data(); name < names.data() + length;
         name += std::string_view(name).size() + 1) {
        if (!std::string_view(name).starts_with(kUserAttributes)) {
            continue;
        }
        if (const int error = CopyAttribute(source, name, copy); error != 0) {
            return error == EOPNOTSUPP ? 0 : error;
        }
    }
    return 0;
}

mode_t ModeOfCopy(const struct stat& status) {
    return status.st_mode & (S_IRWXU | S_IRWXG | S_IRWXO | S_ISVTX);
}

ModeMask MaskOfNewFiles(const OwnedFd& folder) {
    if (fgetxattr(folder.get(), "system.posix_acl_default", nullptr, 0) >= 0) {
        return {};
    }
    // The only way to read it without changing it under other threads.
    constexpr std::string_view kKey = "\nUmask:";
    const OwnedFd status(open("/proc/self/status", O_RDONLY | O_CLOEXEC));
    std::array<char, 1024> text{};
    const ssize_t length = read(status.get(), text.data(), text.size() - 1);
    const char* const found = length > 0 ? std::strstr(text.data(), kKey.data()) : nullptr;
    if (found == nullptr) {
        return {};
    }
    return {.isKnown = true,
            .bits = static_cast<mode_t>(std::strtoul(found + kKey.size(), nullptr, 8))};
}

int FinishFile(const OwnedFd& copy, const struct stat& status, const ModeMask& mask) {
    const mode_t mode = ModeOfCopy(status);
    bool hasMode = (mode & (mask.bits | S_ISVTX)) == 0;
    if (!mask.isKnown) {
        constexpr mode_t kModeBits = 07777;

        struct stat made {};

        if (fstat(copy.get(), &made) != 0 ||
            (made.st_gid != getegid() && fchown(copy.get(), kAsItIs, getegid()) != 0)) {
            return errno;
        }
        hasMode = (made.st_mode & kModeBits) == mode;
    }
    return hasMode || fchmod(copy.get(), mode) == 0 ? SetTimes(copy, status) : errno;
}

int FinishFolder(const OwnedFd& copy, const struct stat& status) {
    return fchmod(copy.get(), ModeOfCopy(status)) == 0 ? SetTimes(copy, status) : errno;
}

}  // namespace platform
