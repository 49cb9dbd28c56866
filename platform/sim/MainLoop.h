// The simulated main loop, and what other parts let it wait for.
#pragma once

#include <memory>

#include "platform/RunLoop.h"

namespace sim {

/// A source with things to serve of its own.
class Source : public platform::RunLoopSource {
public:
    Source(const Source&) = delete;
    Source& operator=(const Source&) = delete;
    virtual ~Source() = default;

    [[nodiscard]] virtual std::size_t readyCount() const = 0;
    virtual void serve(std::size_t which) = 0;

    /// Called once, when the source leaves its loop for good.
    virtual void left() {}

    [[nodiscard]] bool isValid() const { return isValid_; }

    void leave();

protected:
    Source() = default;

private:
    bool isValid_ = true;
};

}  // namespace sim
