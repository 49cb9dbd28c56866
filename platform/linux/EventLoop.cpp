#include "platform/linux/EventLoop.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cmath>
#include <ctime>
#include <limits>
#include <utility>

#include "platform/Assertion.h"

namespace platform {
namespace {

constexpr std::size_t kEventsPerTurn = 64;
/// Longer waits than this are cut: they come back and wait again.
constexpr double kLongestWait = 1e6;

epoll_event Event(int descriptor, std::uint32_t interest) {
    return {.events = interest, .data = {.fd = descriptor}};
}

timespec TimeSpec(double seconds) {
    const double whole = std::floor(seconds);
    return {.tv_sec = static_cast<time_t>(whole),
            .tv_nsec = static_cast<long>((seconds - whole) * 1e9)};
}

}  // namespace

void EventSource::leaveLoop() {
    if (std::exchange(isValid_, false) && std::exchange(isAttached_, false)) {
        EventLoop::ofThisThread->detach(*this);
    }
}

void EventSource::setInterest(std::uint16_t interest) {
    if (std::exchange(interest_, interest) != interest && isAttached_) {
        EventLoop::ofThisThread->modify(*this);
    }
}

bool EventTimer::fire(AbsoluteTime now) {
    auto expected = State::kArmed;
    // From here the callout has begun: who cancels now comes too late.
    if (!state_.compare_exchange_strong(expected, State::kFiring)) {
        return false;
    }
    callout_();
    if (interval_ <= 0) {
        state_ = State::kInvalid;
        return false;
    }
    // Firings that were missed are merged into the one just made.
    const double periods = std::floor((now - fireDate_) / interval_) + 1;
    fireDate_ += interval_ * std::max(periods, 1.0);
    expected = State::kFiring;
    return state_.compare_exchange_strong(expected, State::kArmed);
}

EventLoop::EventLoop()
    : epoll_(epoll_create1(EPOLL_CLOEXEC)), wake_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
    PLATFORM_ASSERT(epoll_.isOpen() && wake_.isOpen());
    epoll_event event = Event(wake_.get(), EPOLLIN);
    PLATFORM_ASSERT(epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, wake_.get(), &event) == 0);
}

void EventLoop::attach(const std::shared_ptr<EventSource>& source) {
    if (!source->isValid_ || source->isAttached_) {
        return;
    }
    const int descriptor = source->descriptor_;
    const auto index = static_cast<std::size_t>(descriptor);
    if (sources_.size() <= index) {
        sources_.resize(index + 1);
    }
    epoll_event event = Event(descriptor, source->interest_);
    if (epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, descriptor, &event) != 0) {
        return;  // out of memory for watches: the source stays silent, as one whose peer is silent
    }
    sources_[index] = source;
    newcomers_.push_back(descriptor);
    source->isAttached_ = true;
    ++sourceCount_;
}

void EventLoop::detach(EventSource& source) {
    // Explicitly: the descriptor's other copies, in other processes, would keep it in the set.
    epoll_ctl(epoll_.get(), EPOLL_CTL_DEL, source.descriptor_, nullptr);
    --sourceCount_;
    // The last step: it may end the source.
    sources_[static_cast<std::size_t>(source.descriptor_)] = nullptr;
}

void EventLoop::modify(const EventSource& source) {
    epoll_event event = Event(source.descriptor_, source.interest_);
    epoll_ctl(epoll_.get(), EPOLL_CTL_MOD, source.descriptor_, &event);
}

void EventLoop::attachTimer(std::shared_ptr<EventTimer> timer) {
    {
        const std::lock_guard guard(lock_);
        std::erase_if(timers_, [](const auto& other) { return !other->isArmed(); });
        timers_.push_back(std::move(timer));
        hasWork_ = true;
    }
    wake();
}

void EventLoop::enqueue(std::function<void()> task) {
    {
        const std::lock_guard guard(lock_);
        tasks_.push_back(std::move(task));
        hasWork_ = true;
    }
    wake();
}

void EventLoop::requestStop() {
    stopRequested_.store(true, std::memory_order_release);
    wake();
}

void EventLoop::wake() {
    // The loop's own thread looks at its work before it waits and needs no waking.
    if (ofThisThread != this && !isWoken_.exchange(true)) {
        const std::uint64_t one = 1;
        (void)!write(wake_.get(), &one, sizeof one);  // a full counter wakes just as well
    }
}

