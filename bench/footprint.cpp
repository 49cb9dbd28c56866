// What the daemon costs while it does nothing: memory, and wake-ups.
#include <unistd.h>

#include <string>

#include "bench/Bench.h"
#include "bench/Wire.h"

namespace {

constexpr unsigned kIdleSeconds = 5;

long WakeUps(pid_t pid) {
    return bench::ProcessNumber(pid, "status", "voluntary_ctxt_switches:") +
           bench::ProcessNumber(pid, "status", "nonvoluntary_ctxt_switches:");
}

long WakeUpsWhileIdle(pid_t pid) {
    usleep(100'000);  // what the last request left to do is done
    const long before = WakeUps(pid);
    sleep(kIdleSeconds);
    return WakeUps(pid) - before;
}

void PrintMemory(const phone::Daemon& daemon) {
    const auto ofMemory = [&](std::string_view name) {
        return bench::ProcessNumber(daemon.pid(), "smaps_rollup", name);
    };
    bench::Print({.what = "idle: resident memory",
                  .measured = bench::Megabytes(ofMemory("Rss:")),
                  .atMost = "2 MB",
                  .reachFor = "1.5 MB"});
    // Not what the kernel calls private: that counts a file's pages that nobody else maps just now.
    const long anonymous = ofMemory("Anonymous:");
    bench::Print({.what = "idle: private memory",
                  .measured = bench::Megabytes(anonymous),
                  .atMost = "0.5 MB",
                  .reachFor = "0.3 MB"});
    const long ofFiles = ofMemory("Private_Clean:") + ofMemory("Private_Dirty:") - anonymous;
    bench::Print({.what = "idle: pages of files that nobody else maps now",
                  .measured = bench::Megabytes(ofFiles),
                  .atMost = "-",
                  .reachFor = "-"});
}

void Footprint() {
    const phone::Daemon daemon;
    bench::BecomeEntitled();
    {
        const auto client = bench::CheckIn();
        (void)bench::TimeRequests(client.privatePort.get(), 100, 1);
        bench::Print({.what = "wake-ups in 5 s, one client connected",
                      .measured = std::to_string(WakeUpsWhileIdle(daemon.pid())),
                      .atMost = "0",
                      .reachFor = "0"});
    }
    bench::Print({.what = "wake-ups in 5 s, nobody connected",
                  .measured = std::to_string(WakeUpsWhileIdle(daemon.pid())),
                  .atMost = "0",
                  .reachFor = "0"});
    PrintMemory(daemon);
}

}  // namespace

int main() {
    return bench::Main(Footprint);
}
