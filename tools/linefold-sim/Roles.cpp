#include "tools/linefold-sim/Roles.h"

#include <vector>

namespace simulator {

std::span<const Role> Roles() {
    static const std::vector<Role> roles{};
    return roles;
}

}  // namespace simulator
