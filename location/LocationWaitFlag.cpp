#include "location/LocationWaitFlag.h"

#include <atomic>
#include <cstdint>

namespace {

constinit std::atomic<std::uint8_t> isWaiting = 0;

}  // namespace

void LocationWaitFlagSet() {
    isWaiting = 1;
}

bool LocationWaitFlagTake() {
    return isWaiting.exchange(0) == 1;
}
