// Process exits by pidfd, on the loop that activates the source: the main one stands for the
// global queue.
#include "platform/ProcessExit.h"

#include <poll.h>
#include <sys/epoll.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <utility>

#include "platform/linux/EventLoop.h"

namespace platform {
namespace {

class PidfdSource final : public ProcessExitSource,
                          public EventSource,
                          public std::enable_shared_from_this<PidfdSource> {
public:
    explicit PidfdSource(OwnedFd pidfd)
        : EventSource(pidfd.get(), EPOLLIN), pidfd_(std::move(pidfd)) {}

    void ready(std::uint32_t /*events*/) override {
        if (const auto handler = std::exchange(eventHandler, nullptr)) {
            handler();
        }
        leaveLoop();  // an exited process stays ready for ever
    }

    void end() {
        leaveLoop();
        eventHandler = nullptr;
        if (const auto handler = std::exchange(cancelHandler, nullptr)) {
            handler();
        }
    }

    std::function<void()> eventHandler;
    std::function<void()> cancelHandler;

private:
    const OwnedFd pidfd_;
};

PidfdSource& AsPidfdSource(ProcessExitSource& source) {
    return static_cast<PidfdSource&>(source);
}

}  // namespace

std::shared_ptr<ProcessExitSource> ProcessExitSource::create(std::int32_t pid) {
    OwnedFd pidfd(static_cast<int>(syscall(SYS_pidfd_open, pid, 0)));
    if (!pidfd.isOpen()) {
        return nullptr;
    }
    return std::make_shared<PidfdSource>(std::move(pidfd));
}

void ProcessExitSource::setEventHandler(std::function<void()> handler) {
    AsPidfdSource(*this).eventHandler = std::move(handler);
}

void ProcessExitSource::setCancelHandler(std::function<void()> handler) {
    AsPidfdSource(*this).cancelHandler = std::move(handler);
}

void ProcessExitSource::activate() {
    RunLoop::current().addSource(AsPidfdSource(*this).shared_from_this());
}

void ProcessExitSource::cancel() {
    AsPidfdSource(*this).end();
}

bool ProcessExitSource::processLives() const {
    pollfd state{
        .fd = static_cast<const PidfdSource&>(*this).descriptor(), .events = POLLIN, .revents = 0};
    return poll(&state, 1, 0) == 0;
}

}  // namespace platform
