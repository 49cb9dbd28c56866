// What every fuzz target shares: its entry, and the end of a run that broke an invariant.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdlib>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

/// A target that only returned would find nothing.
inline void Require(bool holds) {
    if (!holds) {
        std::abort();
    }
}
