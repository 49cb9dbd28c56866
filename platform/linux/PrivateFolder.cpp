#include "platform/linux/PrivateFolder.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

namespace platform {
namespace {

constexpr mode_t kNobodyElse = S_IRWXU;
constexpr mode_t kPermissions = S_IRWXU | S_IRWXG | S_IRWXO;

}  // namespace

PrivateFolder::~PrivateFolder() {
    if (isOurs_) {
        (void)unlinkat(parent_, name_.c_str(), AT_REMOVEDIR);
    }
}

int PrivateFolder::make(int parent, std::string name) {
    parent_ = parent;
    name_ = std::move(name);
    isOurs_ = mkdirat(parent, name_.c_str(), kNobodyElse) == 0;
    if (!isOurs_ && errno != EEXIST) {
        return errno;
    }
    OwnedFd file(openat(parent, name_.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));

    struct stat status {};

    if (!file.isOpen() || fstat(file.get(), &status) != 0) {
        return errno;
    }
    // The parent's owner may have put another folder in its place, but none that is ours alone.
    if (status.st_uid != geteuid() || (status.st_mode & kPermissions) != kNobodyElse) {
        return EEXIST;
    }
    isOurs_ = true;
    file_ = std::move(file);
    return 0;
}

}  // namespace platform
