// Another user's rights to files, for one thread and a while.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace platform {

/// Files that the calling thread touches while this lives are touched as the user: with its file
/// system user and group and its supplementary groups. Other threads notice nothing, but a thread
/// that is started meanwhile would have them for good: start none.
class UserRights {
public:
    explicit UserRights(const char* userName);
    ~UserRights();
    UserRights(const UserRights&) = delete;
    UserRights& operator=(const UserRights&) = delete;

    /// False when there is no such user or it could not be become: then nothing may be touched.
    [[nodiscard]] bool areHeld() const { return areHeld_; }

private:
    void giveBack();

    std::vector<gid_t> oldGroups_;
    uid_t oldUser_ = 0;
    gid_t oldGroup_ = 0;
    bool isChanged_ = false;
    bool areHeld_ = false;
};

}  // namespace platform
