// The command for the radio manager's logging.
#pragma once

#include "tools/lfhelper/Subcommands.h"

namespace lfhelper {

[[nodiscard]] Preparation PrepareRadioLogging(const CommandLine& line);

}  // namespace lfhelper
