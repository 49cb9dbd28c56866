// Entitlements: named values bound to reserved groups.
//
// <configuration folder>/entitlements/<group>.plist grants its entitlements to the processes that
// run under that group. The group is the one in the kernel's snapshot of the connecting process,
// which exec, fork, preloaded libraries, user namespaces and bind mounts cannot fool.
#include "platform/SecTask.h"

#include <dirent.h>
#include <fcntl.h>
#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <ctime>
#include <map>
#include <string>
#include <vector>

#include "platform/BuildConstants.h"
#include "platform/linux/OwnedFd.h"
#include "platform/linux/PlatformLog.h"

namespace platform {
namespace {

constexpr std::uint32_t kOverflowId = 65'534;  // whom the kernel cannot name
constexpr off_t kLargestFile = 64 << 10;
constexpr std::string_view kExtension = ".plist";

struct CloseDirectory {
    void operator()(DIR* stream) const { closedir(stream); }
};

using DirectoryStream = std::unique_ptr<DIR, CloseDirectory>;

std::string EntitlementsDirectory() {
    return std::string(kConfigurationDirectory) + "/entitlements";
}

bool IsRootsOwn(const struct stat& status) {
    return status.st_uid == 0 && (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

OwnedFd OpenDirectory() {
    OwnedFd directory(
        open(EntitlementsDirectory().c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));

    struct stat status {};

    if (directory.isOpen() && (fstat(directory.get(), &status) != 0 || !IsRootsOwn(status))) {
        PlatformLog(LogLevel::kError,
                    "%s counts as absent: it must be root's and not writable by others",
                    EntitlementsDirectory().c_str());
        return {};
    }
    return directory;
}

std::optional<gid_t> GroupByName(const std::string& name) {
    for (std::size_t size = 1024; size <= 1U << 20; size *= 2) {
        std::vector<char> texts(size);
        group record{};
        group* found = nullptr;
        const int error = getgrnam_r(name.c_str(), &record, texts.data(), texts.size(), &found);
        if (error != ERANGE) {
            return error == 0 && found != nullptr ? std::optional(found->gr_gid) : std::nullopt;
        }
    }
    return std::nullopt;
}

/// A folder may change again within the same tick of the clock that stamps it, so what was listed
/// that soon after a change is not kept.
bool HasSettled(const timespec& changed) {
    timespec now{};
    clock_gettime(CLOCK_REALTIME, &now);
    return now.tv_sec - changed.tv_sec > 1;
}

/// Which file speaks for which group. The folder is listed, and each name that root put there is
/// looked up: a group that a stranger chose never is.
class GroupFiles {
public:
    /// The file of a group inside the folder, or null.
    const std::string* find(const OwnedFd& directory, gid_t group) {
        struct stat status {};

        if (fstat(directory.get(), &status) != 0) {
            return nullptr;
        }
        if (!isListed_ || !isSameTime(status.st_mtim)) {
            list(directory);
            listedAt_ = status.st_mtim;
            isListed_ = HasSettled(status.st_mtim);
        }
        const auto file = files_.find(group);
        return file == files_.end() ? nullptr : &file->second;
    }

private:
    [[nodiscard]] bool isSameTime(const timespec& time) const {
        return time.tv_sec == listedAt_.tv_sec && time.tv_nsec == listedAt_.tv_nsec;
    }

    void list(const OwnedFd& directory) {
        files_.clear();
        OwnedFd listed(openat(directory.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        const DirectoryStream stream(listed.isOpen() ? fdopendir(listed.get()) : nullptr);
        if (stream == nullptr) {
            return;
        }
        (void)listed.release();  // the stream closes it
        while (const dirent* const entry = readdir(stream.get())) {
            const std::string_view name = entry->d_name;
            if (name.ends_with(kExtension) && name.size() > kExtension.size()) {
                const std::string group(name.substr(0, name.size() - kExtension.size()));
                if (const auto gid = GroupByName(group); gid && *gid != kOverflowId) {
                    files_.emplace(*gid, name);
                }
            }
        }
    }

    std::map<gid_t, std::string> files_;
    timespec listedAt_{};
    bool isListed_ = false;
};

GroupFiles& TheGroupFiles() {
    static GroupFiles files;
    return files;
}

/// 0 with the contents, or an errno value.
int ReadFile(const OwnedFd& directory, const std::string& name, std::vector<std::byte>& contents) {
    const OwnedFd file(
        openat(directory.get(), name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));

    struct stat status {};

    if (!file.isOpen() || fstat(file.get(), &status) != 0) {
        return errno;
    }
    if (!S_ISREG(status.st_mode) || !IsRootsOwn(status) || status.st_size > kLargestFile) {
        PlatformLog(
            LogLevel::kError,
            "%s/%s counts as absent: it must be a file of root's, not writable by others, of "
            "at most 64 KiB",
            EntitlementsDirectory().c_str(),
            name.c_str());
        return EACCES;
    }
    contents.resize(static_cast<std::size_t>(status.st_size));
    const ssize_t length = pread(file.get(), contents.data(), contents.size(), 0);
    return length == static_cast<ssize_t>(contents.size()) ? 0 : EIO;
}

}  // namespace

struct SecTask::State {
    gid_t group;
};

SecTask::SecTask(std::unique_ptr<State> state) : state_(std::move(state)) {}

SecTask::~SecTask() = default;

std::unique_ptr<SecTask> SecTask::createWithAuditToken(const AuditToken& token) {
    const AuditIdentity sender = audit_token_to_identity(token);
    const auto isNobody = [](std::uint32_t id) {
        return id == kOverflowId || id == kUnknownIdentity;
    };
    if (sender.pid <= 0 || isNobody(sender.euid) || isNobody(sender.egid)) {
        return nullptr;
    }
    return std::unique_ptr<SecTask>(
        new SecTask(std::make_unique<State>(State{.group = sender.egid})));
}

SecTask::Answer SecTask::copyValueForEntitlement(std::string_view entitlement) const {
    const OwnedFd directory = OpenDirectory();
    if (!directory.isOpen()) {
        return {};
    }
    const std::string* const name = TheGroupFiles().find(directory, state_->group);
    if (name == nullptr) {
        return {};
    }
    std::vector<std::byte> contents;
    if (const int error = ReadFile(directory, *name, contents); error != 0) {
        return {.value = std::nullopt, .error = error};
    }
    const auto granted = PropertyListCreateWithData(contents);
    if (!granted) {
        PlatformLog(LogLevel::kError,
                    "%s/%s counts as absent: it is not a property list",
                    EntitlementsDirectory().c_str(),
                    name->c_str());
        return {.value = std::nullopt, .error = EINVAL};
    }
    const PropertyList* const value = granted->find(entitlement);
    return {.value = value == nullptr ? std::nullopt : std::optional(*value), .error = 0};
}

}  // namespace platform
