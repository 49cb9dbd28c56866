// What an operator tells the platform: /etc/linefold/platform.plist.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace platform {

/// The text under a key, as the file is now; none when it is absent or empty, or no text. A file
/// that is not root's, that others can write, or that is no property list, counts as absent and is
/// told in one error line.
[[nodiscard]] std::optional<std::string> PlatformConfigurationText(std::string_view key);

}  // namespace platform
