// A cold start: a connection with a check-in waits at the listening socket, the program is
// executed, the reply comes. The daemon against a static program that only accepts and answers.
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdlib>
#include <stdexcept>
#include <string>

#include "bench/Bench.h"
#include "bench/Wire.h"

namespace {

constexpr int kRepetitions = 301;
constexpr int kActivatedDescriptor = 3;

/// The moment of the exec, told by the child through memory that both see.
double* MomentOfExec() {
    static auto* const moment = static_cast<double*>(
        mmap(nullptr, sizeof(double), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0));
    return moment;
}

[[noreturn]] void Execute(const std::string& program, int listening) {
    const bool isInPlace = listening == kActivatedDescriptor
                               ? fcntl(listening, F_SETFD, 0) == 0
                               : dup2(listening, kActivatedDescriptor) >= 0;
    setenv("LISTEN_PID", std::to_string(getpid()).c_str(), 1);
    setenv("LISTEN_FDS", "1", 1);
    setenv("LISTEN_FDNAMES", std::string(kServiceName).c_str(), 1);
    if (isInPlace && setegid(0) == 0) {
        std::array<char*, 2> arguments{const_cast<char*>(program.c_str()), nullptr};
        *MomentOfExec() = bench::Now();
        execv(program.c_str(), arguments.data());
    }
    _exit(127);
}

/// From exec to the reply, in seconds.
double Start(const std::string& program, int listening) {
    static const phone::Bytes request = phone::CheckInMessage();
    std::array<int, 2> ends{-1, -1};
    if (pipe2(ends.data(), O_CLOEXEC) != 0) {
        throw std::runtime_error("no pipe");
    }
    const platform::OwnedFd watch(ends[0]);
    const platform::OwnedFd passed(ends[1]);
    const auto connection = bench::ConnectTo(phone::kServicePath);
    bench::SendWithDescriptor(connection.get(), request, passed.get());
    const pid_t pid = fork();
    if (pid == 0) {
        Execute(program, listening);
    }
    const auto port = bench::ReceiveWithDescriptor(connection.get(), kCheckInReplySize);
    const double taken = bench::Now() - *MomentOfExec();
    kill(pid, SIGKILL);
    waitpid(pid, nullptr, 0);
    return taken;
}

void ColdStart() {
    bench::PinToOneCore();
    const auto listening = bench::ListenAt(phone::kServicePath);
    bench::BecomeEntitled();
    const std::string floor = phone::ProgramPath("bench-cold_start_floor");
    const auto compare = [&](const std::string& program) {
        return bench::Compare(kRepetitions,
                              {.floor = [&] { return Start(floor, listening.get()); },
                               .ours = [&] { return Start(program, listening.get()); }});
    };
    bench::Print("cold start, exec to first reply", compare(phone::DaemonPath()), "1.6", "1.3");
    const std::string dynamic = phone::ProgramPath("bench-cold_start_dynamic");
    bench::Print("of it: the floor with the C library loaded", compare(dynamic), "-", "-");
}

}  // namespace

int main() {
    return bench::Main(ColdStart);
}
