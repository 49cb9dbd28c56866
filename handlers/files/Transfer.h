// The transfer of an item: to a path where nothing is, or into what is there already.
#pragma once

#include <cstdint>
#include <string>

enum class TransferMode : bool { kCopy, kMove };

struct Transfer {
    std::string source;
    std::string destination;
    std::uint32_t uid = 0;  ///< whom the source is given to, whether it is copied or moved
    std::uint32_t gid = 0;
    TransferMode mode = TransferMode::kCopy;
};

/// 0, -1 (no such source), 17 (a directory onto something that is none), or the failure code of the
/// copy or move to a path where nothing was. What went wrong while two trees were merged is not
/// told.
[[nodiscard]] int PerformTransfer(const Transfer& transfer);
