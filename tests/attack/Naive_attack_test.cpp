// Proof that the attack is one: it leads a path access that is not made against it elsewhere.
#include <gtest/gtest.h>

#include "tests/attack/Operations.h"

namespace attack {
namespace {

constexpr int kRoundsMax = 80;

TEST(NaivePathAccessUnderAttack, IsLedToWhatIsNotTheMobileUsers) {
    bool wasDamaged = false;
    bool sawCanary = false;
    // A race is won sooner or later: on a busy machine it takes some rounds.
    for (int round = 0; round < kRoundsMax && !(wasDamaged && sawCanary); ++round) {
        const Outcome outcome = AttackPathAccess(30'000 / kScale);
        wasDamaged |= !outcome.damage.empty();
        sawCanary |= outcome.sawCanary > 0;
    }
    EXPECT_TRUE(wasDamaged);
    EXPECT_TRUE(sawCanary);
}

TEST(NaiveFileManagerUnderAttack, IsLedToWhatIsNotTheMobileUsers) {
    bool isLedAstray = false;
    // Short rounds, and none after it was led astray: what it has destroyed by then, as root, nobody
    // can attack any more.
    constexpr int kShortRoundsMax = 1000;
    for (int round = 0; round < kShortRoundsMax && !isLedAstray; ++round) {
        const Outcome outcome = AttackFileManager(200);
        isLedAstray = !outcome.damage.empty() || outcome.sawCanary > 0;
    }
    EXPECT_TRUE(isLedAstray);
}

}  // namespace
}  // namespace attack
