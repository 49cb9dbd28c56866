#include "platform/Semaphore.h"

#include "platform/sim/World.h"

namespace platform {
namespace {

class Count final : public Semaphore {
public:
    ~Count() = default;

    unsigned value = 0;
};

}  // namespace

std::shared_ptr<Semaphore> Semaphore::create() {
    return std::make_shared<Count>();
}

void Semaphore::signal() {
    ++static_cast<Count*>(this)->value;
}

void Semaphore::wait() {
    auto& value = static_cast<Count*>(this)->value;
    sim::RunOthersUntil([&value] { return value > 0; });
    --value;
}

}  // namespace platform
