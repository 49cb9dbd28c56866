#include "platform/linux/PathWalk.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>

namespace platform {

Opened OpenPath(int directory, const char* name) {
    OwnedFd file(openat(directory, name, O_PATH | O_NOFOLLOW | O_CLOEXEC));
    const int error = file.isOpen() ? 0 : errno;
    return {.file = std::move(file), .error = error};
}

namespace {

Opened OpenFolder(int directory, const char* name) {
    OwnedFd file(openat(directory, name, O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    const int error = file.isOpen() ? 0 : errno;
    return {.file = std::move(file), .error = error};
}

/// A folder that no link leads to, in one call; an error where there is a link, and on a kernel
/// that does not know the call.
Opened OpenWithoutLinks(int from, std::string_view path, std::uint64_t resolve) {
    open_how how{};
    how.flags = O_PATH | O_DIRECTORY | O_CLOEXEC;
    how.resolve = RESOLVE_NO_SYMLINKS | resolve;
    const std::string text(path.empty() ? "." : path);
    OwnedFd file(static_cast<int>(syscall(SYS_openat2, from, text.c_str(), &how, sizeof how)));
    const int error = file.isOpen() ? 0 : errno;
    return {.file = std::move(file), .error = error};
}

/// As much of the path at once as the system takes.
Opened OpenInPieces(int folder, std::string_view path) {
    constexpr std::size_t kPieceMax = PATH_MAX - 1;
    Opened end = {.file = {}, .error = 0};
    do {
        auto length = path.size();
        if (length > kPieceMax) {
            const auto slash = path.rfind('/', kPieceMax);
            length = slash == std::string_view::npos ? kPieceMax : slash + 1;
        }
        const int from = end.file.isOpen() ? end.file.get() : folder;
        end = OpenWithoutLinks(from, path.substr(0, length), RESOLVE_BENEATH);
        path.remove_prefix(length);
    } while (end.error == 0 && !path.empty());
    return end;
}

/// The same where the system does not know the call.
Opened OpenStepByStep(int folder, std::string_view path) {
    Opened end = OpenFolder(folder, ".");
    while (end.error == 0 && !path.empty()) {
        const std::string name(path.substr(0, path.find('/')));
        path.remove_prefix(std::min(name.size() + 1, path.size()));
        if (!name.empty()) {
            end = OpenFolder(end.file.get(), name.c_str());
        }
    }
    return end;
}

}  // namespace

Opened PathWalk::follow(std::string_view path, int from) {
    Opened place = OpenPath(from, path.starts_with('/') ? "/" : ".");
    while (place.error == 0) {
        const auto start = path.find_first_not_of('/');
        if (start == std::string_view::npos) {
            break;
        }
        path.remove_prefix(start);
        const std::string name(path.substr(0, path.find('/')));
        path.remove_prefix(name.size());
        if (name != ".") {
            place = step(place.file, name);
        }
    }
    return place;
}

Opened PathWalk::step(const OwnedFd& directory, const std::string& name) {
    Opened found = OpenPath(directory.get(), name.c_str());

    struct stat status {};

    if (found.error == 0 && fstat(found.file.get(), &status) != 0) {
        found.error = errno;
    }
    if (found.error != 0 || !S_ISLNK(status.st_mode)) {
        return found;
    }
    return followLink(directory, found.file, status.st_uid);
}

/// A link is read from its own descriptor, and its target judged by its: nothing that is put in
/// their places meanwhile counts.
Opened PathWalk::followLink(const OwnedFd& directory, const OwnedFd& link, uid_t linkOwner) {
    std::array<char, PATH_MAX> text{};
    const ssize_t length = readlinkat(link.get(), "", text.data(), text.size());
    if (length < 0) {
        return {.file = {}, .error = errno};
    }
    if (--linksLeft_ < 0) {
        return {.file = {}, .error = ELOOP};
    }
    Opened target = follow({text.data(), static_cast<std::size_t>(length)}, directory.get());

    struct stat status {};

    if (target.error == 0 && fstat(target.file.get(), &status) != 0) {
        target.error = errno;
    }
    // The mobile user may lead us to what is the mobile user's, and nowhere else.
    if (target.error == 0 && linkOwner != 0 && status.st_uid != linkOwner) {
        return {.file = {}, .error = EPERM};
    }
    return target;
}

SplitPath Split(std::string_view path) {
    const auto lastByte = path.find_last_not_of('/');
    if (lastByte == std::string_view::npos) {
        return {.parent = path, .last = "."};
    }
    const auto slash = path.rfind('/', lastByte);
    const auto start = slash == std::string_view::npos ? 0 : slash + 1;
    return {.parent = path.substr(0, start),
            .last = path.substr(start),
            .endsInSlash = lastByte + 1 != path.size()};
}

Opened OpenParent(std::string_view path) {
    if (path.empty()) {
        return {.file = {}, .error = ENOENT};
    }
    const SplitPath split = Split(path);
    // Where there is no link on the way there is nothing to judge, and one call is enough.
    Opened folder = OpenWithoutLinks(AT_FDCWD, split.parent, 0);
    return folder.error == 0 ? std::move(folder) : PathWalk().follow(split.parent, AT_FDCWD);
}

Opened OpenBelow(int folder, std::string_view path) {
    Opened end = OpenInPieces(folder, path);
    if (end.error == ELOOP) {
        end.error = ENOTDIR;  // that folder is a link
    }
    return end.error == ENOSYS || end.error == EPERM ? OpenStepByStep(folder, path)
                                                     : std::move(end);
}

}  // namespace platform
