#include "platform/linux/PreferenceFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <cstring>
#include <optional>

#include "platform/Assertion.h"
#include "platform/PropertyListXml.h"
#include "platform/linux/OwnedFd.h"
#include "platform/linux/ReplacementFile.h"
#include "platform/linux/WholeFile.h"

namespace platform {
namespace {

using Contents = PreferenceFile::Contents;
using State = PreferenceFile::State;

/// One name for all domains: whatever a crash leaves behind, the next write removes.
constexpr const char* kTemporaryName = ".linefold-mobile-helper.tmp";
constexpr mode_t kNewMode = S_IRUSR | S_IWUSR;
constexpr int kMaxLinks = 40;

std::string ErrorText(int error) {
    return strerrordesc_np(error);
}

Contents Unusable(State state, std::string complaint) {
    return {.state = state, .complaint = std::move(complaint)};
}

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

/// Gives the damaged file a second name, since the new one is about to take its first. One that was
/// kept earlier goes.
int KeepDamaged(const Place& place) {
    const int folder = place.folder.get();
    const std::string kept = place.name + ".damaged";
    if (unlinkat(folder, kept.c_str(), 0) != 0 && errno != ENOENT) {
        return errno;
    }
    if (linkat(folder, place.name.c_str(), folder, kept.c_str(), 0) == 0) {
        return 0;
    }
    // Where it may not have two names, as a file of somebody else's, it changes its one. Should the
    // system stop now, the domain is empty, as it was.
    return renameat(folder, place.name.c_str(), folder, kept.c_str()) == 0 ? 0 : errno;
}

mode_t ModeOf(const Place& place) {
    constexpr mode_t kPermissions = S_IRWXU | S_IRWXG | S_IRWXO;

    struct stat status {};

    const bool isFile =
        fstatat(place.folder.get(), place.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
        S_ISREG(status.st_mode);
    return isFile ? status.st_mode & kPermissions : kNewMode;
}

}  // namespace

Contents PreferenceFile::read() const {
    // Whatever it is, opening it must not wait: a FIFO without a writer would hold us for ever.
    const OwnedFd file(open(path_.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (!file.isOpen()) {
        return errno == ENOENT
                   ? Contents()
                   : Unusable(State::kUnreadable, "cannot be read: " + ErrorText(errno));
    }

    struct stat status {};

    if (fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) {
        return Unusable(State::kUnreadable, "is not a regular file");
    }
    std::vector<std::byte> bytes;
    const bool isTooLarge = status.st_size > static_cast<off_t>(kPropertyListLimits.bytes);
    const int error =
        isTooLarge
            ? EFBIG
            : ReadWhole(
                  file, static_cast<std::size_t>(status.st_size), kPropertyListLimits.bytes, bytes);
    if (error != 0) {
        return Unusable(State::kUnreadable, "cannot be read: " + ErrorText(error));
    }
    auto entries = PropertyListCreateWithData(bytes);
    if (!entries || entries->kind() != PropertyList::Kind::kDictionary) {
        return Unusable(State::kDamaged, "is damaged: it holds no property list with a dictionary");
    }
    return {.state = State::kRead, .entries = std::move(*entries), .fileSize = bytes.size()};
}

std::string PreferenceFile::replace(const Contents& contents) const {
    PLATFORM_ASSERT(contents.state != State::kUnreadable);
    if (!XmlPropertyListSize(contents.entries)) {
        return "cannot be written: it would hold more than 16 MiB or 200,000 objects, or "
               "characters that XML cannot hold";
    }
    const Place place = FinalPlace(path_);
    if (place.error != 0) {
        return "cannot be written: " + ErrorText(place.error);
    }
    ReplacementFile replacement(place.folder, kTemporaryName);
    int error = replacement.make(ModeOf(place), [&contents](const ReplacementFile::Put& put) {
        WriteXmlPropertyList(contents.entries, put);
    });
    if (error == 0 && contents.state == State::kDamaged) {
        error = KeepDamaged(place);
    }
    if (error == 0) {
        error = replacement.takePlace(place.name);
    }
    return error == 0 ? std::string() : "cannot be written: " + ErrorText(error);
}

}  // namespace platform
