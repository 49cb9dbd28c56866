// What a descriptor from a stranger is, told without touching it.
#pragma once

#include <cstdint>

#include "platform/linux/OwnedFd.h"

namespace platform {

enum class DescriptorKind : std::uint8_t {
    kPipe,
    kConnectedLocalSocket,  ///< AF_UNIX, stream or seqpacket
    kMemoryFile,
    kOther,
};

/// Asks only questions that no file system and no driver of the stranger's answers: neither fstat
/// nor poll, which can block or run code of theirs.
[[nodiscard]] DescriptorKind ClassifyDescriptor(int descriptor);

/// True for a memory file that nobody can write, grow or shrink any more.
[[nodiscard]] bool IsSealedMemoryFile(int descriptor);

/// Closes what came from a stranger. Closing can block (a lingering TCP socket takes seconds), so
/// what is not of a kind known to close at once goes to a thread apart.
void CloseForeignDescriptor(OwnedFd descriptor);

/// Descriptor numbers from here up are kept back for our own work.
[[nodiscard]] int ForeignDescriptorLimit();

/// Reads the limit of the process again.
void UpdateForeignDescriptorLimit();

}  // namespace platform
