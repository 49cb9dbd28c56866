// The names and link targets of an archive, held to what may lie in a folder.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/ArchiveReader.h"

namespace platform {

/// Where files grow until they are complete. No entry may have this name.
inline constexpr const char* kUnfinishedName = ".linefold-unfinished";

/// The steps of an entry's name below the folder that it is expanded into: none for the folder
/// itself ("./"). "." and doubled slashes mean nothing; a slash at the end is left out.
struct ArchivePath {
    std::vector<std::string> steps;
    std::optional<ArchiveError> error{};
};

[[nodiscard]] ArchivePath ParseArchiveName(std::string_view name);

/// What speaks against a symbolic link so many folders deep below the destination. Steps up must
/// come first: behind another step, which can be a link, they would lead from wherever that leads.
[[nodiscard]] std::optional<ArchiveError> CheckLinkTarget(std::string_view target,
                                                          std::size_t depth);

}  // namespace platform
