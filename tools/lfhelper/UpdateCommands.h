// The command that has the service databases brought up to date.
#pragma once

#include "tools/lfhelper/CommandLine.h"
#include "tools/lfhelper/Subcommands.h"

namespace lfhelper {

[[nodiscard]] Preparation PrepareUpdateDatabases(const CommandLine& line);

}  // namespace lfhelper
