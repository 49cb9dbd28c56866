// A check-in, from connecting to the private port and away again, against the least that a
// connection with one request can be.
#include <sys/socket.h>

#include "bench/Bench.h"
#include "bench/Wire.h"

namespace {

constexpr int kRepetitions = 41;
constexpr int kCheckIns = 500;
constexpr const char* kFloorPath = "/run/linefold/floor";

void ServeConnections(int listening) {
    const phone::Bytes reply(kCheckInReplySize);
    for (;;) {
        const platform::OwnedFd socket(accept4(listening, nullptr, nullptr, SOCK_CLOEXEC));
        bench::Receive(socket.get(), kCheckInRequestSize);
        bench::Send(socket.get(), reply);
    }
}

template <typename Once>
double TimeEach(const Once& once) {
    const double start = bench::Now();
    for (int i = 0; i < kCheckIns; ++i) {
        once();
    }
    return (bench::Now() - start) / kCheckIns;
}

void ConnectAndAsk() {
    static const phone::Bytes request(kCheckInRequestSize);
    const auto socket = bench::ConnectTo(kFloorPath);
    bench::Send(socket.get(), request);
    bench::Receive(socket.get(), kCheckInReplySize);
}

void CheckIn() {
    bench::PinToOneCore();
    const phone::Daemon daemon;
    const auto listening = bench::ListenAt(kFloorPath);
    const bench::FloorServer floor([&listening] { ServeConnections(listening.get()); });
    bench::BecomeEntitled();
    // One client stays throughout, so that the idle timer has no part in it.
    const auto staying = bench::CheckIn();
    const auto comparison =
        bench::Compare(kRepetitions,
                       {.floor = [] { return TimeEach(ConnectAndAsk); },
                        .ours = [] { return TimeEach([] { (void)bench::CheckIn(); }); }});
    bench::Print("check-in, entitlement cached, private port, watch", comparison, "2.4", "2.1");
}

}  // namespace

int main() {
    return bench::Main(CheckIn);
}
