#include "handlers/carrier/MobileUser.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include "platform/sim/Sim.h"

namespace {

TEST(MobileUser, IsTheUserNamedMobile) {
    EXPECT_STREQ(_GetMobileUserDirectory(), "/var/mobile");
    EXPECT_EQ(_GetMobileUserUID(), 501U);
    EXPECT_EQ(_GetMobileUserGID(), 501U);
}

TEST(MobileUser, HasItsHomeFromTheStartOfTheProcess) {
    EXPECT_EQ(MobileUserHome, "/var/mobile");
}

TEST(MobileUser, IsLookedUpOnce) {
    const char* const directory = _GetMobileUserDirectory();
    sim::SetUser("mobile", 777, 778, "/elsewhere");
    EXPECT_EQ(_GetMobileUserDirectory(), directory);
    EXPECT_EQ(_GetMobileUserUID(), 501U);
    EXPECT_EQ(_GetMobileUserGID(), 501U);
    sim::Reset();
}

TEST(MobileUserDeathTest, WithoutAHomeKeepsTheProcessFromStarting) {
    EXPECT_EXIT(execl(MOBILE_USER_WITHOUT_HOME, "without-home", "home", nullptr),
                testing::ExitedWithCode(1),
                "unable to find the home directory of user mobile");
}

}  // namespace
