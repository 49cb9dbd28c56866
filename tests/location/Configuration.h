// The platform's configuration file, written by tests.
#pragma once

#include <map>
#include <string>
#include <string_view>

namespace configuration {

inline constexpr const char* kPath = "/etc/linefold/platform.plist";

/// Puts a file of root's there.
void WriteText(std::string_view text);

/// The same, with these keys and texts.
void Write(const std::map<std::string, std::string>& entries);

/// Whatever is there goes.
void Remove();

}  // namespace configuration
