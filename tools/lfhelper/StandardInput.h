// Standard input, read as a whole.
#pragma once

#include <cstddef>
#include <string>

namespace lfhelper {

struct Input {
    std::string content;
    /// Why there is none; `content` is empty then.
    std::string error{};
};

/// Reads up to the end, but no more than `sizeMax` bytes: more is an error.
[[nodiscard]] Input ReadStandardInput(std::size_t sizeMax);

}  // namespace lfhelper
