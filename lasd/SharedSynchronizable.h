// An object that is shared, and whose work and end take place on a serial queue of its own.
#pragma once

#include <functional>
#include <memory>
#include <string_view>
#include <utility>

#include "platform/SerialQueue.h"

namespace hvu {

/// Base of T, which is made by create() alone. When the last shared pointer goes, the object is
/// destroyed on its queue, behind all work that was submitted before.
template <typename T>
class SharedSynchronizable {
public:
    template <typename... Arguments>
    [[nodiscard]] static std::shared_ptr<T> create(Arguments&&... arguments) {
        auto owned = std::make_unique<T>(std::forward<Arguments>(arguments)...);
        const auto destroyOnItsQueue = [queue = owned->workQueue_](T* object) {
            queue.barrierAsync([object] { delete object; });
        };
        const std::shared_ptr<T> shared(owned.release(), destroyOnItsQueue);
        shared->self_ = shared;
        return shared;
    }

    SharedSynchronizable(const SharedSynchronizable&) = delete;
    SharedSynchronizable& operator=(const SharedSynchronizable&) = delete;

protected:
    explicit SharedSynchronizable(std::string_view label) : workQueue_(label) {}

    ~SharedSynchronizable() = default;

    /// Runs the work on the queue and keeps the object until then. Throws std::bad_weak_ptr when
    /// nobody shares the object any more.
    void submit(std::function<void()> work) const {
        workQueue_.async([self = std::shared_ptr<T>(self_), work = std::move(work)] { work(); });
    }

    [[nodiscard]] bool isOnWorkQueue() const { return workQueue_.isCurrent(); }

private:
    std::weak_ptr<T> self_;
    const platform::SerialQueue workQueue_;
    const std::shared_ptr<const platform::SerialQueue> targetQueue_;  ///< no class has one
};

}  // namespace hvu
