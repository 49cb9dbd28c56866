// What the benchmarks share: one core, one clock, medians, and the rows of the report.
#pragma once

#include <sys/types.h>

#include <functional>
#include <string>
#include <vector>

namespace bench {

/// Keeps this process, and what it starts from now on, on one core.
void PinToOneCore();

/// Seconds on a clock that never jumps.
[[nodiscard]] double Now();

[[nodiscard]] double Median(std::vector<double> values);

/// A child process that serves until this object goes.
class FloorServer {
public:
    explicit FloorServer(const std::function<void()>& serve);
    ~FloorServer();
    FloorServer(const FloorServer&) = delete;
    FloorServer& operator=(const FloorServer&) = delete;

private:
    const pid_t pid_;
};

/// What two ways of doing the same cost, measured in turns.
struct Comparison {
    double ratio = 0;  ///< the median of the ratios of neighbouring turns
    double floor = 0;  ///< medians, in seconds
    double ours = 0;
};

struct Turns {
    std::function<double()> floor;  ///< one repetition, in seconds
    std::function<double()> ours;
};

/// Neighbouring turns see the same machine, so their ratio forgives what else it is doing.
[[nodiscard]] Comparison Compare(int repetitions, const Turns& turns);

/// One row of the report.
struct Row {
    std::string what;
    std::string measured;
    std::string atMost;
    std::string reachFor;
    std::string ours{};
    std::string floor{};
};

void Print(const Row& row);
void Print(const std::string& what,
           const Comparison& comparison,
           const std::string& atMost,
           const std::string& reachFor);

[[nodiscard]] std::string Ratio(double value);
[[nodiscard]] std::string Microseconds(double seconds);
[[nodiscard]] std::string Megabytes(long kilobytes);

/// Runs a benchmark: what it could not measure ends the program with a line and status 1.
int Main(const std::function<void()>& benchmark);

}  // namespace bench
