#include "client/MemoryFile.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>

#include <cerrno>

namespace linefold_client {
namespace {

constexpr int kSeals = F_SEAL_WRITE | F_SEAL_GROW | F_SEAL_SHRINK;

bool WriteAll(int descriptor, std::span<const std::byte> data) {
    while (!data.empty()) {
        const ssize_t written = write(descriptor, data.data(), data.size());
        if (written > 0) {
            data = data.subspan(static_cast<std::size_t>(written));
        } else if (written == 0 || errno != EINTR) {
            return false;
        }
    }
    return true;
}

bool ReadAll(int descriptor, std::span<std::byte> into) {
    std::size_t done = 0;
    while (done < into.size()) {
        const auto rest = into.subspan(done);
        const ssize_t count = pread(descriptor, rest.data(), rest.size(), static_cast<off_t>(done));
        if (count > 0) {
            done += static_cast<std::size_t>(count);
        } else if (count == 0 || errno != EINTR) {
            return false;
        }
    }
    return true;
}

/// The seals come first: only memory files have them, and nothing else is asked for its status,
/// which a file system of somebody else could keep waiting.
bool IsSealedAndHolds(int descriptor, std::size_t size) {
    const int seals = fcntl(descriptor, F_GET_SEALS);
    if (seals < 0 || (seals & kSeals) != kSeals) {
        return false;
    }

    struct stat status {};

    return fstat(descriptor, &status) == 0 && status.st_size >= 0 &&
           static_cast<std::uint64_t>(status.st_size) >= size;
}

}  // namespace

Descriptor MakeMemoryFile(std::span<const std::byte> data) {
    Descriptor file(memfd_create("linefold-data", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    if (!file.isOpen() || !WriteAll(file.get(), data) ||
        fcntl(file.get(), F_ADD_SEALS, kSeals) != 0) {
        return Descriptor();
    }
    return file;
}

ReadResult ReadMemoryFile(int descriptor, std::size_t size, Memory& memory) {
    if (!IsSealedAndHolds(descriptor, size)) {
        return ReadResult::kUnusable;
    }
    Memory copy(std::malloc(size));
    if (copy == nullptr) {
        return ReadResult::kNoResources;
    }
    if (!ReadAll(descriptor, {static_cast<std::byte*>(copy.get()), size})) {
        return ReadResult::kUnusable;
    }
    memory = std::move(copy);
    return ReadResult::kRead;
}

}  // namespace linefold_client
