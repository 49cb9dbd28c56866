// The commands for the device's country, civic address and public address.
#pragma once

#include "tools/lfhelper/Subcommands.h"

namespace lfhelper {

[[nodiscard]] Preparation PrepareCountryCode(const CommandLine& line);
[[nodiscard]] Preparation PrepareCivicAddress(const CommandLine& line);
[[nodiscard]] Preparation PrepareWanIp(const CommandLine& line);

}  // namespace lfhelper
