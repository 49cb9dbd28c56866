#include "platform/RunLoop.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <utility>
#include <vector>

#include "platform/sim/MainLoop.h"
#include "platform/sim/World.h"

using platform::AfterSource;
using platform::RunLoopResult;

namespace sim {
namespace {

class Timer final : public platform::RunLoopTimer {
public:
    Timer(double fireDate, double interval, std::function<void()> callout)
        : fireDate_(fireDate), interval_(interval), callout_(std::move(callout)) {}

    ~Timer() = default;

    [[nodiscard]] bool isValid() const { return isValid_; }

    [[nodiscard]] double fireDate() const { return fireDate_; }

    void cancel() { isValid_ = false; }

    void fire() {
        const double due = fireDate_;
        isValid_ = interval_ > 0;
        if (isValid_) {
            // Firings that were missed are merged into this one.
            fireDate_ += interval_ * (std::floor((Now() - due) / interval_) + 1);
        }
        callout_();
    }

private:
    double fireDate_;
    const double interval_;
    const std::function<void()> callout_;
    bool isValid_ = true;
};

class MainLoop final : public platform::RunLoop, public Actor {
public:
    MainLoop() { AddActor(this); }

    /// The first timer due, the first posted task, and whatever the sources have.
    [[nodiscard]] std::size_t readyCount() const override {
        if (stopRequested_) {
            return 0;  // queues may go on for a while before the run gets to end
        }
        std::size_t count = tasks_.readyCount() + (isTimerReady() ? 1 : 0);
        for (const auto& source : sources_) {
            count += source->readyCount();
        }
        return count;
    }

    [[nodiscard]] double nextDue() const override {
        if (stopRequested_) {
            return kNever;
        }
        const auto timer = firstTimer();
        return std::min(tasks_.nextDue(), timer == nullptr ? kNever : timer->fireDate());
    }

    void serve(std::size_t which) override {
        if (isTimerReady() && which-- == 0) {
            firstTimer()->fire();
            return;
        }
        if (which < tasks_.readyCount()) {
            tasks_.take(which)();
            return;
        }
        which -= tasks_.readyCount();
        serveSource(which);
    }

    RunLoopResult run(double seconds, AfterSource afterSource) {
        if (isServing) {
            throw ContractBroken("a run of the loop inside one of its callouts");
        }
        const double deadline =
            seconds >= std::numeric_limits<double>::max() ? kNever : Now() + seconds;
        handledSource_ = false;
        for (;;) {
            if (std::exchange(stopRequested_, false)) {
                return RunLoopResult::kStopped;
            }
            if (handledSource_ && afterSource == AfterSource::kReturn) {
                return RunLoopResult::kHandledSource;
            }
            if (isEmpty()) {
                return RunLoopResult::kFinished;
            }
            if (!ServeOne() && !waitUntil(deadline)) {
                return RunLoopResult::kTimedOut;
            }
        }
    }

    void requestStop() { stopRequested_ = true; }

    void attach(std::shared_ptr<Source> source) {
        if (source->isValid() && std::ranges::find(sources_, source) == sources_.end()) {
            sources_.push_back(std::move(source));
        }
    }

    void detach(const Source& source) {
        std::erase_if(sources_, [&](const auto& other) { return other.get() == &source; });
    }

    void attachTimer(std::shared_ptr<Timer> timer) {
        std::erase_if(timers_, [](const auto& other) { return !other->isValid(); });
        timers_.push_back(std::move(timer));
    }

    TaskList& tasks() { return tasks_; }

    void forget() {
        tasks_.clear();
        const auto timers = std::exchange(timers_, {});
        const auto sources = std::exchange(sources_, {});
        for (const auto& source : sources) {
            source->leave();
        }
        stopRequested_ = false;
        isServing = false;
    }

private:
    [[nodiscard]] std::shared_ptr<Timer> firstTimer() const {
        std::shared_ptr<Timer> first;
        for (const auto& timer : timers_) {
            if (timer->isValid() && (first == nullptr || timer->fireDate() < first->fireDate())) {
                first = timer;
            }
        }
        return first;
    }

    [[nodiscard]] bool isTimerReady() const {
        const auto timer = firstTimer();
        return timer != nullptr && timer->fireDate() <= Now();
    }

    [[nodiscard]] bool isEmpty() const {
        return sources_.empty() && tasks_.empty() && firstTimer() == nullptr;
    }

    void serveSource(std::size_t which) {
        for (const auto& source : sources_) {
            const std::size_t count = source->readyCount();
            if (which < count) {
                handledSource_ = true;
                const auto keptWhileItServes = source;
                keptWhileItServes->serve(which);
                return;
            }
            which -= count;
        }
    }

    /// Lets time pass until something is due. False when the deadline came first.
    static bool waitUntil(double deadline) {
        const double due = NextDue();
        if (due > deadline) {
            AdvanceTo(deadline);
            return false;
        }
        if (due == kNever) {
            throw NothingLeftToHappen("the loop waits for what can never happen");
        }
        AdvanceTo(due);
        return true;
    }

    TaskList tasks_;
    std::vector<std::shared_ptr<Timer>> timers_;
    std::vector<std::shared_ptr<Source>> sources_;
    bool stopRequested_ = false;
    bool handledSource_ = false;
};

MainLoop& TheMainLoop() {
    static MainLoop& loop = *new MainLoop;
    return loop;
}

}  // namespace

void Source::leave() {
    if (std::exchange(isValid_, false)) {
        left();
        TheMainLoop().detach(*this);  // the last step: it may end the source
    }
}

void ResetMainLoop() {
    TheMainLoop().forget();
}

}  // namespace sim

namespace platform {

void RunLoopSource::invalidate() {
    static_cast<sim::Source*>(this)->leave();
}

std::shared_ptr<RunLoopTimer> RunLoopTimer::create(AbsoluteTime fireDate,
                                                   double interval,
                                                   std::function<void()> callout) {
    if (sim::CallFails("RunLoopTimer.create")) {
        return nullptr;
    }
    return std::make_shared<sim::Timer>(fireDate, interval, std::move(callout));
}

void RunLoopTimer::invalidate() {
    sim::NoteCall("RunLoopTimer.invalidate");
    static_cast<sim::Timer*>(this)->cancel();
}

RunLoop& RunLoop::current() {
    return sim::TheMainLoop();
}

RunLoopResult RunLoop::run(double seconds, AfterSource afterSource) {
    return static_cast<sim::MainLoop*>(this)->run(seconds, afterSource);
}

void RunLoop::stop() {
    sim::NoteCall("RunLoop.stop");
    static_cast<sim::MainLoop*>(this)->requestStop();
}

void RunLoop::addSource(const std::shared_ptr<RunLoopSource>& source) {
    sim::NoteCall("RunLoop.addSource");
    static_cast<sim::MainLoop*>(this)->attach(std::static_pointer_cast<sim::Source>(source));
}

void RunLoop::addTimer(const std::shared_ptr<RunLoopTimer>& timer) {
    sim::NoteCall("RunLoop.addTimer");
    static_cast<sim::MainLoop*>(this)->attachTimer(std::static_pointer_cast<sim::Timer>(timer));
}

void RunLoop::post(std::function<void()> task) {
    static_cast<sim::MainLoop*>(this)->tasks().post(std::move(task));
}

void RunLoop::after(double seconds, std::function<void()> task) {
    static_cast<sim::MainLoop*>(this)->tasks().postAt(sim::Now() + seconds, std::move(task));
}

}  // namespace platform
