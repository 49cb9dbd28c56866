// Keeps a daemon's listening socket and starts the daemon when somebody connects, again after each
// exit, as the service manager does. It never accepts: a connection that one instance leaves behind
// stays in the queue and starts the next.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/signalfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "client/Descriptor.h"

namespace {

using linefold_client::Descriptor;

constexpr int kPauseMsMin = 50;
constexpr int kPauseMsMax = 1000;
constexpr auto kBriefRun = std::chrono::milliseconds(20);
constexpr int kFirstPassedDescriptor = 3;

struct Options {
    bool verbose = false;
    const char* path = nullptr;
    const char* descriptorName = nullptr;
    char** program = nullptr;  // The program and its arguments, closed by a null pointer.
};

// Nothing when the arguments are not to be understood.
std::optional<Options> ParseArguments(int argc, char** argv) {
    Options options;
    int next = 1;
    if (next < argc && std::string_view(argv[next]) == "--verbose") {
        options.verbose = true;
        ++next;
    }
    if (argc - next < 3 || argv[next][0] == '-') {
        return std::nullopt;
    }
    options.path = argv[next];
    options.descriptorName = argv[next + 1];
    options.program = argv + next + 2;
    return options;
}

void Complain(const char* what) {
    std::fprintf(stderr, "activator: %s: %s\n", what, std::strerror(errno));
}

// The listening socket, open to everybody: the daemon decides whom it serves.
std::optional<Descriptor> Listen(const char* path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (std::strlen(path) >= sizeof address.sun_path) {
        errno = ENAMETOOLONG;
        return std::nullopt;
    }
    std::memcpy(address.sun_path, path, std::strlen(path));
    Descriptor socket{::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0)};

    struct stat status {};

    if (lstat(path, &status) == 0 && S_ISSOCK(status.st_mode)) {
        (void)unlink(path);  // Of an earlier activator. Should it fail, bind says so.
    }
    if (!socket.isOpen() ||
        bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        chmod(path, 0666) != 0 || listen(socket.get(), SOMAXCONN) != 0) {
        return std::nullopt;
    }
    return socket;
}

// Signals are read from a descriptor, so one poll waits for all that can happen.
sigset_t HandledSignals() {
    sigset_t signals;
    sigemptyset(&signals);
    for (const int signal : {SIGTERM, SIGINT, SIGCHLD}) {
        sigaddset(&signals, signal);
    }
    return signals;
}

std::optional<Descriptor> OpenSignals() {
    const sigset_t signals = HandledSignals();
    Descriptor descriptor{signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK)};
    if (!descriptor.isOpen() || sigprocmask(SIG_BLOCK, &signals, nullptr) != 0) {
        return std::nullopt;
    }
    return descriptor;
}

// In the child: becomes the program, with the standard descriptors and the socket and nothing else.
// What goes wrong is the parent's to say, by the exit status a shell would give.
[[noreturn]] void BecomeProgram(const Options& options, int socket, pid_t parent) {
    const sigset_t signals = HandledSignals();
    (void)sigprocmask(SIG_UNBLOCK, &signals, nullptr);
    (void)prctl(PR_SET_PDEATHSIG, SIGTERM);
    if (getppid() != parent) {
        _exit(126);  // The activator died before its death could be announced.
    }
    // dup2 takes the mark "close on exec" off the copy; on the very number it leaves it alone.
    const int passed = socket == kFirstPassedDescriptor ? fcntl(socket, F_SETFD, 0)
                                                        : dup2(socket, kFirstPassedDescriptor);
    if (passed < 0 || close_range(kFirstPassedDescriptor + 1, ~0U, 0) != 0 ||
        setenv("LISTEN_FDS", "1", 1) != 0 ||
        setenv("LISTEN_FDNAMES", options.descriptorName, 1) != 0 ||
        setenv("LISTEN_PID", std::to_string(getpid()).c_str(), 1) != 0) {
        _exit(126);
    }
    execv(options.program[0], options.program);
    _exit(errno == ENOENT ? 127 : 126);
}

enum class Happened { kConnection, kChildEnded, kTimeIsUp, kStop };

class Activator final {
public:
    Activator(const Options& options, Descriptor socket, Descriptor signals)
        : options_(options), socket_(std::move(socket)), signals_(std::move(signals)) {}

