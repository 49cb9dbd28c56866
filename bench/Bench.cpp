#include "bench/Bench.h"

#include <sched.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <cstdio>
#include <ctime>
#include <stdexcept>

namespace bench {
namespace {

std::string Format(const char* format, double value) {
    std::array<char, 64> text{};
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
    (void)std::snprintf(text.data(), text.size(), format, value);  // always fits
#pragma GCC diagnostic pop
    return text.data();
}

pid_t StartServer(const std::function<void()>& serve) {
    const pid_t pid = fork();
    if (pid == 0) {
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        serve();
        _exit(0);
    }
    return pid;
}

}  // namespace

void PinToOneCore() {
    cpu_set_t cores;
    CPU_ZERO(&cores);
    CPU_SET(sched_getcpu(), &cores);
    if (sched_setaffinity(0, sizeof cores, &cores) != 0) {
        throw std::runtime_error("cannot stay on one core");
    }
}

double Now() {
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

double Median(std::vector<double> values) {
    const auto middle = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
    std::nth_element(values.begin(), middle, values.end());
    return *middle;
}

FloorServer::FloorServer(const std::function<void()>& serve) : pid_(StartServer(serve)) {
    if (pid_ < 0) {
        throw std::runtime_error("cannot start the floor server");
    }
}

FloorServer::~FloorServer() {
    kill(pid_, SIGKILL);
    waitpid(pid_, nullptr, 0);
}

Comparison Compare(int repetitions, const Turns& turns) {
    (void)turns.floor();  // the first of each warms up
    (void)turns.ours();
    std::vector<double> ratios;
    std::vector<double> floors;
    std::vector<double> ours;
    for (int i = 0; i < repetitions; ++i) {
        floors.push_back(turns.floor());
        ours.push_back(turns.ours());
        ratios.push_back(ours.back() / floors.back());
    }
    return {.ratio = Median(ratios), .floor = Median(floors), .ours = Median(ours)};
}

void Print(const Row& row) {
    std::printf("%-50s %10s %9s %9s %12s %12s\n",
                row.what.c_str(),
                row.measured.c_str(),
                row.atMost.c_str(),
                row.reachFor.c_str(),
                row.ours.c_str(),
                row.floor.c_str());
    (void)std::fflush(stdout);
}

void Print(const std::string& what,
           const Comparison& comparison,
           const std::string& atMost,
           const std::string& reachFor) {
    Print({.what = what,
           .measured = Ratio(comparison.ratio),
           .atMost = atMost,
           .reachFor = reachFor,
           .ours = Microseconds(comparison.ours),
           .floor = Microseconds(comparison.floor)});
}

std::string Ratio(double value) {
    return Format("%.3f", value);
}

std::string Microseconds(double seconds) {
    return Format("%.2f us", seconds * 1e6);
}

std::string Megabytes(long kilobytes) {
    return Format("%.2f MB", static_cast<double>(kilobytes) / 1024);
}

int Main(const std::function<void()>& benchmark) {
    try {
        benchmark();
        return 0;
    } catch (const std::exception& error) {
        (void)std::fprintf(stderr, "could not measure: %s\n", error.what());
        return 1;
    }
}

}  // namespace bench
