#include "platform/UserDatabase.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

TEST(UserDatabase, KnowsTheMobileUser) {
    const auto record = UserRecordByName("mobile");
    ASSERT_TRUE(record.has_value());
    EXPECT_EQ(record->uid, 501U);
    EXPECT_EQ(record->gid, 501U);
    EXPECT_EQ(CopyHomeDirectoryForUser("mobile"), "/var/mobile");
}

TEST(UserDatabase, KnowsNothingOfAnUnknownUser) {
    for (const char* name : {"", "no-such-user", "501"}) {
        EXPECT_FALSE(UserRecordByName(name).has_value()) << name;
        EXPECT_FALSE(CopyHomeDirectoryForUser(name).has_value()) << name;
    }
}

TEST(UserDatabase, KnowsGroups) {
    EXPECT_EQ(GroupIdByName("mobile"), 501U);
    EXPECT_EQ(GroupIdByName("root"), 0U);
    for (const char* name : {"", "no-such-group", "501"}) {
        EXPECT_FALSE(GroupIdByName(name).has_value()) << name;
    }
}

}  // namespace
}  // namespace platform