    // Serves until a signal says stop; returns the exit status.
    int run() {
        for (;;) {
            if (waitFor(Awaited::kConnection, -1) == Happened::kStop || !start()) {
                return stopped_ ? 0 : 1;
            }
            if (waitFor(Awaited::kNothing, -1) == Happened::kStop) {
                stopChild();
                return 0;
            }
            if (!pauseAfterFailure()) {
                return 0;
            }
        }
    }

private:
    using Clock = std::chrono::steady_clock;

    enum class Awaited { kConnection, kNothing };

    // Waits for a signal, and for a connection when that is awaited.
    Happened waitFor(Awaited awaited, int timeoutMs) {
        std::array<pollfd, 2> waiting{pollfd{signals_.get(), POLLIN, 0},
                                      pollfd{socket_.get(), POLLIN, 0}};
        const nfds_t count = awaited == Awaited::kConnection ? 2 : 1;
        for (;;) {
            const int ready = poll(waiting.data(), count, timeoutMs);
            if (ready == 0) {
                return Happened::kTimeIsUp;
            }
            if (waiting[0].revents != 0) {
                if (const auto what = readSignal()) {
                    return *what;
                }
            } else if (ready > 0) {
                return Happened::kConnection;
            }
        }
    }

    std::optional<Happened> readSignal() {
        signalfd_siginfo signal{};
        if (read(signals_.get(), &signal, sizeof signal) != sizeof signal) {
            return std::nullopt;
        }
        if (signal.ssi_signo != SIGCHLD) {
            stopped_ = true;
            return Happened::kStop;
        }
        if (child_ > 0 && waitpid(child_, &childStatus_, WNOHANG) == child_) {
            child_ = 0;
            return Happened::kChildEnded;
        }
        return std::nullopt;
    }

    bool start() {
        const pid_t self = getpid();
        child_ = fork();
        if (child_ == 0) {
            BecomeProgram(options_, socket_.get(), self);
        }
        if (child_ < 0) {
            Complain("fork");
            return false;
        }
        startedAt_ = Clock::now();
        say("started", child_);
        return true;
    }

    void stopChild() {
        (void)kill(child_, SIGTERM);
        (void)waitpid(child_, &childStatus_, 0);
        report();
    }

    // Says how the program ended, and after a failure waits before the next start, longer each
    // time: the connection that started it may still be there, and would start it at once. A
    // program that leaves as soon as it came takes no connection either, whatever its status says.
    // False when a signal says stop meanwhile.
    bool pauseAfterFailure() {
        report();
        const bool brief = Clock::now() - startedAt_ < kBriefRun;
        if (!brief && WIFEXITED(childStatus_) && WEXITSTATUS(childStatus_) == 0) {
            pauseMs_ = 0;
            return true;
        }
        pauseMs_ = std::clamp(pauseMs_ * 2, kPauseMsMin, kPauseMsMax);
        return waitFor(Awaited::kNothing, pauseMs_) != Happened::kStop;
    }

    void report() const {
        const char* program = options_.program[0];
        if (WIFSIGNALED(childStatus_)) {
            std::fprintf(
                stderr, "activator: %s was ended by signal %d\n", program, WTERMSIG(childStatus_));
            return;
        }
        const int status = WEXITSTATUS(childStatus_);
        say("exited with status", status);
        if (status == 126 || status == 127) {
            std::fprintf(stderr, "activator: %s cannot be executed (status %d)\n", program, status);
        } else if (status != 0) {
            std::fprintf(stderr, "activator: %s exited with status %d\n", program, status);
        }
    }

    void say(const char* what, int number) const {
        if (options_.verbose) {
            std::printf("%s %d\n", what, number);
            (void)std::fflush(stdout);
        }
    }

    const Options options_;
    const Descriptor socket_;
    const Descriptor signals_;
    bool stopped_ = false;
    pid_t child_ = 0;
    Clock::time_point startedAt_;
    int childStatus_ = 0;
    int pauseMs_ = 0;
};

}  // namespace

int main(int argc, char** argv) {
    const auto options = ParseArguments(argc, argv);
    if (!options) {
        std::fputs("usage: activator [--verbose] PATH FDNAME PROGRAM [ARGUMENT...]\n", stderr);
        return 2;
    }
    auto signals = OpenSignals();
    if (!signals) {
        Complain("signalfd");
        return 1;
    }
    auto socket = Listen(options->path);
    // The service manager starts a daemon in the root folder, wherever it was started itself.
    if (!socket || chdir("/") != 0) {
        Complain(options->path);
        return 1;
    }
    return Activator(*options, std::move(*socket), std::move(*signals)).run();
}
