// The command for the heartbeat.
#pragma once

#include "tools/lfhelper/Subcommands.h"

namespace lfhelper {

[[nodiscard]] Preparation PrepareHeartbeat(const CommandLine& line);

}  // namespace lfhelper
