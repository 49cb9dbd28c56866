#include "tools/linefold-sim/ChildProcess.h"

#include <fcntl.h>
#include <sched.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdio>

#include "platform/linux/OwnedFd.h"

namespace simulator {
namespace {

constexpr int kNotFound = 127;

[[noreturn]] void Execute(const std::vector<std::string>& command) {
    std::vector<char*> words;
    for (const auto& word : command) {
        words.push_back(const_cast<char*>(word.c_str()));  // execvp changes none of them
    }
    words.push_back(nullptr);
    execvp(words[0], words.data());
    std::perror(words[0]);
    _exit(kNotFound);
}

bool EnterGateway() {
    const platform::OwnedFd space(open("/run/netns/gateway", O_RDONLY | O_CLOEXEC));
    return setns(space.get(), CLONE_NEWNET) == 0;
}

std::string ReadAll(int descriptor) {
    std::string text;
    std::array<char, 4096> part{};
    for (ssize_t size = 1; size > 0;) {
        size = read(descriptor, part.data(), part.size());
        text.append(part.data(), size > 0 ? static_cast<std::size_t>(size) : 0);
    }
    return text;
}

}  // namespace

bool Run(const std::vector<std::string>& command) {
    std::array<int, 2> ends{-1, -1};
    if (pipe2(ends.data(), O_CLOEXEC) != 0) {
        return false;
    }
    const platform::OwnedFd out(ends[0]);
    platform::OwnedFd in(ends[1]);
    const pid_t child = fork();
    if (child == 0) {
        dup2(in.get(), STDOUT_FILENO);
        dup2(in.get(), STDERR_FILENO);
        Execute(command);
    }
    in.reset();
    const std::string said = ReadAll(out.get());
    int status = -1;
    const bool isDone = child > 0 && waitpid(child, &status, 0) == child && status == 0;
    if (!isDone) {
        (void)std::fwrite(said.data(), 1, said.size(), stderr);
    }
    return isDone;
}

pid_t Start(const std::vector<std::string>& command, Space space) {
    const pid_t parent = getpid();
    const pid_t child = fork();
    if (child == 0) {
        sigset_t none;
        sigemptyset(&none);
        sigprocmask(SIG_SETMASK, &none, nullptr);
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        // Our end may have come before it was asked to be told of it.
        if (getppid() != parent || (space == Space::kGateway && !EnterGateway())) {
            _exit(kNotFound);
        }
        Execute(command);
    }
    return child;
}

}  // namespace simulator
