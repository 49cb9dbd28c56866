#include "platform/linux/PlatformConfiguration.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <vector>

#include "platform/BuildConstants.h"
#include "platform/PropertyList.h"
#include "platform/linux/OwnedFd.h"
#include "platform/linux/PlatformLog.h"

namespace platform {
namespace {

constexpr off_t kLargestFile = 64 << 10;

std::string ConfigurationPath() {
    return std::string(kConfigurationDirectory) + "/platform.plist";
}

bool IsRootsOwn(const struct stat& status) {
    return status.st_uid == 0 && (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

/// Whoever can put files into the folder could put any file of root's there.
bool IsFolderRootsOwn() {
    struct stat status {};

    return lstat(kConfigurationDirectory, &status) == 0 && S_ISDIR(status.st_mode) &&
           IsRootsOwn(status);
}

std::optional<PropertyList> CountAsAbsent(const char* why) {
    PlatformLog(LogLevel::kError, "%s counts as absent: %s", ConfigurationPath().c_str(), why);
    return std::nullopt;
}

std::optional<PropertyList> ReadConfiguration() {
    // Whatever it is, opening it must not wait.
    const OwnedFd file(
        open(ConfigurationPath().c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));

    struct stat status {};

    if (!file.isOpen() && errno == ENOENT) {
        return std::nullopt;
    }
    if (!file.isOpen() || fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode) ||
        !IsRootsOwn(status) || !IsFolderRootsOwn() || status.st_size > kLargestFile) {
        return CountAsAbsent(
            "it must be a file of root's, in a folder of root's, neither writable by others, of at "
            "most 64 KiB");
    }
    std::vector<std::byte> contents(static_cast<std::size_t>(status.st_size));
    if (pread(file.get(), contents.data(), contents.size(), 0) !=
        static_cast<ssize_t>(contents.size())) {
        return CountAsAbsent("it cannot be read");
    }
    auto configuration = PropertyListCreateWithData(contents);
    return configuration && configuration->kind() == PropertyList::Kind::kDictionary
               ? std::move(configuration)
               : CountAsAbsent("it is not a property list with a dictionary");
}

}  // namespace

std::optional<std::string> PlatformConfigurationText(std::string_view key) {
    const auto configuration = ReadConfiguration();
    const PropertyList* const value = configuration ? configuration->find(key) : nullptr;
    const auto* const text = value == nullptr ? nullptr : value->as<std::string>();
    return text == nullptr || text->empty() ? std::nullopt : std::optional(*text);
}

}  // namespace platform
