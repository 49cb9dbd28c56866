#include <gtest/gtest.h>

#include <map>

#include "tests/attack/Attacker.h"
#include "tests/attack/Canary.h"
#include "tests/attack/Operations.h"
#include "tests/support/PhoneRoot.h"

namespace attack {
namespace {

constexpr int kOperations = 42'000 / kScale;
constexpr std::int32_t kLinkCarrierBundle = kFirstRoutineId + 9;
constexpr std::int32_t kCreateSymlink = kFirstRoutineId + 10;
constexpr std::int32_t kRemovePreferenceDomain = kFirstRoutineId + 11;

std::int32_t CallOne(const phone::Client& client, int number, const std::string& path) {
    switch (number % 3) {
        case 0:
            return client.callTexts(kLinkCarrierBundle, {"a link of the daemon's", path, ""});
        case 1:
            return client.callTexts(kCreateSymlink, {"a link of the daemon's", path});
        default:
            return client.callTexts(kRemovePreferenceDomain, {path, ""});
    }
}

TEST(DaemonUnderAttack, LeavesWhatIsNotTheMobileUsersAsItIs) {
    const Attacker attacker;
    const auto before = Snapshot::take();
    const std::array paths{AllowedLinkPaths(), PathsThroughSwappedPlaces(), AllowedCarrierPaths()};
    const phone::Daemon daemon;
    const auto client = phone::Client::checkIn();
    std::map<std::pair<int, std::int32_t>, int> answers;  // of a routine, with a code
    for (int i = 0; i < kOperations; ++i) {
        const auto& ofRoutine = paths[static_cast<std::size_t>(i % 3)];
        const auto& path = ofRoutine[static_cast<std::size_t>(i / 3) % ofRoutine.size()];
        ++answers[{i % 3, CallOne(client, i, path)}];
    }
    EXPECT_EQ(before.differencesTo(Snapshot::take()), std::vector<std::string>());
    for (int routine = 0; routine < 3; ++routine) {
        EXPECT_GT((answers[{routine, platform::KERN_SUCCESS}]), kOperations / 60) << routine;
        EXPECT_GT((answers[{routine, platform::KERN_FAILURE}]), kOperations / 300) << routine;
    }
    EXPECT_GT(attacker.swaps(), kOperations / 100);
}

}  // namespace
}  // namespace attack
