#include "platform/FileManager.h"

#include <algorithm>
#include <array>
#include <cerrno>

namespace platform {

bool ConcernsAllItems(int error) {
    constexpr std::array kErrors{ENOSPC, EDQUOT, EROFS, EIO, ENOMEM, EMFILE, ENFILE, E2BIG};
    return std::ranges::find(kErrors, error) != kErrors.end();
}

}  // namespace platform
