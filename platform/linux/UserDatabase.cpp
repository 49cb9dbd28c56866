#include "platform/UserDatabase.h"

#include <pwd.h>

#include <cerrno>
#include <vector>

namespace platform {
namespace {

constexpr std::size_t kLargestRecord = 1U << 20;

/// getpwnam_r(3) with as much room as it asks for; `use` gets the record.
template <typename Use>
bool WithRecord(const char* name, const Use& use) {
    for (std::size_t size = 1024; size <= kLargestRecord; size *= 2) {
        std::vector<char> texts(size);
        passwd record{};
        passwd* found = nullptr;
        const int error = getpwnam_r(name, &record, texts.data(), texts.size(), &found);
        if (error == ERANGE) {
            continue;
        }
        if (error == 0 && found != nullptr) {
            use(*found);
            return true;
        }
        return false;
    }
    return false;
}

}  // namespace

std::optional<UserRecord> UserRecordByName(const char* name) {
    UserRecord user;
    const bool isKnown = WithRecord(name, [&user](const passwd& record) {
        user = {.uid = record.pw_uid, .gid = record.pw_gid};
    });
    return isKnown ? std::optional(user) : std::nullopt;
}

std::optional<std::string> CopyHomeDirectoryForUser(const char* name) {
    std::string home;
    WithRecord(name, [&home](const passwd& record) { home = record.pw_dir; });
    return home.empty() ? std::nullopt : std::optional(std::move(home));
}

}  // namespace platform
