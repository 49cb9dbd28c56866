#include "tools/linefold-sim/Roles.h"

#include <vector>

#include "tools/linefold-sim/ConfigurationServer.h"

namespace simulator {

std::span<const Role> Roles() {
    static const std::vector<Role> roles{
        {.name = "configuration-server",
         .summary = "serve a folder as the index server does, over HTTPS",
         .help = kConfigurationServerHelp,
         .play = &PlayConfigurationServer},
    };
    return roles;
}

}  // namespace simulator
