// The one thread on which the geocoding services wait for the network.
#pragma once

#include "platform/SerialQueue.h"

namespace platform {

/// Made on first use.
[[nodiscard]] SerialQueue NetworkQueue();

}  // namespace platform
