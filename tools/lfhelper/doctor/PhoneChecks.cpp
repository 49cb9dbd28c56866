// The mobile user, the home, and the folders that the service works in.
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <optional>

#include "tools/lfhelper/doctor/Checks.h"
#include "tools/lfhelper/doctor/FileFacts.h"

namespace lfhelper::doctor {
namespace {

constexpr const char* kUser = "mobile-user";
constexpr const char* kHome = "mobile-home";
constexpr const char* kUserName = "mobile";
/// Where the carrier bundle links are, whatever the user's home is called.
constexpr const char* kRealHome = "/private/var/mobile";
constexpr const char* kMakeUser = "systemd-sysusers";
constexpr const char* kMakeFolders = "systemd-tmpfiles --create";

struct MobileUser {
    uid_t uid = 0;
    std::string home;
};

std::optional<MobileUser> FindMobileUser() {
    const passwd* const entry = getpwnam(kUserName);
    return entry == nullptr
               ? std::nullopt
               : std::optional(MobileUser{.uid = entry->pw_uid,
                                          .home = entry->pw_dir == nullptr ? "" : entry->pw_dir});
}

bool IsSame(const std::string& one, const std::string& other) {
    struct stat first {};

    struct stat second {};

    return stat(one.c_str(), &first) == 0 && stat(other.c_str(), &second) == 0 &&
           first.st_dev == second.st_dev && first.st_ino == second.st_ino;
}

Finding JudgeHome(const MobileUser& user, const FileFacts& facts) {
    const std::string& home = user.home;
    if (facts.isUnseen()) {
        return Note(kHome, home + " cannot be seen: " + facts.error, "run this as root");
    }
    if (!facts.is(S_IFDIR)) {
        return Problem(
            kHome, home + (facts.isAbsent() ? " is not there" : " is not a folder"), kMakeFolders);
    }
    if (facts.owner != user.uid) {
        return Problem(kHome,
                       home + " belongs to user " + std::to_string(facts.owner),
                       "chown mobile '" + home + "'");
    }
    if (!IsSame(home, kRealHome)) {
        return Problem(kHome,
                       home + " is not " + kRealHome + ", where the carrier bundle links are",
                       "make one a symbolic link to the other: " + std::string(kMakeFolders));
    }
    return Ok(kHome, home + " is the mobile user's");
}

enum class Owner : std::uint8_t { kMobile, kMobileOrRoot, kRoot };
enum class Absence : std::uint8_t { kProblem, kNote, kFine };

struct Folder {
    const char* check;
    const char* path;
    Owner owner;
    Absence absence;
    const char* withoutIt;  ///< what its absence means
};

constexpr const char* kMadeWhenNeeded = "the service makes it when it needs it";

constexpr std::array kFolders{
    Folder{"library-folder",
           "/private/var/mobile/Library",
           Owner::kMobile,
           Absence::kProblem,
           "there is no place for carrier bundle links"},
    Folder{"preferences-folder",
           "/private/var/mobile/Library/Preferences",
           Owner::kMobile,
           Absence::kProblem,
           "no preference can be stored"},
    Folder{"carrier-bundles-folder",
           "/private/var/mobile/Library/Carrier Bundles",
           Owner::kMobileOrRoot,
           Absence::kFine,
           kMadeWhenNeeded},
    Folder{"databases-folder",
           "/private/var/mobile/Library/LASD",
           Owner::kMobileOrRoot,
           Absence::kFine,
           kMadeWhenNeeded},
    Folder{"crash-reports-folder",
           "/private/var/mobile/Library/Logs/CrashReporter",
           Owner::kMobileOrRoot,
           Absence::kNote,
           "a copied log folder takes its place, or has none"},
    Folder{"voicemail-folder",
           "/private/var/db/linefold",
           Owner::kRoot,
           Absence::kFine,
           kMadeWhenNeeded},
};

Finding JudgeAbsence(const Folder& folder) {
    const std::string text = std::string(folder.path) + " is not there: " + folder.withoutIt;
    switch (folder.absence) {
        case Absence::kFine:
            return Ok(folder.check, text);
        case Absence::kNote:
            return Note(folder.check, text, "make it, and give it to the mobile user");
        case Absence::kProblem:
            break;
    }
    return Problem(folder.check, text, kMakeFolders);
}

Finding JudgeRootsFolder(const Folder& folder, const FileFacts& facts) {
    const std::string why = WhyNotRootsOwn(facts, S_IFDIR);
    return why.empty()
               ? Ok(folder.check, std::string(folder.path) + " is root's")
               : Problem(
                     folder.check, std::string(folder.path) + " " + why, MakeRootsOwn(folder.path));
}

Finding JudgeMobilesFolder(const Folder& folder, const FileFacts& facts, uid_t mobile) {
    const std::string path = folder.path;
    if (!facts.is(S_IFDIR)) {
        return Problem(
            folder.check, path + " is " + KindOf(facts) + " and not a folder", "make it a folder");
    }
    const bool isRoots = facts.owner == 0 && folder.owner == Owner::kMobileOrRoot;
    if (facts.owner != mobile && !isRoots) {
        return Problem(folder.check,
                       path + " belongs to user " + std::to_string(facts.owner),
                       "chown mobile '" + path + "'");
    }
    return Ok(folder.check, path + (isRoots ? " is root's" : " is the mobile user's"));
}

Finding JudgeFolder(const Folder& folder, const FileFacts& facts, uid_t mobile) {
    if (facts.isUnseen()) {
        return Note(folder.check,
                    std::string(folder.path) + " cannot be seen: " + facts.error,
                    "run this as root");
    }
    if (facts.isAbsent()) {
        return JudgeAbsence(folder);
    }
    return folder.owner == Owner::kRoot ? JudgeRootsFolder(folder, facts)
                                        : JudgeMobilesFolder(folder, facts, mobile);
}

}  // namespace

Findings CheckMobileUser(const Subject& /*subject*/) {
    const auto user = FindMobileUser();
    if (!user) {
        return {Problem(kUser, "there is no user mobile: the service does not start", kMakeUser)};
    }
    if (user->home.empty()) {
        return {Problem(kUser,
                        "the user mobile has no home: the service does not start",
                        "usermod --home /var/mobile mobile")};
    }
    return {Ok(kUser, "the user mobile is number " + std::to_string(user->uid)),
            JudgeHome(*user, LookAt(user->home, Links::kFollowed))};
}

Findings CheckFolders(const Subject& /*subject*/) {
    const auto user = FindMobileUser();
    Findings findings;
    for (const Folder& folder : kFolders) {
        if (folder.owner == Owner::kRoot) {
            findings.push_back(JudgeFolder(folder, LookAt(folder.path), 0));
        } else if (user) {
            findings.push_back(
                JudgeFolder(folder, LookAt(folder.path, Links::kFollowed), user->uid));
        }
    }
    return findings;
}

}  // namespace lfhelper::doctor
