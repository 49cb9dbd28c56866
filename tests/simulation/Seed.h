// Which rounds a simulation runs: all of its own, or the one that is to be replayed.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <string>

/// The round named by --seed=N or LINEFOLD_SEED; 0: all rounds.
[[nodiscard]] std::uint64_t SeedToReplay();

/// Calls `round` with each seed and stops at the first that fails, naming its seed.
template <typename Round>
void ForEachSeed(std::uint64_t rounds, const Round& round) {
    const std::uint64_t chosen = SeedToReplay();
    const std::uint64_t first = chosen == 0 ? 1 : chosen;
    const std::uint64_t last = chosen == 0 ? rounds : chosen;
    for (std::uint64_t seed = first; seed <= last && !testing::Test::HasFailure(); ++seed) {
        SCOPED_TRACE("replay with --seed=" + std::to_string(seed));
        round(seed);
    }
}
