// Memory that was freed and that the allocator still holds.
#pragma once

namespace platform {

/// Gives it back to the system. For the end of work on something large that was made of many small
/// pieces: one of them that lives on would otherwise hold all the room below it. Takes as long as
/// there is to give back.
void ReturnFreedMemory();

}  // namespace platform
