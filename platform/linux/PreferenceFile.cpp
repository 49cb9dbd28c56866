#include "platform/linux/PreferenceFile.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <climits>
#include <cstring>

#include "platform/linux/OwnedFd.h"

namespace platform {
namespace {

constexpr int kMaxLinks = 40;

/// Where a file really is: its folder, held open, and its name in there.
struct Place {
    OwnedFd folder;
    std::string name;
    int error = 0;
};

std::string FolderOf(const std::string& path) {
    return path.substr(0, path.rfind('/') + 1);
}

/// Follows links in the last step, also one to a file that is not there yet.
Place FinalPlace(std::string path) {
    std::array<char, PATH_MAX> target{};
    for (int links = 0; links <= kMaxLinks; ++links) {
        const ssize_t length = readlink(path.c_str(), target.data(), target.size());
        if (length >= 0) {
            const std::string text(target.data(), static_cast<std::size_t>(length));
            path = text.starts_with('/') ? text : FolderOf(path) + text;
            continue;
        }
        OwnedFd folder(open(FolderOf(path).c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
        const int error = folder.isOpen() ? 0 : errno;
        return {
            .folder = std::move(folder), .name = path.substr(path.rfind('/') + 1), .error = error};
    }
    return {.folder = {}, .name = {}, .error = ELOOP};
}

mode_t ModeOf(const Place& place) {
    constexpr mode_t kNewMode = S_IRUSR | S_IWUSR;
    constexpr mode_t kPermissions = S_IRWXU | S_IRWXG | S_IRWXO;

    struct stat status {};

    const bool isFile =
        fstatat(place.folder.get(), place.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
        S_ISREG(status.st_mode);
    return isFile ? status.st_mode & kPermissions : kNewMode;
}

}  // namespace

PreferenceFile::Contents PreferenceFile::read() const {
    return PropertyListFile(AT_FDCWD, path_).read(PropertyListFile::Links::kFollowed);
}

std::string PreferenceFile::replace(const Contents& contents) const {
    const Place place = FinalPlace(path_);
    return place.error == 0
               ? PropertyListFile(place.folder.get(), place.name).replace(contents, ModeOf(place))
               : std::string("cannot be written: ") + strerrordesc_np(place.error);
}

}  // namespace platform
