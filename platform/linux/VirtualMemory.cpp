#include "platform/VirtualMemory.h"

#include <cstdlib>

#include "platform/MachMessage.h"

namespace platform {

kern_return_t vm_allocate(void** address, std::size_t size) {
    if (size > kMaxReplyData) {
        return KERN_NO_SPACE;
    }
    void* const memory = size == 0 ? nullptr : std::calloc(1, size);
    if (memory == nullptr && size != 0) {
        return KERN_NO_SPACE;
    }
    *address = memory;
    return KERN_SUCCESS;
}

void vm_deallocate(void* address, std::size_t /*size*/) {
    std::free(address);
}

}  // namespace platform
