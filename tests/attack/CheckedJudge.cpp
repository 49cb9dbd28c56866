// A check and a use after it: what is right while nobody moves.
#include <cerrno>
#include <filesystem>

#include "tests/attack/NaivePath.h"

namespace platform {

int Judge(const std::string& path) {
    std::error_code error;
    const auto parent = std::filesystem::canonical(path.substr(0, path.rfind('/')), error);
    const bool isOurs = parent.string().starts_with("/private/var/mobile") ||
                        parent.string().starts_with("/private/scratch") ||
                        parent.string().starts_with("/private/taken");
    return error ? error.value() : isOurs ? 0 : EPERM;
}

}  // namespace platform
