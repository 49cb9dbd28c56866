#include <gtest/gtest.h>

#include "tests/attack/Operations.h"

namespace attack {
namespace {

constexpr int kRounds = 6;
constexpr int kOperations = 4000 / kScale;

// In rounds, since the home grows with what is copied into it.
TEST(FileManagerUnderAttack, LeavesWhatIsNotTheMobileUsersAsItIs) {
    for (int round = 0; round < kRounds; ++round) {
        const Outcome outcome = AttackFileManager(kOperations);
        EXPECT_EQ(outcome.damage, std::vector<std::string>());
        EXPECT_EQ(outcome.sawCanary, 0);
        // It neither refuses everything nor goes through unattacked.
        EXPECT_GT(outcome.succeeded, kOperations / 10);
        EXPECT_GT(outcome.refused, kOperations / 200);
        EXPECT_GT(outcome.swaps, kOperations / 100);
    }
}

}  // namespace
}  // namespace attack
