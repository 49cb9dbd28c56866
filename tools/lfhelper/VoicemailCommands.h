// The commands for voicemail tokens and the subscription.
#pragma once

#include "tools/lfhelper/Subcommands.h"

namespace lfhelper {

[[nodiscard]] Preparation PrepareVoicemailSetToken(const CommandLine& line);
[[nodiscard]] Preparation PrepareVoicemailGetToken(const CommandLine& line);
[[nodiscard]] Preparation PrepareVoicemailClearToken(const CommandLine& line);
[[nodiscard]] Preparation PrepareVoicemailRemoveAll(const CommandLine& line);
[[nodiscard]] Preparation PrepareVoicemailIsSubscribed(const CommandLine& line);

}  // namespace lfhelper
