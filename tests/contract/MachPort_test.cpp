#include "platform/MachPort.h"

#include <gtest/gtest.h>

#include <set>

#include "platform/MachCarriage.h"
#include "platform/RunLoop.h"
#include "tests/contract/Twin.h"

using namespace platform;

namespace {

class MachPortContract : public testing::Test {
protected:
    MachPortContract() { twin::Reset(); }

    static mach_port_t allocate() {
        mach_port_t name = MACH_PORT_NULL;
        EXPECT_EQ(mach_port_allocate(MachPortRight::kReceive, &name), KERN_SUCCESS);
        return name;
    }

    static kern_return_t dropReceive(mach_port_t name) {
        return mach_port_mod_refs(name, MachPortRight::kReceive, -1);
    }
};

TEST_F(MachPortContract, AllocatesAReceiveRight) {
    const mach_port_t name = allocate();
    EXPECT_TRUE(MachPortIsValid(name));
    EXPECT_EQ(dropReceive(name), KERN_SUCCESS);
}

TEST_F(MachPortContract, AllocatesNoOtherRight) {
    mach_port_t name = 0x77;
    EXPECT_EQ(mach_port_allocate(MachPortRight::kSend, &name), KERN_INVALID_ARGUMENT);
    EXPECT_EQ(name, 0x77U);
}

TEST_F(MachPortContract, ForgetsANameWithItsLastRight) {
    const mach_port_t name = allocate();
    EXPECT_EQ(mach_port_insert_right(name, MachMsgType::kMakeSend), KERN_SUCCESS);
    EXPECT_EQ(dropReceive(name), KERN_SUCCESS);
    EXPECT_EQ(dropReceive(name), KERN_INVALID_RIGHT);
    EXPECT_EQ(mach_port_deallocate(name), KERN_SUCCESS);
    EXPECT_EQ(mach_port_deallocate(name), KERN_INVALID_NAME);
    EXPECT_EQ(dropReceive(name), KERN_INVALID_NAME);
}

TEST_F(MachPortContract, HasReleasingTwiceHarmless) {
    const mach_port_t name = allocate();
    EXPECT_EQ(dropReceive(name), KERN_SUCCESS);
    const mach_port_t other = allocate();
    EXPECT_EQ(dropReceive(name), KERN_INVALID_NAME);
    EXPECT_EQ(mach_port_deallocate(name), KERN_INVALID_NAME);
    EXPECT_EQ(dropReceive(other), KERN_SUCCESS);
}

TEST_F(MachPortContract, CountsSendRights) {
    const mach_port_t name = allocate();
    EXPECT_EQ(mach_port_deallocate(name), KERN_INVALID_RIGHT);
    EXPECT_EQ(mach_port_insert_right(name, MachMsgType::kMakeSend), KERN_SUCCESS);
    EXPECT_EQ(mach_port_insert_right(name, MachMsgType::kMakeSend), KERN_SUCCESS);
    EXPECT_EQ(mach_port_deallocate(name), KERN_SUCCESS);
    EXPECT_EQ(mach_port_mod_refs(name, MachPortRight::kSend, -1), KERN_SUCCESS);
    EXPECT_EQ(mach_port_deallocate(name), KERN_INVALID_RIGHT);
    EXPECT_EQ(dropReceive(name), KERN_SUCCESS);
}

TEST_F(MachPortContract, DropsRightsOnly) {
    const mach_port_t name = allocate();
    EXPECT_EQ(mach_port_mod_refs(name, MachPortRight::kReceive, 0), KERN_INVALID_ARGUMENT);
    EXPECT_EQ(mach_port_mod_refs(name, MachPortRight::kReceive, 1), KERN_INVALID_ARGUMENT);
    EXPECT_EQ(mach_port_mod_refs(name, MachPortRight::kSend, -1), KERN_INVALID_RIGHT);
    EXPECT_EQ(dropReceive(name), KERN_SUCCESS);
}

TEST_F(MachPortContract, MakesSendRightsOfOwnPortsOnly) {
    EXPECT_EQ(mach_port_insert_right(MACH_PORT_NULL, MachMsgType::kMakeSend), KERN_INVALID_NAME);
    EXPECT_EQ(mach_port_insert_right(MACH_PORT_DEAD, MachMsgType::kMakeSend), KERN_INVALID_NAME);
    const mach_port_t name = allocate();
    EXPECT_EQ(mach_port_insert_right(name, MachMsgType::kCopySend), KERN_INVALID_ARGUMENT);
    EXPECT_EQ(mach_port_insert_right(name, MachMsgType::kMoveSend), KERN_INVALID_ARGUMENT);
    EXPECT_EQ(dropReceive(name), KERN_SUCCESS);
    EXPECT_EQ(mach_port_insert_right(name, MachMsgType::kMakeSend), KERN_INVALID_NAME);
}

TEST_F(MachPortContract, GivesNoNameToNobody) {
    for (const mach_port_t name : {MACH_PORT_NULL, MACH_PORT_DEAD, mach_port_t{0x7FFFFFF1}}) {
        EXPECT_EQ(mach_port_deallocate(name), KERN_INVALID_NAME);
        EXPECT_EQ(dropReceive(name), KERN_INVALID_NAME);
        EXPECT_EQ(MachPort::create(name, nullptr), nullptr);
        EXPECT_EQ(MachPortCreateRunLoopSource(name, nullptr, nullptr), nullptr);
    }
}

TEST_F(MachPortContract, DoesNotReuseANameSoon) {
    std::set<mach_port_t> names;
    for (int i = 0; i < 1000; ++i) {
        const mach_port_t name = allocate();
        EXPECT_TRUE(names.insert(name).second);
        EXPECT_EQ(dropReceive(name), KERN_SUCCESS);
    }
}

// Watching.

struct Deaths {
    int count = 0;
    mach_port_t port = MACH_PORT_NULL;
    bool wasValid = true;
};

void NoteDeath(MachPort& port, void* info) {
    auto& deaths = *static_cast<Deaths*>(info);
    ++deaths.count;
    deaths.port = port.port();
    deaths.wasValid = port.isValid();
}

class WatchedPortContract : public MachPortContract {
protected:
    WatchedPortContract() {
        EXPECT_EQ(AdoptPortDescriptor(pair.descriptor, &name), KERN_SUCCESS);
        port = MachPort::create(name, &deaths);
    }

