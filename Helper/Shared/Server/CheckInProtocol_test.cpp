#include "Helper/Shared/Server/CheckInProtocol.h"

#include <gtest/gtest.h>

#include "Helper/Shared/Server/HelperServerUtils.h"
#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/MachCarriage.h"
#include "tests/support/TestClient.h"

using namespace platform;

namespace {

/// The check-in as it lies in the receiver's buffer, with its trailer, before the stub.
class CheckInStub : public testing::Test {
protected:
    CheckInStub() {
        sim::Reset();
        buffer.resize(kCheckInRequestSize + sizeof(MachMsgAuditTrailer));
        messages::Put(buffer, kCheckInRequestSize, MachMsgAuditTrailer{});
    }

    kern_return_t codeOfReply() {
        ReceivedMessage request{.bytes = buffer, .inlineData = {}, .memory = {}};
        MigDispatch(kCheckInSubsystem, request, reply);
        return Load<kern_return_t>(reply.bytes, kOffsetOfReturnCode);
    }

    messages::Bytes buffer = messages::CheckIn();
    ReplyMessage reply;
};

TEST_F(CheckInStub, ServesItsOneIdOnly) {
    EXPECT_NE(kCheckInSubsystem.server({.id = kCheckInId}), nullptr);
    EXPECT_EQ(kCheckInSubsystem.server({.id = kCheckInId + 1}), nullptr);
    EXPECT_EQ(kCheckInSubsystem.server({.id = kCheckInId - 1}), nullptr);
    EXPECT_EQ(kCheckInSubsystem.server({.id = kFirstRoutineId}), nullptr);
    EXPECT_EQ(kCheckInSubsystem.declaredMaxRequestSize, 40U);
}

TEST_F(CheckInStub, AnswersBadIdToAnythingElse) {
    messages::Put(buffer, 20, kCheckInId + 1);
    EXPECT_EQ(codeOfReply(), MIG_BAD_ID);
    EXPECT_EQ(reply.header().id, kCheckInId + 101);
    EXPECT_EQ(reply.header().size, 36U);
}

TEST_F(CheckInStub, RefusesASimpleMessage) {
    messages::Put(buffer, 0, std::uint32_t{0});
    EXPECT_EQ(codeOfReply(), MIG_BAD_ARGUMENTS);
}

TEST_F(CheckInStub, RefusesAnyOtherCountOfDescriptors) {
    for (const std::uint32_t count : {0U, 2U, 0xFFFFFFFFU}) {
        messages::Put(buffer, 24, count);
        EXPECT_EQ(codeOfReply(), MIG_BAD_ARGUMENTS);
    }
}

TEST_F(CheckInStub, RefusesAnyOtherSize) {
    for (const std::uint32_t size : {24U, 36U, 39U, 41U, 44U}) {
        messages::Put(buffer, 4, size);
        EXPECT_EQ(codeOfReply(), MIG_BAD_ARGUMENTS);
    }
}

TEST_F(CheckInStub, RefusesAnyOtherDisposition) {
    for (const int disposition : {16, 18, 19, 20, 0}) {
        messages::Put(buffer, 38, static_cast<std::uint8_t>(disposition));
        EXPECT_EQ(codeOfReply(), MIG_TYPE_ERROR);
    }
}

TEST_F(CheckInStub, RefusesAnyOtherTypeOfDescriptor) {
    for (const int type : {1, 2, 255}) {
        messages::Put(buffer, 39, static_cast<std::uint8_t>(type));
        EXPECT_EQ(codeOfReply(), MIG_TYPE_ERROR);
    }
}

TEST_F(CheckInStub, PutsTheCodeOfAForeignTrailerIntoTheRequest) {
    messages::Put(buffer, 40, std::uint32_t{1});
    EXPECT_EQ(codeOfReply(), MIG_BAD_ID);
    EXPECT_EQ(messages::Get<kern_return_t>(buffer, 32), MIG_TRAILER_ERROR);
    EXPECT_EQ(reply.header().size, 36U);
}

TEST_F(CheckInStub, RefusesATrailerThatIsTooSmallForAToken) {
    for (const std::uint32_t size : {0U, 8U, 31U}) {
        messages::Put(buffer, 44, size);
        EXPECT_EQ(codeOfReply(), MIG_TRAILER_ERROR);
    }
}

TEST_F(CheckInStub, TakesATrailerOfThirtyTwoBytes) {
    messages::Put(buffer, 44, std::uint32_t{32});
    // Past the stub's own checks, the watch port that did not come is missed.
    EXPECT_EQ(codeOfReply(), MIG_BAD_ARGUMENTS);
}

TEST_F(CheckInStub, ChecksInTheOrderSizeTypeTrailer) {
    messages::Put(buffer, 40, std::uint32_t{1});
    messages::Put(buffer, 39, std::uint8_t{1});
    EXPECT_EQ(codeOfReply(), MIG_TYPE_ERROR);
    messages::Put(buffer, 4, std::uint32_t{41});
    EXPECT_EQ(codeOfReply(), MIG_BAD_ARGUMENTS);
    EXPECT_EQ(messages::Get<kern_return_t>(buffer, 32), -1);  // the padding that was sent
}

// The same through a connection.

class CheckInMessage : public testing::Test {
protected:
    CheckInMessage() {
        sim::Reset();
        TestClient::entitleGroup();
        server = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
        peer = sim::Connect({.pid = 100, .uid = 501, .gid = kEntitledGroup}, kServiceName);
    }

