#include "platform/SerialQueue.h"

#include <algorithm>
#include <cmath>
#include <utility>
#include <vector>

#include "platform/sim/World.h"

namespace {

constinit bool queuesStopped = false;

class QueueTimer;

/// All queues, in the order of their making, for the next world to empty them.
std::vector<sim::TaskActor*>& AllQueues() {
    static auto& queues = *new std::vector<sim::TaskActor*>;
    return queues;
}

}  // namespace

namespace platform {

struct SerialQueue::State final : sim::TaskActor, std::enable_shared_from_this<SerialQueue::State> {
    State(std::string_view name, QualityOfService quality) : label(name), service(quality) {
        AllQueues().push_back(this);
        sim::AddActor(this);
    }

    ~State() override {
        std::erase(AllQueues(), this);
        sim::RemoveActor(this);
    }

    [[nodiscard]] std::size_t readyCount() const override {
        return queuesStopped ? 0 : tasks.readyCount();
    }

    [[nodiscard]] double nextDue() const override {
        return queuesStopped ? sim::kNever : tasks.nextDue();
    }

    [[nodiscard]] std::shared_ptr<void> kept() override { return shared_from_this(); }

    /// A task keeps the queue until it has run.
    [[nodiscard]] std::function<void()> bind(std::function<void()> task) {
        return [self = shared_from_this(), task = std::move(task)] { task(); };
    }

    void fireAt(double due, const std::shared_ptr<QueueTimer>& timer);

    const std::string label;
    const QualityOfService service;
};

}  // namespace platform

namespace {

class QueueTimer final : public platform::SerialQueue::Timer {
public:
    QueueTimer(double interval, double leeway, std::function<void()> callout)
        : interval_(interval), leeway_(leeway), callout_(std::move(callout)) {}

    ~QueueTimer() = default;

    void cancelTimer() { isValid_ = false; }

    /// Anywhere within the leeway.
    [[nodiscard]] double withLeeway(double due) const {
        return due + leeway_ * static_cast<double>(sim::Random(1001)) / 1000.0;
    }

    /// When it is due again, or never. What was missed before this firing is merged into it.
    [[nodiscard]] double fire(double due) {
        const double missed = std::max(std::floor((sim::Now() - due) / interval_), 0.0);
        if (isValid_) {
            callout_();
        }
        return isValid_ ? due + interval_ * (missed + 1) : sim::kNever;
    }

private:
    const double interval_;
    const double leeway_;
    const std::function<void()> callout_;
    bool isValid_ = true;
};

}  // namespace

namespace platform {

void SerialQueue::State::fireAt(double due, const std::shared_ptr<QueueTimer>& timer) {
    tasks.postAt(timer->withLeeway(due), [self = shared_from_this(), due, timer] {
        if (const double next = timer->fire(due); next != sim::kNever) {
            self->fireAt(next, timer);
        }
    });
}

SerialQueue::SerialQueue(std::string_view label, QualityOfService service)
    : state_(std::make_shared<State>(label, service)) {}

const std::string& SerialQueue::label() const {
    return state_->label;
}

QualityOfService SerialQueue::service() const {
    return state_->service;
}

void SerialQueue::async(std::function<void()> task) const {
    sim::NoteCall("SerialQueue.async", label());
    state_->tasks.post(state_->bind(std::move(task)));
}

void SerialQueue::after(double seconds, std::function<void()> task) const {
    sim::NoteCall("SerialQueue.after", label());
    state_->tasks.postAt(sim::Now() + seconds, state_->bind(std::move(task)));
}

void SerialQueue::barrierAsync(std::function<void()> task) const {
    sim::NoteCall("SerialQueue.barrierAsync", label());
    state_->tasks.post(state_->bind(std::move(task)));
}

std::shared_ptr<SerialQueue::Timer> SerialQueue::repeat(double delay,
                                                        double interval,
                                                        double leeway,
                                                        std::function<void()> callout) const {
    if (sim::CallFails("SerialQueue.repeat", label())) {
        return nullptr;
    }
    auto timer = std::make_shared<QueueTimer>(interval, leeway, std::move(callout));
    state_->fireAt(sim::Now() + delay, timer);
    return timer;
}

void SerialQueue::Timer::cancel() {
    static_cast<QueueTimer*>(this)->cancelTimer();
}

bool SerialQueue::isCurrent() const {
    return sim::CurrentActor() == state_.get();
}

void SerialQueuesStop() {
    sim::NoteCall("SerialQueuesStop");
    queuesStopped = true;
}

}  // namespace platform

void sim::ResetQueues() {
    queuesStopped = false;
    // Emptying one may end it, and others with it.
    const auto queues = AllQueues();
    for (TaskActor* queue : queues) {
        if (std::ranges::find(AllQueues(), queue) != AllQueues().end()) {
            const auto kept = queue->kept();
            queue->tasks.clear();
        }
    }
}
