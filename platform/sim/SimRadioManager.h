// The simulated radio manager.
#pragma once

#include <vector>

namespace sim {

/// What it was told since the last Reset, in order.
[[nodiscard]] const std::vector<bool>& RadioManagerRequests();

}  // namespace sim
