#include "location/LocationQueues.h"

#include <atomic>
#include <utility>

#include "platform/Log.h"

using platform::QualityOfService;
using platform::SerialQueue;

namespace {

constexpr double kSecondsToAnswer = 5.0;

constinit std::atomic<std::uint32_t> sharesTaken = 0;

/// None when all are taken.
LocationShare TakeShare() {
    if (++sharesTaken > kLocationRequestsMax) {
        --sharesTaken;
        return nullptr;
    }
    return {&sharesTaken, [](std::atomic<std::uint32_t>* taken) { --*taken; }};
}

}  // namespace

SerialQueue LocationLookupQueue() {
    static const SerialQueue& queue =
        *new SerialQueue("ORB callback queue", QualityOfService::kUtility);
    return queue;
}

SerialQueue LocationTimeOutQueue() {
    static const SerialQueue& queue = *new SerialQueue("location time-outs");
    return queue;
}

void QueueLocationLookup(std::function<void(const LocationShare& share)> lookUp) {
    if (auto share = TakeShare()) {
        LocationLookupQueue().async(
            [lookUp = std::move(lookUp), share = std::move(share)] { lookUp(share); });
    } else {
        platform::Log(platform::LogLevel::kError,
                      "location request dropped: %u are under way",
                      kLocationRequestsMax);
    }
}

void ScheduleLocationTimeOut(const LocationShare& share, std::function<void()> task) {
    LocationTimeOutQueue().after(kSecondsToAnswer, [share, task = std::move(task)] { task(); });
}