void EventLoop::runTasks() {
    std::vector<std::function<void()>> tasks;
    {
        const std::lock_guard guard(lock_);
        tasks.swap(tasks_);
    }
    for (auto task = tasks.begin(); task != tasks.end(); ++task) {
        if (isStopped()) {
            const std::lock_guard guard(lock_);
            tasks_.insert(
                tasks_.begin(), std::move_iterator(task), std::move_iterator(tasks.end()));
            return;
        }
        (*task)();
    }
}

void EventLoop::fireTimers() {
    std::vector<std::shared_ptr<EventTimer>> due;
    const AbsoluteTime now = AbsoluteTimeGetCurrent();
    {
        const std::lock_guard guard(lock_);
        for (auto& timer : timers_) {
            if (timer->isArmed() && timer->fireDate() <= now) {
                due.push_back(timer);
            }
        }
    }
    std::ranges::stable_sort(due, {}, [](const auto& timer) { return timer->fireDate(); });
    for (const auto& timer : due) {
        if (isStopped()) {
            return;
        }
        timer->fire(now);
    }
}

double EventLoop::secondsToWait(AbsoluteTime deadline) {
    if (!hasWork_) {
        return deadline - AbsoluteTimeGetCurrent();
    }
    const std::lock_guard guard(lock_);
    if (!tasks_.empty()) {
        return 0;
    }
    std::erase_if(timers_, [](const auto& timer) { return !timer->isArmed(); });
    hasWork_ = !timers_.empty();
    for (const auto& timer : timers_) {
        deadline = std::min(deadline, timer->fireDate());
    }
    return deadline - AbsoluteTimeGetCurrent();
}

bool EventLoop::isEmpty() {
    const std::lock_guard guard(lock_);
    return sourceCount_ == 0 && tasks_.empty() &&
           std::ranges::none_of(timers_, [](const auto& timer) { return timer->isArmed(); });
}

bool EventLoop::serveSources(double seconds) {
    std::array<epoll_event, kEventsPerTurn> events;
    const timespec limit = TimeSpec(std::clamp(seconds, 0.0, kLongestWait));
    const int count = epoll_pwait2(epoll_.get(),
                                   events.data(),
                                   static_cast<int>(events.size()),
                                   seconds >= kLongestWait ? nullptr : &limit,
                                   nullptr);
    newcomers_.clear();
    const std::uint64_t wait = ++waitCount_;
    bool handled = false;
    // A callout may run the loop: what is left of the batch is old then, and will be told again.
    for (int i = 0; i < count && !isStopped() && wait == waitCount_; ++i) {
        const epoll_event& event = events[static_cast<std::size_t>(i)];
        const int descriptor = event.data.fd;
        if (descriptor == wake_.get()) {
            std::uint64_t wakes = 0;
            (void)!read(wake_.get(), &wakes, sizeof wakes);  // what it says is in the work itself
            isWoken_ = false;
            continue;
        }
        // An earlier callout of this batch may have ended the source, or put another one in its
        // place, which the event does not mean: what is true of that one comes with the next wait.
        const auto source = sources_[static_cast<std::size_t>(descriptor)];
        if (source == nullptr || std::ranges::find(newcomers_, descriptor) != newcomers_.end()) {
            continue;
        }
        source->ready(event.events);
        handled = true;
    }
    return handled;
}

RunLoopResult EventLoop::serve(double seconds, AfterSource afterSource, WhenEmpty whenEmpty) {
    const bool isEndless = seconds >= kLongestWait;
    const AbsoluteTime deadline =
        isEndless ? std::numeric_limits<double>::infinity() : AbsoluteTimeGetCurrent() + seconds;
    for (;;) {
        if (hasWork_) {
            runTasks();
            fireTimers();
        }
        if (stopRequested_.exchange(false)) {
            return RunLoopResult::kStopped;
        }
        if (sourceCount_ == 0 && whenEmpty == WhenEmpty::kFinish && isEmpty()) {
            return RunLoopResult::kFinished;
        }
        const double wait = isEndless && !hasWork_ ? kLongestWait : secondsToWait(deadline);
        const bool handled = serveSources(wait);
        if (stopRequested_.exchange(false)) {
            return RunLoopResult::kStopped;
        }
        if (handled && afterSource == AfterSource::kReturn) {
            return RunLoopResult::kHandledSource;
        }
        if (!isEndless && AbsoluteTimeGetCurrent() >= deadline) {
            return RunLoopResult::kTimedOut;
        }
    }
}

}  // namespace platform