    ~CheckInMessage() override {
        MobileHelperServerDestroy(server);
        EXPECT_EQ(sim::PortNames(), 0U);
        EXPECT_EQ(sim::OpenDescriptors(), 0U);
    }

    kern_return_t send(const messages::Bytes& message, std::vector<sim::Descriptor> descriptors) {
        EXPECT_TRUE(peer.send(message, std::move(descriptors)));
        sim::Settle();
        const auto reply = peer.receive();
        return reply.has_value() ? messages::CodeOf(reply->bytes) : kNoReply;
    }

    MobileHelperServer* server = nullptr;
    sim::Peer peer;
    sim::WatchPair pair = sim::MakeWatchPair();
    sim::WatchPair other = sim::MakeWatchPair();
};

TEST_F(CheckInMessage, NeedsTheDescriptorThatItAnnounces) {
    EXPECT_EQ(send(messages::CheckIn(), {}), MIG_BAD_ARGUMENTS);
    EXPECT_EQ(send(messages::CheckIn(), {pair.passed}), KERN_SUCCESS);
}

TEST_F(CheckInMessage, MayNotBringASecondDescriptor) {
    EXPECT_EQ(send(messages::CheckIn(), {pair.passed, other.passed}), MIG_BAD_ARGUMENTS);
    pair.passed = nullptr;
    other.passed = nullptr;
    EXPECT_TRUE(pair.kept.isHungUp());
    EXPECT_TRUE(other.kept.isHungUp());
}

TEST_F(CheckInMessage, ReleasesTheWatchPortOfARefusal) {
    auto message = messages::CheckIn();
    messages::Put(message, 38, std::uint8_t{19});
    EXPECT_EQ(send(message, {std::move(pair.passed)}), MIG_TYPE_ERROR);
    EXPECT_TRUE(pair.kept.isHungUp());
    EXPECT_EQ(sim::PortNames(), 1U);
}

TEST_F(CheckInMessage, MustBeAsLongAsItSays) {
    auto message = messages::CheckIn();
    message.resize(41);
    EXPECT_EQ(send(message, {pair.passed}), MIG_BAD_ARGUMENTS);
    message.resize(39);
    EXPECT_EQ(send(message, {pair.passed}), MIG_BAD_ARGUMENTS);
    message.resize(kReceiveCapacity + 1000);
    EXPECT_EQ(send(message, {pair.passed}), MIG_BAD_ARGUMENTS);
}

TEST_F(CheckInMessage, IsRefusedAsARoutineOfThePrivatePort) {
    EXPECT_EQ(send(messages::Request(2), {}), MIG_BAD_ID);
}

TEST_F(CheckInMessage, ShorterThanAHeaderClosesTheConnection) {
    EXPECT_EQ(send(messages::Bytes(23), {}), kNoReply);
    EXPECT_TRUE(peer.isHungUp());
    EXPECT_EQ(sim::OpenDescriptors(), 0U);
}

TEST_F(CheckInMessage, MayComeAgainOnTheSameConnection) {
    EXPECT_EQ(send(messages::CheckIn(), {pair.passed}), KERN_SUCCESS);
    EXPECT_EQ(send(messages::CheckIn(), {other.passed}), KERN_SUCCESS);
    EXPECT_EQ(server->clients.size(), 2U);
}

}  // namespace
