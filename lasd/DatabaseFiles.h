// The files of the databases, which are downloaded elsewhere and installed here.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "lasd/HttpFetcher.h"

inline constexpr const char* kDatabaseFolder = "/var/mobile/Library/LASD";

/// Makes the folder where it is missing. False when that fails.
[[nodiscard]] bool MakeDatabaseFolder();

/// What follows the last slash of a URL, up to the first ".gz" in it. It may be empty, or dots.
/// None without a slash.
[[nodiscard]] std::optional<std::string> DatabaseFileName(std::string_view url);

/// Writes what was fetched beside the file of this name and puts it in its place, so that the disk
/// has it. After a failure, which is told in one line, what was written may be left beside it.
[[nodiscard]] bool InstallDatabaseFile(const HttpFetcher& fetched, std::string_view name);
