#include "platform/Process.h"

#include <malloc.h>
#include <sys/epoll.h>
#include <sys/resource.h>
#include <sys/signalfd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <memory>
#include <string>
#include <utility>

#include "platform/linux/DescriptorKind.h"
#include "platform/linux/EventLoop.h"
#include "platform/linux/PlatformLog.h"

namespace platform {
namespace {

class SignalSource final : public EventSource {
public:
    SignalSource(OwnedFd signals, std::function<void()> handler)
        : EventSource(signals.get(), EPOLLIN),
          signals_(std::move(signals)),
          handler_(std::move(handler)) {}

    void ready(std::uint32_t /*events*/) override {
        signalfd_siginfo signal{};
        if (read(signals_.get(), &signal, sizeof signal) == sizeof signal) {
            handler_();
        }
    }

private:
    const OwnedFd signals_;
    const std::function<void()> handler_;
};

sigset_t TerminationSignals() {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    return signals;
}

}  // namespace

void ProcessSettleIn() {
    umask(022);
    (void)std::signal(SIGPIPE, SIG_IGN);  // a valid signal number cannot fail
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) == 0) {
        limit.rlim_cur = limit.rlim_max;
        (void)setrlimit(RLIMIT_NOFILE, &limit);  // the limit as it was serves too
    }
    UpdateForeignDescriptorLimit();
    // Large blocks go back to the system when they are freed; left to itself the allocator would
    // learn to keep them once the first was.
    (void)mallopt(M_MMAP_THRESHOLD, 128 << 10);
}

std::uint32_t ProcessUserId() {
    return getuid();
}

std::uint32_t ProcessGroupId() {
    return getgid();
}

void ProcessOnTerminationRequest(std::function<void()> handler) {
    const sigset_t signals = TerminationSignals();
    OwnedFd descriptor(signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
    if (!descriptor.isOpen()) {
        return;  // the signals then end the process themselves
    }
    // Blocked before any other thread starts, so that all threads inherit it.
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
    RunLoop::current().addSource(
        std::make_shared<SignalSource>(std::move(descriptor), std::move(handler)));
}

void ProcessRefuseToStart(const char* format, std::string_view argument) {
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
#pragma GCC diagnostic ignored "-Wformat-security"
    PlatformLog(LogLevel::kError, format, std::string(argument).c_str());
#pragma GCC diagnostic pop
    // Static objects may be half made: nothing of theirs is to run now.
    std::_Exit(1);
}

}  // namespace platform
