#include "platform/UserDatabase.h"

#include <grp.h>
#include <pwd.h>

#include <cerrno>
#include <vector>

namespace platform {
namespace {

constexpr std::size_t kLargestRecord = 1U << 20;

/// getpwnam_r(3) or getgrnam_r(3), as `find`, with as much room as it asks for; `use` gets the
/// record.
template <typename Record, typename Find, typename Use>
bool WithRecord(Find find, const char* name, const Use& use) {
    for (std::size_t size = 1024; size <= kLargestRecord; size *= 2) {
        std::vector<char> texts(size);
        Record record{};
        Record* found = nullptr;
        const int error = find(name, &record, texts.data(), texts.size(), &found);
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
    const bool isKnown = WithRecord<passwd>(getpwnam_r, name, [&user](const passwd& record) {
        user = {.uid = record.pw_uid, .gid = record.pw_gid};
    });
    return isKnown ? std::optional(user) : std::nullopt;
}

std::optional<std::uint32_t> GroupIdByName(const char* name) {
    std::uint32_t gid = 0;
    const bool isKnown =
        WithRecord<group>(getgrnam_r, name, [&gid](const group& record) { gid = record.gr_gid; });
    return isKnown ? std::optional(gid) : std::nullopt;
}

std::optional<std::string> CopyHomeDirectoryForUser(const char* name) {
    std::string home;
    WithRecord<passwd>(getpwnam_r, name, [&home](const passwd& record) { home = record.pw_dir; });
    return home.empty() ? std::nullopt : std::optional(std::move(home));
}

}  // namespace platform
