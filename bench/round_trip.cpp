// One request and its reply: the daemon against two processes that do nothing else.
#include <sys/socket.h>

#include <array>
#include <stdexcept>

#include "bench/Bench.h"
#include "bench/Wire.h"

namespace {

constexpr int kRepetitions = 41;
constexpr int kRequests = 8'000;
constexpr int kManyOutstanding = 16;

void RoundTrip() {
    bench::PinToOneCore();
    std::array<int, 2> ends{-1, -1};
    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()) != 0) {
        throw std::runtime_error("no pair of sockets");
    }
    const platform::OwnedFd client(ends[0]);
    platform::OwnedFd server(ends[1]);
    const bench::FloorServer floor([&server] { bench::ServeBlocking(server.get()); });
    server.reset();
    const phone::Daemon daemon;
    bench::BecomeEntitled();
    const auto checkedIn = bench::CheckIn();
    const auto compare = [&](int outstanding) {
        return bench::Compare(
            kRepetitions,
            {.floor = [&] { return bench::TimeRequests(client.get(), kRequests, outstanding); },
             .ours =
                 [&] {
                     return bench::TimeRequests(
                         checkedIn.privatePort.get(), kRequests, outstanding);
                 }});
    };
    bench::Print("round trip, 288-byte request", compare(1), "1.20", "1.12");
    bench::Print("the same with 16 outstanding", compare(kManyOutstanding), "1.25", "1.10");
}

}  // namespace

int main() {
    return bench::Main(RoundTrip);
}
