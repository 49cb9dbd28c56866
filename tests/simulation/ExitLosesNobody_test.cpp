// Clients that arrive at any instant around the idle exit are served: by the instance that leaves,
// or by the next one.
#include <gtest/gtest.h>

#include "Helper/Shared/Server/HelperServerUtils.h"
#include "Helper/Shared/Server/RequestProtocol.h"
#include "tests/simulation/PatientClient.h"
#include "tests/simulation/Seed.h"

using namespace platform;

namespace {

constexpr std::uint64_t kRounds = 10'000;

/// A first client's death at the first second has the helper leave here.
constexpr double kIdleExit = 11.0;

/// One instance from its start to its end.
void LiveOnce() {
    MobileHelperServer* const server = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
    ASSERT_NE(server, nullptr);
    EXPECT_EQ(MobileHelperServerRun(server), RunLoopResult::kStopped);
    EXPECT_TRUE(server->clients.empty());
    MobileHelperServerDestroy(server);
    sim::EndDaemon();
}

struct Outcome {
    int instances = 0;
    int connections = 0;
};

/// Anywhere in the microseconds around the exit, of which each platform call takes one; and now
/// and then, in a world where calls take no time, at the very instant of the exit.
double ArrivalAroundTheExit() {
    const bool isExact = sim::Random(5) == 0;
    sim::InterleaveAtCalls(!isExact);
    const double around = static_cast<double>(sim::Random(60'000)) * 1e-9 - 10e-6;
    return kIdleExit + (isExact ? 0 : around);
}

/// The second client arrives around the exit.
Outcome ArriveAround(std::uint64_t seed) {
    sim::Reset(seed);
    TestClient::entitleGroup();
    TestClient first(100);
    PatientClient second(101, kEntitledGroup);
    sim::At(0.5, [&] { first.sendCheckIn(); });
    sim::At(1.0, [&] { first.die(); });
    sim::At(ArrivalAroundTheExit(), [&] {
        second.checkIn([&](kern_return_t code) {
            EXPECT_EQ(code, KERN_SUCCESS);
            sim::In(0.01, [&] { second.die(); });
        });
    });
    Outcome outcome;
    while (!second.isAnswered() && !testing::Test::HasFailure()) {
        sim::RunOthersUntil([] { return sim::WaitingConnections(kServiceName) != 0; });
        LiveOnce();
        ++outcome.instances;
    }
    outcome.connections = second.connections();
    return outcome;
}

TEST(ExitLosesNobody, WhoeverArrivesAroundTheIdleExit) {
    int servedByTheLeaving = 0;
    int servedByTheNext = 0;
    int connectedAgain = 0;
    ForEachSeed(kRounds, [&](std::uint64_t seed) {
        const Outcome outcome = ArriveAround(seed);
        EXPECT_LE(outcome.instances, 2);
        (outcome.instances == 1 ? servedByTheLeaving : servedByTheNext) += 1;
        connectedAgain += outcome.connections > 1 ? 1 : 0;
    });
    if (SeedToReplay() == 0 && !HasFailure()) {
        // The window covers both sides of the exit, and its middle.
        EXPECT_GT(servedByTheLeaving, 100);
        EXPECT_GT(servedByTheNext, 100);
        EXPECT_GT(connectedAgain, 100);
    }
}

}  // namespace
