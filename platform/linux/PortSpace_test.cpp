#include "platform/linux/PortSpace.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <set>

namespace platform {
namespace {

OwnedFd AnyDescriptor() {
    return OwnedFd(open("/dev/null", O_RDONLY | O_CLOEXEC));
}

mach_port_t SendRight(PortSpace& space) {
    mach_port_t name = MACH_PORT_NULL;
    EXPECT_EQ(space.addSendRight(OwnedFd(), &name), KERN_SUCCESS);
    return name;
}

mach_port_t ReceiveRight(PortSpace& space) {
    mach_port_t name = MACH_PORT_NULL;
    EXPECT_EQ(space.addReceiveRight(AnyDescriptor(), AnyDescriptor(), &name), KERN_SUCCESS);
    return name;
}

TEST(PortSpace, NamesAreNotReusedSoon) {
    PortSpace space;
    std::set<mach_port_t> names;
    for (int i = 0; i < 4000; ++i) {
        const auto name = SendRight(space);
        EXPECT_TRUE(MachPortIsValid(name));
        EXPECT_TRUE(names.insert(name).second) << i;
        ASSERT_EQ(space.dropSend(name), KERN_SUCCESS);
    }
}

TEST(PortSpace, ReleasingTwiceIsHarmless) {
    PortSpace space;
    const auto name = SendRight(space);
    const auto other = SendRight(space);
    EXPECT_EQ(space.dropSend(name), KERN_SUCCESS);
    EXPECT_EQ(space.dropSend(name), KERN_INVALID_NAME);
    EXPECT_EQ(space.dropReceive(name), KERN_INVALID_NAME);
    EXPECT_EQ(space.dropSend(other), KERN_SUCCESS);
}

TEST(PortSpace, ANameOfAnotherGenerationIsNotThePort) {
    PortSpace space;
    const auto old = ReceiveRight(space);
    ASSERT_EQ(space.dropReceive(old), KERN_SUCCESS);
    for (int i = 0; i < 100; ++i) {
        ReceiveRight(space);
    }
    EXPECT_EQ(space.receiveSocket(old), -1);
    EXPECT_EQ(space.makeSend(old), KERN_INVALID_NAME);
}

TEST(PortSpace, NamesThatStandForNoPortAreInvalid) {
    PortSpace space;
    for (const mach_port_t name : {MACH_PORT_NULL, MACH_PORT_DEAD, 1U << 20, 77U}) {
        EXPECT_EQ(space.dropSend(name), KERN_INVALID_NAME) << name;
        EXPECT_EQ(space.dropReceive(name), KERN_INVALID_NAME) << name;
        EXPECT_EQ(space.makeSend(name), KERN_INVALID_NAME) << name;
        EXPECT_EQ(space.sendSocket(name), -1) << name;
        EXPECT_FALSE(space.takePeer(name).isOpen()) << name;
    }
}

TEST(PortSpace, ARightThatIsNotThereCannotBeDropped) {
    PortSpace space;
    const auto send = SendRight(space);
    EXPECT_EQ(space.dropReceive(send), KERN_INVALID_RIGHT);
    EXPECT_EQ(space.makeSend(send), KERN_INVALID_RIGHT);
    const auto receive = ReceiveRight(space);
    EXPECT_EQ(space.dropSend(receive), KERN_INVALID_RIGHT);
    EXPECT_EQ(space.sendSocket(receive), -1);
}

TEST(PortSpace, ANameLivesAsLongAsItsLastRight) {
    PortSpace space;
    const auto name = ReceiveRight(space);
    ASSERT_EQ(space.makeSend(name), KERN_SUCCESS);
    EXPECT_EQ(space.dropReceive(name), KERN_SUCCESS);
    EXPECT_EQ(space.receiveSocket(name), -1);
    EXPECT_EQ(space.dropSend(name), KERN_SUCCESS);
    EXPECT_EQ(space.dropSend(name), KERN_INVALID_NAME);
}

TEST(PortSpace, DroppingTheReceiveRightClosesBothEnds) {
    PortSpace space;
    OwnedFd receive = AnyDescriptor();
    OwnedFd peer = AnyDescriptor();
    const int numbers[] = {receive.get(), peer.get()};
    mach_port_t name = MACH_PORT_NULL;
    ASSERT_EQ(space.addReceiveRight(std::move(receive), std::move(peer), &name), KERN_SUCCESS);
    ASSERT_EQ(space.dropReceive(name), KERN_SUCCESS);
    EXPECT_EQ(fcntl(numbers[0], F_GETFD), -1);
    EXPECT_EQ(fcntl(numbers[1], F_GETFD), -1);
}

TEST(PortSpace, ThePeersEndLeavesOnce) {
    PortSpace space;
    const auto name = ReceiveRight(space);
    EXPECT_TRUE(space.takePeer(name).isOpen());
    EXPECT_FALSE(space.takePeer(name).isOpen());
    EXPECT_GE(space.receiveSocket(name), 0);
}

TEST(PortSpace, ASilencedPortKeepsItsRight) {
    PortSpace space;
    const auto name = ReceiveRight(space);
    space.silence(name);
    EXPECT_EQ(space.receiveSocket(name), -1);
    EXPECT_EQ(space.dropReceive(name), KERN_SUCCESS);
    space.silence(name);
}

TEST(PortSpace, RunsOutOfNamesWithAnErrorAndGoesOnWhenOneIsFree) {
    PortSpace space;
    mach_port_t name = MACH_PORT_NULL;
    mach_port_t last = MACH_PORT_NULL;
    std::size_t count = 0;
    for (; count <= 1U << 20 && space.addSendRight(OwnedFd(), &name) == KERN_SUCCESS; ++count) {
        last = name;
    }
    EXPECT_GT(count, 1'000'000U);
    EXPECT_EQ(space.addSendRight(OwnedFd(), &name), KERN_RESOURCE_SHORTAGE);
    ASSERT_EQ(space.dropSend(last), KERN_SUCCESS);
    EXPECT_EQ(space.addSendRight(OwnedFd(), &name), KERN_SUCCESS);
}

}  // namespace
}  // namespace platform
