#include "platform/linux/FreedMemory.h"

#include <malloc.h>

namespace platform {

void ReturnFreedMemory() {
    (void)malloc_trim(0);
}  // whether there was any matters to nobody

}  // namespace platform
