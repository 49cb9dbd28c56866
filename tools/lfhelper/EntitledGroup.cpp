#include "tools/lfhelper/EntitledGroup.h"

#include <grp.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace lfhelper {

std::optional<std::string> TakeEntitledGroup(const std::string& name) {
    errno = 0;
    const group* const entry = getgrnam(name.c_str());
    if (entry == nullptr) {
        return errno == 0
                   ? "there is no group \"" + name + "\" on this system; choose one by --group"
                   : "the group \"" + name + "\" cannot be looked up: " + std::strerror(errno);
    }
    const gid_t gid = entry->gr_gid;
    if (getegid() == gid) {
        return std::nullopt;
    }
    if (geteuid() != 0) {
        return "only root can take the group \"" + name +
               "\", and this process does not have it: start it as root or in that group";
    }
    if (setgroups(1, &gid) != 0 || setresgid(gid, gid, gid) != 0) {
        return "the group \"" + name + "\" cannot be taken: " + std::strerror(errno);
    }
    return std::nullopt;
}

}  // namespace lfhelper
