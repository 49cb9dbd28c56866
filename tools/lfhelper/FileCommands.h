// The commands for files, directories and archives.
#pragma once

#include "tools/lfhelper/Subcommands.h"

namespace lfhelper {

[[nodiscard]] Preparation PrepareCopyFile(const CommandLine& line);
[[nodiscard]] Preparation PrepareCopyLogDirectory(const CommandLine& line);
[[nodiscard]] Preparation PrepareMoveDirectory(const CommandLine& line);
[[nodiscard]] Preparation PrepareCopyArchive(const CommandLine& line);
[[nodiscard]] Preparation PrepareLoadPlist(const CommandLine& line);

}  // namespace lfhelper
