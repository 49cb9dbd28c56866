#include "platform/RunLoop.h"

#include <ctime>
#include <utility>

#include "platform/linux/EventLoop.h"

namespace platform {
namespace {

EventLoop& AsEventLoop(RunLoop& loop) {
    return static_cast<EventLoop&>(loop);
}

}  // namespace

AbsoluteTime AbsoluteTimeGetCurrent() {
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

void RunLoopSource::invalidate() {
    static_cast<EventSource*>(this)->leaveLoop();
}

std::shared_ptr<RunLoopTimer> RunLoopTimer::create(AbsoluteTime fireDate,
                                                   double interval,
                                                   std::function<void()> callout) {
    return std::make_shared<EventTimer>(fireDate, interval, std::move(callout));
}

void RunLoopTimer::invalidate() {
    static_cast<EventTimer*>(this)->cancel();
}

RunLoop& RunLoop::current() {
    if (EventLoop::ofThisThread == nullptr) {
        // Never destroyed: other threads may still post to it while the process ends.
        EventLoop::ofThisThread = new EventLoop;
    }
    return *EventLoop::ofThisThread;
}

RunLoopResult RunLoop::run(double seconds, AfterSource afterSource) {
    return AsEventLoop(*this).serve(seconds, afterSource, EventLoop::WhenEmpty::kFinish);
}

void RunLoop::stop() {
    AsEventLoop(*this).requestStop();
}

void RunLoop::addSource(const std::shared_ptr<RunLoopSource>& source) {
    AsEventLoop(*this).attach(std::static_pointer_cast<EventSource>(source));
}

void RunLoop::addTimer(const std::shared_ptr<RunLoopTimer>& timer) {
    AsEventLoop(*this).attachTimer(std::static_pointer_cast<EventTimer>(timer));
}

void RunLoop::post(std::function<void()> task) {
    AsEventLoop(*this).enqueue(std::move(task));
}

void RunLoop::after(double seconds, std::function<void()> task) {
    AsEventLoop(*this).attachTimer(
        std::make_shared<EventTimer>(AbsoluteTimeGetCurrent() + seconds, 0, std::move(task)));
}

}  // namespace platform
