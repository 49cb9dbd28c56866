// The user database: what the system knows of a user or a group by name.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace platform {

struct UserRecord {
    std::uint32_t uid = 0;
    std::uint32_t gid = 0;
};

/// The record of a user, or none when there is no such user.
[[nodiscard]] std::optional<UserRecord> UserRecordByName(const char* name);

/// The number of a group, or none when there is no such group.
[[nodiscard]] std::optional<std::uint32_t> GroupIdByName(const char* name);

/// The home directory of a user in POSIX style, or none when the user or the home is missing.
[[nodiscard]] std::optional<std::string> CopyHomeDirectoryForUser(const char* name);

}  // namespace platform
