#include "platform/linux/WholeFile.h"

#include <algorithm>
#include <cerrno>

namespace platform {

int ReadWhole(const OwnedFd& file,
              std::size_t size,
              std::size_t most,
              std::vector<std::byte>& bytes) {
    bytes.resize(std::min(size, most) + 1);
    std::size_t length = 0;
    for (;;) {
        if (length > most) {
            return EFBIG;
        }
        if (length == bytes.size()) {
            bytes.resize(std::min(length * 2, most + 1));
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

}  // namespace platform
