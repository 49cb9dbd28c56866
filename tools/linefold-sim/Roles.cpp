#include "tools/linefold-sim/Roles.h"

#include <vector>

#include "tools/linefold-sim/ModemManager.h"

namespace simulator {

std::span<const Role> Roles() {
    static const std::vector<Role> roles{
        {"modem-manager", "the modem manager", kModemManagerHelp, PlayModemManager},
    };
    return roles;
}

}  // namespace simulator
