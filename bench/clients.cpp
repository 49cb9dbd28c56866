// What a client costs: memory of the daemon's own, and the time of the others.
#include <sys/resource.h>

#include <algorithm>
#include <vector>

#include "bench/Bench.h"
#include "bench/Wire.h"

namespace {

constexpr int kRepetitions = 41;
constexpr int kRequests = 8'000;
constexpr std::size_t kWantedClients = 4'000;
constexpr rlim_t kDescriptorsKept = 128;

/// Two descriptors a client, on both sides.
std::size_t ClientsWithinLimit() {
    rlimit limit{};
    getrlimit(RLIMIT_NOFILE, &limit);
    limit.rlim_cur = limit.rlim_max;
    setrlimit(RLIMIT_NOFILE, &limit);
    return std::min<std::size_t>(kWantedClients, (limit.rlim_cur - kDescriptorsKept) / 2);
}

void Clients() {
    bench::PinToOneCore();
    const std::size_t count = ClientsWithinLimit();
    const phone::Daemon lonely;
    bench::BecomeEntitled();
    const auto alone = bench::CheckIn();
    if (setegid(0) != 0) {
        throw std::runtime_error("cannot be root's again");
    }
    const phone::Daemon crowded;  // its socket takes the other one's place at the path
    bench::BecomeEntitled();
    const auto one = bench::CheckIn();
    const auto privateMemory = [&] {
        return bench::ProcessNumber(crowded.pid(), "smaps_rollup", "Anonymous:");
    };
    const long before = privateMemory();
    std::vector<bench::CheckedIn> idle;
    idle.reserve(count);
    while (idle.size() < count) {
        idle.push_back(bench::CheckIn());
    }
    const double perClient =
        static_cast<double>(privateMemory() - before) * 1024 / static_cast<double>(count);
    bench::Print({.what = "user memory a client, over " + std::to_string(count),
                  .measured = std::to_string(static_cast<long>(perClient)) + " B",
                  .atMost = "256 B",
                  .reachFor = "128 B"});
    const auto timeOne = [](const bench::CheckedIn& client) {
        return bench::TimeRequests(client.privatePort.get(), kRequests, 1);
    };
    const auto comparison = bench::Compare(
        kRepetitions,
        {.floor = [&] { return timeOne(alone); }, .ours = [&] { return timeOne(one); }});
    bench::Print(
        "one client beside " + std::to_string(count) + " idle ones", comparison, "1.10", "1.03");
}

}  // namespace

int main() {
    return bench::Main(Clients);
}
