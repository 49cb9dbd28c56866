// The operations under attack, and what came of them.
#pragma once

#include <string>
#include <vector>

namespace attack {

/// Fewer where every step is slowed down by a sanitizer.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
inline constexpr int kScale = 10;
#else
inline constexpr int kScale = 1;
#endif

struct Outcome {
    int operations = 0;
    int succeeded = 0;
    int refused = 0;    ///< with EPERM: somebody tried to lead us elsewhere
    int sawCanary = 0;  ///< lstat told of something of the canary's, or a copy holds it
    long swaps = 0;
    std::vector<std::string> damage{};
};

/// lstat, remove and symlink in turns, on all paths that the attacker swaps.
[[nodiscard]] Outcome AttackPathAccess(int operations);

/// Whole items copied, moved, merged and removed on those paths, folders and files made, and owners
/// and modes set on all that lies below the places.
[[nodiscard]] Outcome AttackFileManager(int operations);

}  // namespace attack
