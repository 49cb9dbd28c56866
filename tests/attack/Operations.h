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
    int sawCanary = 0;  ///< lstat told of something that is the canary's
    long swaps = 0;
    std::vector<std::string> damage{};
};

/// lstat, remove and symlink in turns, on all paths that the attacker swaps.
[[nodiscard]] Outcome AttackPathAccess(int operations);

}  // namespace attack
