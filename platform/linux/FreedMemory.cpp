#include "platform/linux/FreedMemory.h"

#include <malloc.h>

namespace platform {

void ReturnFreedMemory() {
    // Whether there was any matters to nobody.
    (void)malloc_trim(0);
}

}  // namespace platform
