// Programs that a role of the simulator runs.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace simulator {

enum class Space : bool {
    kPhone,    ///< our own network
    kGateway,  ///< the other side of the phone's networks
};

/// Runs a program to its end, quietly unless it fails. True when its exit status is 0.
[[nodiscard]] bool Run(const std::vector<std::string>& command);

/// Starts a program that ends with us, however we end. -1 when it cannot be started.
[[nodiscard]] pid_t Start(const std::vector<std::string>& command, Space space);

}  // namespace simulator
