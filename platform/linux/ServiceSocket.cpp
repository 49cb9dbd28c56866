#include "platform/linux/ServiceSocket.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <vector>

namespace platform {
namespace {

constexpr int kFirstActivatedDescriptor = 3;
constexpr int kManyActivatedDescriptors = 1024;
constexpr mode_t kEverybody = 0666;  // the entitlement decides

std::optional<int> NumberFromEnvironment(const char* name) {
    const char* const text = std::getenv(name);
    int number = 0;
    if (text == nullptr) {
        return std::nullopt;
    }
    const char* const end = text + std::strlen(text);
    const auto [parsedTo, error] = std::from_chars(text, end, number);
    return error == std::errc() && parsedTo == end ? std::optional(number) : std::nullopt;
}

/// The part of a list with colons, or an empty text.
std::string_view NthName(std::string_view names, int index) {
    for (; index > 0; --index) {
        const auto colon = names.find(':');
        if (colon == std::string_view::npos) {
            return {};
        }
        names.remove_prefix(colon + 1);
    }
    return names.substr(0, names.find(':'));
}

bool HasOption(int descriptor, int option, int wanted) {
    int value = -1;
    socklen_t size = sizeof value;
    return getsockopt(descriptor, SOL_SOCKET, option, &value, &size) == 0 && value == wanted;
}

bool IsListeningSocket(int descriptor) {
    return HasOption(descriptor, SO_DOMAIN, AF_UNIX) &&
           HasOption(descriptor, SO_TYPE, SOCK_SEQPACKET) &&
           HasOption(descriptor, SO_ACCEPTCONN, 1);
}

bool MakeOurs(int descriptor) {
    return fcntl(descriptor, F_SETFD, FD_CLOEXEC) == 0 &&
           fcntl(descriptor, F_SETFL, fcntl(descriptor, F_GETFL) | O_NONBLOCK) == 0;
}

std::optional<sockaddr_un> Address(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof address.sun_path) {
        return std::nullopt;
    }
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    return address;
}

OwnedFd LocalSocket() {
    return OwnedFd(socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
}

bool SomebodyListens(const std::string& path) {
    const auto address = Address(path);
    const OwnedFd probe = LocalSocket();
    // A full backlog is a sign of life, too.
    return address && probe.isOpen() &&
           (connect(probe.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address) ==
                0 ||
            errno == EAGAIN);
}

/// What stands at the path and is no socket is somebody's, and not ours to replace.
bool CanBeReplaced(const std::string& path) {
    struct stat status {};

    return lstat(path.c_str(), &status) == 0 ? S_ISSOCK(status.st_mode) : errno == ENOENT;
}

/// A file that we bound, so that only that one is unlinked.
struct BoundSocket {
    std::string path;
    dev_t device = 0;
    ino_t inode = 0;
};

std::vector<BoundSocket>& BoundSockets() {
    static auto& sockets = *new std::vector<BoundSocket>;
    return sockets;
}

void UnlinkBoundSockets() {
    for (const BoundSocket& bound : BoundSockets()) {
        struct stat status {};

        if (lstat(bound.path.c_str(), &status) == 0 && status.st_dev == bound.device &&
            status.st_ino == bound.inode) {
            unlink(bound.path.c_str());
        }
    }
}

void UnlinkAtExit(const std::string& path) {
    struct stat status {};

    if (lstat(path.c_str(), &status) != 0) {
        return;
    }
    if (BoundSockets().empty()) {
        // Where this fails, the next start replaces the dead socket.
        (void)std::atexit(UnlinkBoundSockets);
    }
    BoundSockets().push_back({.path = path, .device = status.st_dev, .inode = status.st_ino});
}

}  // namespace

OwnedFd TakeActivatedSocket(std::string_view serviceName) {
    const char* const names = std::getenv("LISTEN_FDNAMES");
    const int count = NumberFromEnvironment("LISTEN_FDS").value_or(0);
    if (names == nullptr || NumberFromEnvironment("LISTEN_PID") != getpid() ||
        count > kManyActivatedDescriptors) {
        return {};
    }
    for (int i = 0; i < count; ++i) {
        const int descriptor = kFirstActivatedDescriptor + i;
        if (NthName(names, i) == serviceName && IsListeningSocket(descriptor) &&
            MakeOurs(descriptor)) {
            return OwnedFd(descriptor);
        }
    }
    return {};
}

OwnedFd BindServiceSocket(std::string_view serviceName) {
    const std::string path = std::string(kServiceDirectory) + "/" + std::string(serviceName);
    (void)mkdir(std::string(kServiceDirectory).c_str(), 0755);  // it is there already, as a rule
    // The lock is held to the end of the process: two starting at once must not both probe first.
    OwnedFd lock(open((path + ".lock").c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (!lock.isOpen() || flock(lock.get(), LOCK_EX | LOCK_NB) != 0 || SomebodyListens(path) ||
        !CanBeReplaced(path)) {
        return {};
    }
    const std::string temporary = path + ".new";
    unlink(temporary.c_str());
    const auto address = Address(temporary);
    OwnedFd bound = LocalSocket();
    if (!address || !bound.isOpen() ||
        bind(bound.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address) != 0 ||
        chmod(temporary.c_str(), kEverybody) != 0 || listen(bound.get(), SOMAXCONN) != 0 ||
        rename(temporary.c_str(), path.c_str()) != 0) {
        return {};
    }
    UnlinkAtExit(path);
    (void)lock.release();
    return bound;
}

}  // namespace platform
