// The whole contents of a file, to a limit.
#pragma once

#include <cstddef>
#include <vector>

#include "platform/linux/OwnedFd.h"

namespace platform {

/// Reads a file of about this size from where it stands. 0 or an errno value, EFBIG beyond `most`
/// bytes: files can grow while they are read.
[[nodiscard]] int ReadWhole(const OwnedFd& file,
                            std::size_t size,
                            std::size_t most,
                            std::vector<std::byte>& bytes);

}  // namespace platform
