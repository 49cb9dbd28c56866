#include "Helper/Shared/Server/ServerPortTable.h"

#include <gtest/gtest.h>

#include "Helper/Shared/Server/HelperServerUtils.h"

namespace {

class PortTable : public testing::Test {
protected:
    PortTable() { ServerPortTableCreate(); }

    MobileHelperServer first;
    MobileHelperServer second;
};

TEST_F(PortTable, KnowsNoServerForAPortOfNobody) {
    EXPECT_EQ(ServerForPort(0x99), nullptr);
    EXPECT_EQ(ServerForPort(platform::MACH_PORT_NULL), nullptr);
    EXPECT_EQ(ServerForPort(platform::MACH_PORT_DEAD), nullptr);
}

TEST_F(PortTable, KnowsTheServerOfEachPort) {
    ServerPortTableAdd(0x11, &first);
    ServerPortTableAdd(0x12, &second);
    EXPECT_EQ(ServerForPort(0x11), &first);
    EXPECT_EQ(ServerForPort(0x12), &second);
    ServerPortTableRemove(0x11);
    EXPECT_EQ(ServerForPort(0x11), nullptr);
    EXPECT_EQ(ServerForPort(0x12), &second);
    ServerPortTableRemove(0x12);
}

TEST_F(PortTable, IsMadeOnce) {
    ServerPortTableAdd(0x13, &first);
    ServerPortTableCreate();
    EXPECT_EQ(ServerForPort(0x13), &first);
    ServerPortTableRemove(0x13);
    ServerPortTableRemove(0x13);
    EXPECT_EQ(ServerForPort(0x13), nullptr);
}

}  // namespace
