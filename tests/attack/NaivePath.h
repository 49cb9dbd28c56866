// Path access and file manager by plain calls with paths: what the attack must be able to tell from
// the real ones.
#pragma once

#include <string>

#include "platform/PathAccess.h"

namespace platform {

struct PathAccess::State {
    std::string path;
};

/// Asked before every use of a path. 0 or an errno value.
[[nodiscard]] int Judge(const std::string& path);

/// The errno value of a call that returned this.
[[nodiscard]] int ErrorOf(int result);

}  // namespace platform
