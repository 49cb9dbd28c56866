#include "platform/Semaphore.h"

#include <semaphore>

namespace platform {
namespace {

class Count final : public Semaphore {
public:
    ~Count() = default;

    std::counting_semaphore<> value{0};
};

}  // namespace

std::shared_ptr<Semaphore> Semaphore::create() {
    return std::make_shared<Count>();
}

void Semaphore::signal() {
    static_cast<Count*>(this)->value.release();
}

void Semaphore::wait() {
    static_cast<Count*>(this)->value.acquire();
}

}  // namespace platform
