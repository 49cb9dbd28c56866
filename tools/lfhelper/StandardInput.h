// Standard input, read as a whole, also in the place of an operand.
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

enum class LastLineFeed : bool { kKept, kDropped };

/// The operand, or, when it is "-", what standard input holds in its place. What is typed or echoed
/// ends in a line feed that nobody means: one of them may be dropped.
[[nodiscard]] Input ReadOperand(const std::string& operand,
                                std::size_t sizeMax,
                                LastLineFeed lineFeed);

}  // namespace lfhelper
