#include <gtest/gtest.h>

#include "tests/attack/Operations.h"

namespace attack {
namespace {

constexpr int kOperations = 60'000 / kScale;

TEST(PathAccessUnderAttack, LeavesWhatIsNotTheMobileUsersAsItIs) {
    const Outcome outcome = AttackPathAccess(kOperations);
    EXPECT_EQ(outcome.damage, std::vector<std::string>());
    EXPECT_EQ(outcome.sawCanary, 0);
    // It neither refuses everything nor goes through unattacked.
    EXPECT_GT(outcome.succeeded, kOperations / 10);
    EXPECT_GT(outcome.refused, kOperations / 100);
    EXPECT_GT(outcome.swaps, kOperations / 100);
}

}  // namespace
}  // namespace attack
