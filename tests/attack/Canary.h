// Trees that nobody may touch, and the proof that nobody did.
#pragma once

#include <sys/types.h>

#include <map>
#include <string>
#include <vector>

namespace attack {

inline constexpr const char* kCanary = "/private/canary";
/// The group of all that is in the canary, and of nothing else: who sees it was led there.
inline constexpr gid_t kCanaryGroup = 4242;
/// What its files hold: who holds it was led there, too.
inline constexpr const char* kCanaryContents = "the canary's";

/// What may be removed from a folder: a file, a link, an empty folder, and one that is not empty.
/// The canary has each of them under the names that requests use for their own.
void MakeRemovableThings(const std::string& folder);

/// Makes a folder with removable things, and below it the folders that a mobile Library has.
void MakeLibraryLikeFolder(const std::string& folder);

/// /private/canary anew: `open` (0755) and `secret` (0700), root's.
void MakeCanary();

/// Everything below the canary and the system's own folders, as it stands on the disk.
class Snapshot {
public:
    static Snapshot take();

    /// What is not the same in the later one, a line each; empty when nothing has changed.
    [[nodiscard]] std::vector<std::string> differencesTo(const Snapshot& later) const;

private:
    void add(const std::string& path);

    std::map<std::string, std::string> entries_;  // by path: identity, times and contents as text
};

}  // namespace attack
