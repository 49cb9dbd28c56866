// The expansion of an archive that a stranger made into a folder that a stranger owns.
#pragma once

#include <functional>
#include <string>

#include "platform/linux/ArchiveReader.h"

namespace platform {

struct ArchiveHandlers {
    /// True: leave this entry out and go on.
    std::function<bool(const std::string& name, const ArchiveError& error)> entryFailed;
    std::function<void(const ArchiveError& error)> archiveFailed;
};

/// Expands regular files, folders and links, in the order of the archive; of two entries of one
/// name the later one stays. At most 100,000 of them, with the folders that their names imply, and
/// 1 GiB. 0, or the errno value that ended it.
[[nodiscard]] int ExpandArchive(int archive, int folder, const ArchiveHandlers& handlers);

}  // namespace platform
