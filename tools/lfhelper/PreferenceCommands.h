// The commands for preference values.
#pragma once

#include "tools/lfhelper/Subcommands.h"

namespace lfhelper {

[[nodiscard]] Preparation PreparePreferencesGet(const CommandLine& line);
[[nodiscard]] Preparation PreparePreferencesSet(const CommandLine& line);
[[nodiscard]] Preparation PreparePreferencesRemove(const CommandLine& line);

}  // namespace lfhelper