    ~WatchedPortContract() override {
        port->setInvalidationCallBack(nullptr);
        port->invalidate();
        mach_port_deallocate(name);
    }

    static RunLoopResult serve() { return RunLoop::current().run(0.02, AfterSource::kGoOn); }

    twin::Pair pair = twin::MakePair();
    mach_port_t name = MACH_PORT_NULL;
    Deaths deaths;
    std::shared_ptr<MachPort> port;
};

TEST_F(WatchedPortContract, KnowsItsNameAndItsInfo) {
    ASSERT_NE(port, nullptr);
    EXPECT_EQ(port->port(), name);
    EXPECT_EQ(port->info(), &deaths);
    EXPECT_TRUE(port->isValid());
    pair.closeOther();
}

TEST_F(WatchedPortContract, CallsBackOnceWhenTheOtherSideIsGone) {
    port->setInvalidationCallBack(NoteDeath);
    EXPECT_EQ(serve(), RunLoopResult::kTimedOut);
    EXPECT_EQ(deaths.count, 0);
    pair.closeOther();
    (void)serve();
    (void)serve();
    EXPECT_EQ(deaths.count, 1);
    EXPECT_EQ(deaths.port, name);
    EXPECT_FALSE(deaths.wasValid);
}

TEST_F(WatchedPortContract, CallsBackAtOnceWhenTheOtherSideIsGoneAlready) {
    pair.closeOther();
    port->setInvalidationCallBack(NoteDeath);
    EXPECT_EQ(deaths.count, 1);
    EXPECT_FALSE(port->isValid());
    (void)serve();
    EXPECT_EQ(deaths.count, 1);
}

TEST_F(WatchedPortContract, CallsBackBeforeAnInvalidationReturns) {
    port->setInvalidationCallBack(NoteDeath);
    port->invalidate();
    EXPECT_EQ(deaths.count, 1);
    port->invalidate();
    EXPECT_EQ(deaths.count, 1);
    pair.closeOther();
    (void)serve();
    EXPECT_EQ(deaths.count, 1);
}

TEST_F(WatchedPortContract, CallsNobodyWhoseCallBackWasCleared) {
    port->setInvalidationCallBack(NoteDeath);
    port->setInvalidationCallBack(nullptr);
    pair.closeOther();
    (void)serve();
    EXPECT_EQ(deaths.count, 0);
    EXPECT_FALSE(port->isValid());
}

TEST_F(WatchedPortContract, LeavesTheRightWithItsOwner) {
    port->invalidate();
    EXPECT_EQ(mach_port_deallocate(name), KERN_SUCCESS);
    EXPECT_EQ(mach_port_deallocate(name), KERN_INVALID_NAME);
    pair.closeOther();
}

TEST_F(WatchedPortContract, IsNoPortToReceiveOn) {
    EXPECT_EQ(MachPortCreateRunLoopSource(name, nullptr, nullptr), nullptr);
    EXPECT_EQ(mach_port_insert_right(name, MachMsgType::kMakeSend), KERN_INVALID_RIGHT);
    EXPECT_EQ(dropReceive(name), KERN_INVALID_RIGHT);
    pair.closeOther();
}

}  // namespace
