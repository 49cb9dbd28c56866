// Lives of the helper with handlers that only hold: work goes on behind the clients' backs.
#include <gtest/gtest.h>

#include "Helper/Shared/Server/HelperServerUtils.h"
#include "platform/SerialQueue.h"
#include "tests/simulation/HelperWorld.h"
#include "tests/simulation/Seed.h"
#include "tests/support/RecordingHandlers.h"

using namespace platform;

namespace {

constexpr std::uint64_t kRounds = 4000;

HelperWorld::Happenings happened;
int heldWork = 0;

class HoldingWorld final : public HelperWorld {
public:
    explicit HoldingWorld(std::uint64_t seed) : HelperWorld(seed, {}, happened) {
        recording::Reset();
        recording::NextAnswer().meanwhile = [this](const recording::Call& call) { work(call); };
    }

    ~HoldingWorld() override { recording::Reset(); }

private:
    Question nextQuestion() override {
        switch (sim::Random(6)) {
            case 0:
                return {messages::Request(2), KERN_SUCCESS};
            case 1:
                return {messages::Request(13), KERN_SUCCESS};
            case 2:
                return {messages::Request(14), KERN_SUCCESS};
            case 3:
                return {messages::SetPreference("domain", "key", "value"), KERN_SUCCESS};
            case 4:
                return {messages::Message(8683549, 287), MIG_BAD_ARGUMENTS};
            default:
                return {messages::Message(8683573, 24), MIG_BAD_ID};
        }
    }

    /// Routines 13 and 14 go on working with a hold after they have answered.
    void work(const recording::Call& call) {
        if (call.number != 13 && call.number != 14) {
            return;
        }
        MobileHelperServer* const holder = ServerForPort(call.port);
        const auto token = ServerHoldAcquire(holder);
        ++heldWork;
        const SerialQueue queue(call.number == 13 ? "com.vendra.otaheartbeat" : "LASDUpdater");
        queue.after(randomSeconds(15.0),
                    [holder, token] { EXPECT_TRUE(ServerHoldRelease(holder, token)); });
    }
};

TEST(HelperLife, KeepsItsPromisesInRandomWorlds) {
    happened = {};
    heldWork = 0;
    ForEachSeed(kRounds, [](std::uint64_t seed) { HoldingWorld(seed).live(); });
    if (SeedToReplay() == 0 && !HasFailure()) {
        constexpr int kRoundsMade = static_cast<int>(kRounds);
        EXPECT_GT(happened.instances, kRoundsMade);
        EXPECT_GT(happened.idleExits, kRoundsMade);
        EXPECT_GT(happened.answers, kRoundsMade);
        EXPECT_GT(happened.refusals, 0);
        EXPECT_GT(heldWork, kRoundsMade);
        EXPECT_GT(happened.deadOnArrival, 0);
        EXPECT_GT(happened.connectedAgain, 0);
    }
}

}  // namespace
