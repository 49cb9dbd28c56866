// One file copied: its contents, its attributes, its mode and its times.
#pragma once

#include <sys/stat.h>

#include "platform/linux/OwnedFd.h"

namespace platform {

/// Copies as many bytes as the file had when its status was taken, between descriptors that stand
/// at the start. Holes stay holes, and where the file system can share the blocks it does. 0 or an
/// errno value.
[[nodiscard]] int CopyContents(const OwnedFd& source,
                               const struct stat& status,
                               const OwnedFd& copy);

/// Copies the user.* attributes, and no other: what the system reads from the others is not the
/// copy's. A file system without such attributes takes none, and that is no failure.
[[nodiscard]] int CopyUserAttributes(const OwnedFd& source, const OwnedFd& copy);

/// What a copy keeps of a mode: the permissions, and not the set-id bits.
[[nodiscard]] mode_t ModeOfCopy(const struct stat& status);

/// What the system takes from the mode of new files in a folder.
struct ModeMask {
    bool isKnown = false;  ///< otherwise each new file is to be looked at
    mode_t bits = 0;
};

/// Of a folder that hands no group down. Not known where the folder hands an access control list
/// down.
[[nodiscard]] ModeMask MaskOfNewFiles(const OwnedFd& folder);

/// Gives a new file the mode and the times of what it is a copy of, and this process's group where
/// the mask is not known.
[[nodiscard]] int FinishFile(const OwnedFd& copy, const struct stat& status, const ModeMask& mask);

/// The same for a folder that was made with another mode.
[[nodiscard]] int FinishFolder(const OwnedFd& copy, const struct stat& status);

}  // namespace platform
