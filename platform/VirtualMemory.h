// Memory that leaves the process with a reply.
#pragma once

#include <cstddef>

#include "platform/MachPort.h"

namespace platform {

/// Allocates `size` zeroed bytes; `*address` is written on success only. KERN_NO_SPACE without
/// memory or beyond what a reply can carry (kMaxReplyData). A size of 0 gives a null address.
[[nodiscard]] kern_return_t vm_allocate(void** address, std::size_t size);

/// Gives back what vm_allocate gave; the size is the one asked for.
void vm_deallocate(void* address, std::size_t size);

}  // namespace platform
