#include "tools/lfhelper/doctor/FileFacts.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <vector>

#include "platform/linux/OwnedFd.h"

namespace lfhelper::doctor {
namespace {

/// More than that the service does not read.
constexpr off_t kLargestConfiguration = 64 << 10;

ConfigurationFile Useless(const std::string& text, const std::string& remedy) {
    return {.state = ConfigurationFile::State::kUseless, .text = text, .remedy = remedy};
}

ConfigurationFile Parse(const std::string& path, const std::vector<std::byte>& contents) {
    auto entries = platform::PropertyListCreateWithData(contents);
    if (!entries || entries->kind() != platform::PropertyList::Kind::kDictionary) {
        return Useless(path + " is not a property list with a dictionary",
                       "write it anew, as XML or binary 1.0");
    }
    return {.state = ConfigurationFile::State::kRead, .entries = std::move(*entries)};
}

}  // namespace

bool FileFacts::is(mode_t type) const {
    return isThere() && (mode & S_IFMT) == type;
}

FileFacts LookAt(const std::string& path, Links links) {
    struct stat status {};

    const int result =
        links == Links::kFollowed ? stat(path.c_str(), &status) : lstat(path.c_str(), &status);
    if (result == 0) {
        return {.state = FileFacts::State::kThere,
                .mode = status.st_mode,
                .owner = status.st_uid,
                .size = status.st_size};
    }
    if (errno == ENOENT || errno == ENOTDIR) {
        return {};
    }
    return {.state = FileFacts::State::kUnseen, .error = std::strerror(errno)};
}

std::string KindOf(const FileFacts& facts) {
    switch (facts.mode & S_IFMT) {
        case S_IFDIR:
            return "a folder";
        case S_IFREG:
            return "a file";
        case S_IFLNK:
            return "a symbolic link";
        case S_IFSOCK:
            return "a socket";
        default:
            return "something else";
    }
}

std::string WhyNotRootsOwn(const FileFacts& facts, mode_t type) {
    if (!facts.is(type)) {
        return "is " + KindOf(facts) + " and not " + KindOf({.mode = type});
    }
    if (facts.owner != 0) {
        return "belongs to user " + std::to_string(facts.owner) + " and not to root";
    }
    return (facts.mode & (S_IWGRP | S_IWOTH)) != 0 ? "can be written by others than root" : "";
}

std::string MakeRootsOwn(const std::string& path) {
    return "chown root '" + path + "'; chmod go-w '" + path + "'";
}

ConfigurationFile ReadConfigurationFile(const std::string& path) {
    const FileFacts facts = LookAt(path);
    if (facts.isAbsent()) {
        return {.text = path + " is not there"};
    }
    if (facts.isThere() && !facts.is(S_IFREG)) {
        return Useless(path + " is " + KindOf(facts) + " and not a file",
                       "put a file in its place");
    }
    if (const std::string why = facts.isThere() ? WhyNotRootsOwn(facts, S_IFREG) : "";
        !why.empty()) {
        return Useless(path + " " + why, MakeRootsOwn(path));
    }
    if (facts.size > kLargestConfiguration) {
        return Useless(path + " is larger than 64 KiB", "write it anew");
    }
    const platform::OwnedFd file(
        open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    std::vector<std::byte> contents(static_cast<std::size_t>(facts.size));
    if (!file.isOpen() || pread(file.get(), contents.data(), contents.size(), 0) !=
                              static_cast<ssize_t>(contents.size())) {
        return {.state = ConfigurationFile::State::kUnseen,
                .text = path + " cannot be read: " + std::strerror(errno),
                .remedy = "run this as root"};
    }
    return Parse(path, contents);
}

}  // namespace lfhelper::doctor
