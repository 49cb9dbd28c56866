#include "platform/sim/Ports.h"
#include "platform/sim/Sim.h"
#include "tests/contract/Twin.h"

namespace twin {

void Reset() {
    sim::Reset();
}

void Spend(double seconds) {
    sim::Spend(seconds);
}

Pair MakePair() {
    auto pair = sim::MakeWatchPair();
    const int descriptor = sim::AddDescriptor(std::move(pair.passed));
    return {.descriptor = descriptor,
            .closeOther = [kept = std::move(pair.kept)]() mutable { kept.close(); }};
}

}  // namespace twin
