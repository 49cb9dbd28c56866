// The command that looks for what keeps the service from its work.
#pragma once

#include "tools/lfhelper/Subcommands.h"

namespace lfhelper {

[[nodiscard]] Preparation PrepareDoctor(const CommandLine& line);

}  // namespace lfhelper
