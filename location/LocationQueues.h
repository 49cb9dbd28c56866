// Where location requests do their work, and how much of it there may be.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "platform/SerialQueue.h"

/// Look-ups are submitted here, and the geocoding services answer here. Made on first use.
[[nodiscard]] platform::SerialQueue LocationLookupQueue();

/// Time-outs run here, and reports that need no look-up. Not the main loop: a report waits for the
/// telephony daemon, and requests must not wait with it. Made on first use.
[[nodiscard]] platform::SerialQueue LocationTimeOutQueue();

/// Requests whose look-up has not begun or whose time-out has not run; each has a share.
inline constexpr std::uint32_t kLocationRequestsMax = 4096;

/// One request's share, given back with the last reference.
using LocationShare = std::shared_ptr<void>;

/// Runs a look-up on LocationLookupQueue, which keeps its share for as long as it has work to do.
/// While too many requests are under way it is dropped with an error line, or a client that asks
/// faster than we answer would fill our memory.
void QueueLocationLookup(std::function<void(const LocationShare& share)> lookUp);

/// Runs the task on LocationTimeOutQueue 5 seconds from now; it cannot be cancelled.
void ScheduleLocationTimeOut(const LocationShare& share, std::function<void()> task);
