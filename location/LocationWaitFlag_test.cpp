#include "location/LocationWaitFlag.h"

#include <atomic>
#include <thread>

#include "location/Location_test.h"

namespace {

class LocationWaitFlag : public LocationTest {};

TEST_F(LocationWaitFlag, IsTakenOnceForEachTimeItIsSet) {
    EXPECT_FALSE(LocationWaitFlagTake());
    LocationWaitFlagSet();
    EXPECT_TRUE(LocationWaitFlagTake());
    EXPECT_FALSE(LocationWaitFlagTake());
}

TEST_F(LocationWaitFlag, SetTwiceIsTakenOnce) {
    LocationWaitFlagSet();
    LocationWaitFlagSet();
    EXPECT_TRUE(LocationWaitFlagTake());
    EXPECT_FALSE(LocationWaitFlagTake());
}

TEST_F(LocationWaitFlag, IsTakenByOneOfTwoThreads) {
    for (int round = 0; round < 200; ++round) {
        LocationWaitFlagSet();
        std::atomic<int> taken = 0;
        const auto take = [&taken] { taken += LocationWaitFlagTake() ? 1 : 0; };
        std::thread other(take);
        take();
        other.join();
        ASSERT_EQ(taken, 1);
    }
}

}  // namespace
