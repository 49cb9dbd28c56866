// The simulated archive copier: what the sources are, and what goes wrong with them.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "platform/PropertyList.h"

namespace sim {

/// A file inside a source that cannot be made.
struct FailingFile {
    std::string path;
    int error = 0;
};

struct ArchiveSource {
    std::vector<FailingFile> failing{};
    int fatal = 0;  ///< an errno value that ends the copy behind those files
};

/// A source that is there; others end a copy with ENOENT.
void ProvideArchive(std::string_view path, ArchiveSource source = {});

/// This system has no archive copier.
void RemoveArchiveCopier();

struct ArchiveCopy {
    std::string source;
    std::string destination;
    platform::PropertyList options;
};

/// The copies that were asked for.
[[nodiscard]] const std::vector<ArchiveCopy>& ArchiveCopies();

/// Copiers that were made and not freed.
[[nodiscard]] std::size_t ArchiveCopiers();

}  // namespace sim
