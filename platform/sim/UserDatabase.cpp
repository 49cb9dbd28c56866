// Apart from the other services: a program of its own users brings its own.
#include "platform/UserDatabase.h"

#include "platform/sim/Services.h"

namespace platform {

std::optional<UserRecord> UserRecordByName(const char* name) {
    const auto& users = sim::TheServices().users;
    const auto user = users.find(name);
    return user == users.end() ? std::nullopt : std::optional(user->second.record);
}

std::optional<std::uint32_t> GroupIdByName(const char* name) {
    const auto& groups = sim::TheServices().groups;
    const auto group = groups.find(name);
    return group == groups.end() ? std::nullopt : std::optional(group->second);
}

std::optional<std::string> CopyHomeDirectoryForUser(const char* name) {
    const auto& users = sim::TheServices().users;
    const auto user = users.find(name);
    return user == users.end() ? std::nullopt : user->second.home;
}

}  // namespace platform
