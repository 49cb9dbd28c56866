// A counting semaphore: one thread waits for what others signal.
#pragma once

#include <memory>

namespace platform {

/// Starts at 0. What both sides reach is shared: the waiting one may go on, and let go of it,
/// before the signalling call has come back.
class Semaphore {
public:
    [[nodiscard]] static std::shared_ptr<Semaphore> create();

    Semaphore(const Semaphore&) = delete;
    Semaphore& operator=(const Semaphore&) = delete;

    /// From any thread. Lets one wait end, now or later.
    void signal();

    /// Blocks the calling thread for as long as it takes, so never the main one.
    void wait();

protected:
    Semaphore() = default;
    ~Semaphore() = default;
};

}  // namespace platform
