// A serial queue is a thread that runs an event loop.
#include "platform/SerialQueue.h"

#include <pthread.h>
#include <sys/resource.h>

#include <atomic>
#include <limits>
#include <mutex>
#include <thread>
#include <utility>

#include "platform/linux/EventLoop.h"

namespace platform {
namespace {

constexpr std::size_t kThreadNameMax = 15;
constexpr int kUtilityNice = 5;

constinit std::atomic<bool> queuesStopped = false;

}  // namespace

struct SerialQueue::State : std::enable_shared_from_this<State> {
    State(std::string_view name, QualityOfService quality) : label(name), service(quality) {}

    State(const State&) = delete;
    State& operator=(const State&) = delete;

    /// Nobody names the queue any more and every task has run: its thread may go.
    ~State() {
        if (loop != nullptr) {
            loop->requestStop();
        }
    }

    EventLoop& startedLoop() {
        const std::lock_guard guard(lock);
        if (loop == nullptr) {
            loop = std::make_shared<EventLoop>();
            std::thread(serve, loop, label, service).detach();
        }
        return *loop;
    }

    /// A task keeps the queue until it has run.
    std::function<void()> bind(std::function<void()> task) {
        return [self = shared_from_this(), task = std::move(task)] {
            if (!queuesStopped) {
                task();
            }
        };
    }

    static void serve(std::shared_ptr<EventLoop> served,
                      const std::string& label,
                      QualityOfService service) {
        EventLoop::ofThisThread = served.get();
        pthread_setname_np(pthread_self(), label.substr(0, kThreadNameMax).c_str());
        if (service == QualityOfService::kUtility) {
            setpriority(PRIO_PROCESS, 0, kUtilityNice);  // of this thread alone, on Linux
        }
        served->serve(
            std::numeric_limits<double>::max(), AfterSource::kGoOn, EventLoop::WhenEmpty::kWait);
        EventLoop::ofThisThread = nullptr;
    }

    const std::string label;
    const QualityOfService service;
    std::mutex lock;
    std::shared_ptr<EventLoop> loop;  // under lock
};

namespace {

class QueueTimer final : public SerialQueue::Timer {
public:
    explicit QueueTimer(std::shared_ptr<EventTimer> timer) : timer_(std::move(timer)) {}

    ~QueueTimer() = default;

    void cancelTimer() { timer_->cancel(); }

private:
    const std::shared_ptr<EventTimer> timer_;
};

}  // namespace

void SerialQueue::Timer::cancel() {
    static_cast<QueueTimer*>(this)->cancelTimer();
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
    if (queuesStopped) {
        return;  // no thread is started for what would not run
    }
    state_->startedLoop().enqueue(state_->bind(std::move(task)));
}

void SerialQueue::after(double seconds, std::function<void()> task) const {
    state_->startedLoop().attachTimer(std::make_shared<EventTimer>(
        AbsoluteTimeGetCurrent() + seconds, 0, state_->bind(std::move(task))));
}

// One thread runs one task at a time, so every task is a barrier already.
void SerialQueue::barrierAsync(std::function<void()> task) const {
    async(std::move(task));
}

std::shared_ptr<SerialQueue::Timer> SerialQueue::repeat(double delay,
                                                        double interval,
                                                        double /*leeway*/,
                                                        std::function<void()> callout) const {
    auto timer = std::make_shared<EventTimer>(
        AbsoluteTimeGetCurrent() + delay, interval, state_->bind(std::move(callout)));
    state_->startedLoop().attachTimer(timer);
    return std::make_shared<QueueTimer>(std::move(timer));
}

bool SerialQueue::isCurrent() const {
    const std::lock_guard guard(state_->lock);
    return state_->loop != nullptr && EventLoop::ofThisThread == state_->loop.get();
}

void SerialQueuesStop() {
    queuesStopped = true;
}

}  // namespace platform
