// A process on a system whose user "mobile" has no home: it must not get as far as main.
#include <cstdio>

#include "handlers/carrier/MobileUser.h"
#include "platform/UserDatabase.h"

namespace platform {

std::optional<UserRecord> UserRecordByName(const char* /*name*/) {
    return UserRecord{.uid = 501, .gid = 501};
}

std::optional<std::string> CopyHomeDirectoryForUser(const char* /*name*/) {
    return std::nullopt;
}

}  // namespace platform

int main() {
    (void)std::printf("started with the home %s\n", MobileUserHome.c_str());
    return 0;
}
