// Out-of-line data in a memory file that nobody can change any more.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <span>

#include "client/Descriptor.h"

namespace linefold_client {

struct FreeMemory {
    void operator()(void* memory) const { std::free(memory); }
};

/// Memory from malloc, as callers of the C interface receive it.
using Memory = std::unique_ptr<void, FreeMemory>;

/// A sealed memory file with a copy of the data; closed when resources are short.
[[nodiscard]] Descriptor MakeMemoryFile(std::span<const std::byte> data);

enum class ReadResult : std::uint8_t {
    kRead,
    kUnusable,  ///< no memory file, not sealed, or shorter than announced
    kNoResources,
};

/// Copies the first `size` bytes, more than none, into memory of ours.
[[nodiscard]] ReadResult ReadMemoryFile(int descriptor, std::size_t size, Memory& memory);

}  // namespace linefold_client
