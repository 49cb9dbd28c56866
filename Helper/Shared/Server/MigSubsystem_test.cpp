#include "Helper/Shared/Server/MigSubsystem.h"

#include <gtest/gtest.h>

#include "Helper/Shared/Server/MessageLayouts.h"
#include "platform/sim/Ports.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimClient.h"
#include "tests/support/Messages.h"

using namespace platform;

namespace {

constexpr std::int32_t kForgetful = 500;
constexpr std::int32_t kFailing = 501;
constexpr std::int32_t kPassing = 502;

void ForgetfulStub(ReceivedMessage& /*request*/, ReplyMessage& /*reply*/) {}

void FailingStub(ReceivedMessage& request, ReplyMessage& reply) {
    EXPECT_EQ(MachMessageAccept(request), KERN_SUCCESS);
    MigSetReturnCode(reply, KERN_FAILURE);
}

void PassingStub(ReceivedMessage& request, ReplyMessage& reply) {
    EXPECT_EQ(MachMessageAccept(request), KERN_SUCCESS);
    MigSetReturnCode(reply, KERN_SUCCESS);
}

MigStub ServerRoutine(const MachMsgHeader& request) {
    switch (request.id) {
        case kForgetful:
            return ForgetfulStub;
        case kFailing:
            return FailingStub;
        case kPassing:
            return PassingStub;
        default:
            return nullptr;
    }
}

constexpr MigSubsystem kSubsystem{.server = ServerRoutine, .firstId = 500, .endId = 503};

class MigDispatcher : public testing::Test {
protected:
    MigDispatcher() {
        sim::Reset();
        (void)mach_port_allocate(MachPortRight::kReceive, &port);
        peer = sim::PeerOf(sim::FindPort(port)->send);
        source = MigCreateRunLoopSource(kSubsystem, port);
        RunLoop::current().addSource(source);
    }

    ~MigDispatcher() override {
        source->invalidate();
        mach_port_mod_refs(port, MachPortRight::kReceive, -1);
    }

    messages::Bytes ask(const messages::Bytes& message, std::vector<sim::Descriptor> passed = {}) {
        EXPECT_TRUE(peer.send(message, std::move(passed)));
        sim::Settle();
        const auto reply = peer.receive();
        return reply.has_value() ? reply->bytes : messages::Bytes();
    }

    static messages::Bytes messageWithPort(std::int32_t id) {
        auto message = messages::CheckIn();
        messages::Put(message, 20, id);
        return message;
    }

    mach_port_t port = MACH_PORT_NULL;
    sim::Peer peer;
    std::shared_ptr<RunLoopSource> source;
};

TEST_F(MigDispatcher, PresetsTheWholeErrorReply) {
    messages::Bytes expected(36);
    messages::Put(expected, 4, std::uint32_t{36});
    messages::Put(expected, 20, std::int32_t{877});
    messages::Put(expected, 24, kNdrRecord);
    messages::Put(expected, 32, MIG_BAD_ID);
    EXPECT_EQ(ask(messages::Message(777, 24)), expected);
}

TEST_F(MigDispatcher, NeverSendsSuccessForAStubThatSetNoCode) {
    EXPECT_EQ(messages::CodeOf(ask(messages::Message(kForgetful, 24))), MIG_BAD_ID);
}

TEST_F(MigDispatcher, WrapsTheIdOfTheReply) {
    EXPECT_EQ(ReplyId(0x7FFFFFFF), static_cast<std::int32_t>(0x80000063));
    const auto reply = ask(messages::Message(0x7FFFFFFF, 24));
    EXPECT_EQ(messages::Get<std::uint32_t>(reply, 20), 0x80000063U);
}

TEST_F(MigDispatcher, DestroysWhatAFailedRequestBrought) {
    auto pair = sim::MakeWatchPair();
    EXPECT_EQ(messages::CodeOf(ask(messageWithPort(kFailing), {std::move(pair.passed)})), 5);
    EXPECT_TRUE(pair.kept.isHungUp());
    EXPECT_EQ(sim::PortNames(), 1U);
}

TEST_F(MigDispatcher, KeepsThePortThatASuccessfulRequestBrought) {
    auto pair = sim::MakeWatchPair();
    EXPECT_EQ(messages::CodeOf(ask(messageWithPort(kPassing), {std::move(pair.passed)})), 0);
    EXPECT_FALSE(pair.kept.isHungUp());
    EXPECT_EQ(sim::PortNames(), 2U);
    sim::EndDaemon();
}

TEST_F(MigDispatcher, ReleasesWhatARequestOfNobodyBrought) {
    auto pair = sim::MakeWatchPair();
    EXPECT_EQ(messages::CodeOf(ask(messageWithPort(777), {std::move(pair.passed)})), MIG_BAD_ID);
    EXPECT_TRUE(pair.kept.isHungUp());
    EXPECT_EQ(sim::PortNames(), 1U);
}

TEST_F(MigDispatcher, AnswersPipelinedRequestsInTheirOrder) {
    for (std::int32_t id = 600; id < 610; ++id) {
        ASSERT_TRUE(peer.send(messages::Message(id, 24)));
    }
    sim::Settle();
    for (std::int32_t id = 600; id < 610; ++id) {
        EXPECT_EQ(messages::Get<std::int32_t>(peer.receive()->bytes, 20), id + 100);
    }
}

TEST_F(MigDispatcher, WaitsForAClientThatDoesNotRead) {
    peer.setCapacity(2);
    for (std::int32_t id = 600; id < 610; ++id) {
        ASSERT_TRUE(peer.send(messages::Message(id, 24)));
    }
    sim::Settle();
    for (std::int32_t id = 600; id < 610; ++id) {
        EXPECT_EQ(messages::Get<std::int32_t>(peer.receive()->bytes, 20), id + 100);
        sim::Settle();
    }
}

TEST_F(MigDispatcher, HasNoSourceForANameWithoutAReceiveRight) {
    EXPECT_EQ(MigCreateRunLoopSource(kSubsystem, MACH_PORT_NULL), nullptr);
    EXPECT_EQ(MigCreateRunLoopSource(kSubsystem, port + 1), nullptr);
}

}  // namespace
