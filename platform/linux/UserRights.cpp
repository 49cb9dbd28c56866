// The calls of the C library that set users and groups do so for all threads of a process; those of
// the kernel, which are used here, do it for the calling thread alone.
#include "platform/linux/UserRights.h"

#include <grp.h>
#include <sys/fsuid.h>
#include <sys/syscall.h>
#include <unistd.h>

#include "platform/Assertion.h"
#include "platform/UserDatabase.h"

namespace platform {
namespace {

/// The user's own group alone when there are more than a thread can have.
std::vector<gid_t> GroupsOfUser(const char* name, gid_t group) {
    constexpr std::size_t kMostGroups = 65'536;
    for (std::size_t size = 32; size <= kMostGroups; size *= 2) {
        std::vector<gid_t> groups(size);
        auto count = static_cast<int>(size);
        if (getgrouplist(name, group, groups.data(), &count) >= 0) {
            groups.resize(static_cast<std::size_t>(count));
            return groups;
        }
    }
    return {group};
}

std::vector<gid_t> GroupsOfThread() {
    std::vector<gid_t> groups(static_cast<std::size_t>(getgroups(0, nullptr)));
    groups.resize(
        static_cast<std::size_t>(getgroups(static_cast<int>(groups.size()), groups.data())));
    return groups;
}

bool SetGroups(const std::vector<gid_t>& groups) {
    return syscall(SYS_setgroups, groups.size(), groups.data()) == 0;
}

// Both calls answer with the former id and not with an error: asking with an id that nobody can
// have tells what it is now.

bool SetFileUser(uid_t user) {
    (void)setfsuid(user);
    return static_cast<uid_t>(setfsuid(static_cast<uid_t>(-1))) == user;
}

bool SetFileGroup(gid_t group) {
    (void)setfsgid(group);
    return static_cast<gid_t>(setfsgid(static_cast<gid_t>(-1))) == group;
}

}  // namespace

UserRights::UserRights(const char* userName) {
    const auto user = UserRecordByName(userName);
    if (!user) {
        return;
    }
    const auto groups = GroupsOfUser(userName, user->gid);
    oldGroups_ = GroupsOfThread();
    oldUser_ = static_cast<uid_t>(setfsuid(static_cast<uid_t>(-1)));
    oldGroup_ = static_cast<gid_t>(setfsgid(static_cast<gid_t>(-1)));
    isChanged_ = true;
    // The user goes last: from then on this thread has no more rights to files than that user.
    areHeld_ = SetGroups(groups) && SetFileGroup(user->gid) && SetFileUser(user->uid);
    if (!areHeld_) {
        giveBack();
    }
}

UserRights::~UserRights() {
    giveBack();
}

void UserRights::giveBack() {
    if (!isChanged_) {
        return;
    }
    isChanged_ = false;
    const bool isUserBack = SetFileUser(oldUser_);
    const bool isGroupBack = SetFileGroup(oldGroup_);
    // Where groups may not be set at all they were not changed either.
    const bool areGroupsBack = SetGroups(oldGroups_) || GroupsOfThread() == oldGroups_;
    PLATFORM_ASSERT(isUserBack && isGroupBack && areGroupsBack);
}

}  // namespace platform
