#include "handlers/carrier/MobileUser.h"

#include <array>
#include <cstdlib>
#include <mutex>
#include <string_view>

#include "handlers/carrier/CString.h"
#include "platform/Process.h"
#include "platform/UserDatabase.h"

namespace {

constexpr std::string_view kMobileUserName = "mobile";

struct MobileUserIdentity {
    char* directory = nullptr;  // never freed
    std::uint32_t uid = 0;
    std::uint32_t gid = 0;
};

constinit MobileUserIdentity identity;
constinit std::once_flag identityOnce;

char* CreateDirectoryString(const char* userName) {
    const auto home = platform::CopyHomeDirectoryForUser(userName);
    return home ? _CFStringGetOrCreateCString(
                      kDefaultCStringAllocator, *home, nullptr, nullptr, StringEncoding::kUtf8)
                : nullptr;
}

void ComputeIdentity() {
    std::array<char, 32> buffer{};
    std::size_t length = buffer.size();
    char* const userName = _CFStringGetOrCreateCString(
        kDefaultCStringAllocator, kMobileUserName, buffer.data(), &length, StringEncoding::kUtf8);
    identity.directory = CreateDirectoryString(userName);
    if (const auto record = platform::UserRecordByName(userName)) {
        identity.uid = record->uid;
        identity.gid = record->gid;
    }
    if (userName != buffer.data()) {
        kDefaultCStringAllocator.deallocate(userName);
    }
}

const MobileUserIdentity& Identity() {
    std::call_once(identityOnce, ComputeIdentity);
    return identity;
}

std::string CopyHomeAtStart() {
    const char* const directory = _GetMobileUserDirectory();
    if (directory == nullptr) {
        platform::ProcessRefuseToStart("unable to find the home directory of user %s",
                                       kMobileUserName);
    }
    return directory;
}

}  // namespace

const char* _GetMobileUserDirectory() {
    return Identity().directory;
}

std::uint32_t _GetMobileUserUID() {
    return Identity().uid;
}

std::uint32_t _GetMobileUserGID() {
    return Identity().gid;
}

const std::string MobileUserHome = CopyHomeAtStart();
