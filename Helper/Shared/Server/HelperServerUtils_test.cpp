#include "Helper/Shared/Server/HelperServerUtils.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/SerialQueue.h"
#include "tests/support/RecordingHandlers.h"
#include "tests/support/TestClient.h"

using namespace platform;

namespace {

class HelperServer : public testing::Test {
protected:
    HelperServer() {
        sim::Reset();
        recording::Reset();
        TestClient::entitleGroup();
        server = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
    }

    ~HelperServer() override {
        if (server != nullptr) {
            MobileHelperServerDestroy(server);
        }
        EXPECT_EQ(sim::PortNames(), 0U);
        EXPECT_EQ(sim::OpenDescriptors(), 0U);
        EXPECT_EQ(sim::AllocatedMemory(), 0U);
    }

    /// Runs until the server leaves by itself, and says when that was.
    double secondOfExit() {
        EXPECT_EQ(MobileHelperServerRun(server), RunLoopResult::kStopped);
        return sim::Now();
    }

    /// Holds for the whole of a run's first second, so that the idle timer is armed at 1.0.
    void holdForOneSecond() {
        const auto token = ServerHoldAcquire(server);
        sim::At(1.0, [this, token] {
            SerialQueue("worker").async([this, token] { ServerHoldRelease(server, token); });
        });
    }

    MobileHelperServer* server = nullptr;
    TestClient client;
};

using HelperServerCreation = HelperServer;
using HelperServerHolds = HelperServer;
using HelperServerIdleExit = HelperServer;
using HelperServerCheckIn = HelperServer;

// Creation.

TEST_F(HelperServerCreation, ChecksInTheServiceAndRegistersItsPort) {
    ASSERT_NE(server, nullptr);
    EXPECT_EQ(sim::JournalCount("bootstrap_check_in com.vendra.linefold.mobile-helper"), 1U);
    EXPECT_EQ(ServerForPort(server->servicePort), server);
    EXPECT_EQ(server->requestSubsystem, &kRequestSubsystem);
    EXPECT_EQ(server->fd, -1);
    EXPECT_EQ(server->holdMask, 0U);
    EXPECT_EQ(server->idleTimer, nullptr);
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

TEST_F(HelperServerCreation, FailsWithOneLineWhenTheServiceIsHeldElsewhere) {
    MobileHelperServerDestroy(std::exchange(server, nullptr));
    sim::HoldServiceElsewhere(kServiceName);
    EXPECT_EQ(MobileHelperServerCreate(kServiceName, kRequestSubsystem), nullptr);
    const std::vector<sim::LogLine> expected{
        {LogLevel::kError, "unable to create server objects - out of resources"}};
    EXPECT_EQ(sim::UnifiedLog(), expected);
}

TEST_F(HelperServerCreation, FailsWithOneLineAndWithoutThePortWhenThereIsNoSource) {
    MobileHelperServerDestroy(std::exchange(server, nullptr));
    sim::ClearJournal();
    sim::FailCall("MachPortCreateRunLoopSource", 1);
    EXPECT_EQ(MobileHelperServerCreate(kServiceName, kRequestSubsystem), nullptr);
    EXPECT_TRUE(sim::JournalHasInOrder(
        {"bootstrap_check_in", "mach_port_mod_refs", "Log error unable to create server objects"}));
    EXPECT_EQ(sim::UnifiedLog().size(), 1U);
    EXPECT_EQ(sim::PortNames(), 0U);
}

TEST_F(HelperServerCreation, ForgetsThePortOfAServiceThatCouldNotBeOpened) {
    const mach_port_t first = server->servicePort;
    MobileHelperServerDestroy(std::exchange(server, nullptr));
    sim::FailCall("MachPortCreateRunLoopSource", 1);
    ASSERT_EQ(MobileHelperServerCreate(kServiceName, kRequestSubsystem), nullptr);
    EXPECT_EQ(ServerForPort(first), nullptr);
    EXPECT_EQ(ServerForPort(first + 0x100), nullptr);
}

TEST_F(HelperServerCreation, NeverExitsByItselfWithoutAClientOrAHold) {
    EXPECT_THROW((void)MobileHelperServerRun(server), sim::NothingLeftToHappen);
    EXPECT_EQ(sim::JournalCount("RunLoopTimer.create"), 0U);
}

TEST_F(HelperServerCreation, RunReturnsNotRunWhenTheStopWasRequestedBefore) {
    EXPECT_EQ(MobileHelperServerStop(server), 0);
    EXPECT_EQ(MobileHelperServerRun(server), RunLoopResult::kNotRun);
    EXPECT_EQ(server->runLoop, &RunLoop::current());
}

TEST_F(HelperServerCreation, RunReturnsTheLastResultOfTheLoop) {
    sim::At(3.0, [this] { MobileHelperServerStop(server); });
    EXPECT_EQ(MobileHelperServerRun(server), RunLoopResult::kStopped);
    EXPECT_EQ(sim::Now(), 3.0);
    EXPECT_EQ(server->stopRequested, 1U);
}

TEST_F(HelperServerCreation, DestroyReleasesTheServiceAndEveryClient) {
    TestClient other(101);
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    ASSERT_EQ(other.checkIn(), KERN_SUCCESS);
    MobileHelperServerDestroy(std::exchange(server, nullptr));
    EXPECT_TRUE(client.privatePort.isHungUp());
    EXPECT_TRUE(other.watch.isHungUp());
    EXPECT_EQ(sim::PortNames(), 0U);
}

TEST_F(HelperServerCreation, DestroyLeavesTheIdleTimerAsItIs) {
    holdForOneSecond();
    sim::At(2.0, [this] { MobileHelperServerStop(server); });
    (void)secondOfExit();
    ASSERT_NE(server->idleTimer, nullptr);
    sim::ClearJournal();
    MobileHelperServerDestroy(std::exchange(server, nullptr));
    EXPECT_EQ(sim::JournalCount("RunLoopTimer.invalidate"), 0U);
}

TEST_F(HelperServerCreation, DestroyClosesADescriptorThatSomebodyLeftInTheSlot) {
    const int left = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 0);
    ASSERT_NE(left, -1);
    server->fd = left;
    MobileHelperServerDestroy(std::exchange(server, nullptr));
    EXPECT_EQ(fcntl(left, F_GETFD), -1);
}

// Holds.

TEST_F(HelperServerHolds, TakeTheLowestClearBit) {
    EXPECT_EQ(ServerHoldAcquire(server), 1U);
    EXPECT_EQ(ServerHoldAcquire(server), 2U);
    EXPECT_EQ(ServerHoldAcquire(server), 4U);
    EXPECT_TRUE(ServerHoldRelease(server, 2));
    EXPECT_EQ(server->holdMask, 5U);
    EXPECT_EQ(ServerHoldAcquire(server), 2U);
    EXPECT_EQ(server->holdMask, 7U);
}

TEST_F(HelperServerHolds, GiveTheFirstBitAgainToTheThirtyThird) {
    for (std::uint32_t bit = 0; bit < 32; ++bit) {
        EXPECT_EQ(ServerHoldAcquire(server), 1U << bit);
    }
    EXPECT_EQ(server->holdMask, 0xFFFFFFFFU);
    EXPECT_EQ(ServerHoldAcquire(server), 1U);
    EXPECT_TRUE(ServerHoldRelease(server, 1));
    EXPECT_EQ(server->holdMask, 0xFFFFFFFEU);
}

TEST_F(HelperServerHolds, RefuseATokenThatIsNotOneBit) {
    const auto token = ServerHoldAcquire(server);
    (void)ServerHoldAcquire(server);
    (void)ServerHoldAcquire(server);
    EXPECT_FALSE(ServerHoldRelease(server, 6));
    EXPECT_FALSE(ServerHoldRelease(server, 0));
    EXPECT_FALSE(ServerHoldRelease(server, 0xFFFFFFFF));
    EXPECT_EQ(server->holdMask, 7U);
    EXPECT_TRUE(ServerHoldRelease(server, token));
}

TEST_F(HelperServerHolds, DoNotNoticeABitThatIsNotHeld) {
    (void)ServerHoldAcquire(server);
    EXPECT_TRUE(ServerHoldRelease(server, 0x80000000));
    EXPECT_EQ(server->holdMask, 1U);
    EXPECT_EQ(server->idleTimer, nullptr);
}

TEST_F(HelperServerHolds, MayBeTakenAndReleasedWhenTheServerIsGone) {
    MobileHelperServer* const gone = std::exchange(server, nullptr);
    MobileHelperServerDestroy(gone);
    EXPECT_TRUE(ServerHoldRelease(gone, ServerHoldAcquire(gone)));
    EXPECT_EQ(ServerHoldAcquire(gone), 1U);
    server = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
    ASSERT_NE(server, nullptr);
    EXPECT_EQ(server->holdMask, 0U) << "the next server begins without holds";
}

TEST_F(HelperServerHolds, ReleasingARefusedTokenArmsNothing) {
    EXPECT_FALSE(ServerHoldRelease(server, 0));
    EXPECT_FALSE(ServerHoldRelease(server, 6));
    EXPECT_EQ(sim::JournalCount("RunLoopTimer.create"), 0U);
}

// Idle exit.

TEST_F(HelperServerIdleExit, ComesTenSecondsAfterTheLastHold) {
    holdForOneSecond();
    EXPECT_EQ(secondOfExit(), 11.0);
}

TEST_F(HelperServerIdleExit, ComesTenSecondsAfterTheLastClientDied) {
    sim::At(1.0, [this] { client.sendCheckIn(); });
    sim::At(3.0, [this] { client.die(); });
    EXPECT_EQ(secondOfExit(), 13.0);
    EXPECT_TRUE(server->clients.empty());
}

TEST_F(HelperServerIdleExit, IsCancelledByAHoldAndCountsFromItsRelease) {
    holdForOneSecond();
    sim::At(9.0, [this] { (void)ServerHoldAcquire(server); });
    sim::At(20.0, [this] { ServerHoldRelease(server, 1); });
    EXPECT_EQ(secondOfExit(), 30.0);
}

TEST_F(HelperServerIdleExit, IsCancelledByACheckIn) {
    holdForOneSecond();
    sim::At(10.5, [this] { client.sendCheckIn(); });
    sim::At(50.0, [this] { client.die(); });
    EXPECT_EQ(secondOfExit(), 60.0);
}

TEST_F(HelperServerIdleExit, DoesNotWaitLongerForASecondRelease) {
    holdForOneSecond();
    sim::At(5.0, [this] { ServerHoldRelease(server, 1); });
    EXPECT_EQ(secondOfExit(), 11.0);
    EXPECT_EQ(sim::JournalCount("RunLoopTimer.create"), 1U);
}

TEST_F(HelperServerIdleExit, IsNotArmedByTheLastHoldWhileAClientLives) {
    sim::At(0.5, [this] { client.sendCheckIn(); });
    holdForOneSecond();
    sim::At(2.0, [this] { EXPECT_EQ(server->idleTimer, nullptr); });
    sim::At(40.0, [this] { client.die(); });
    EXPECT_EQ(secondOfExit(), 50.0);
}

TEST_F(HelperServerIdleExit, IsNotArmedByAClientsDeathWhileAHoldIsTaken) {
    (void)ServerHoldAcquire(server);
    sim::At(1.0, [this] { client.sendCheckIn(); });
    sim::At(2.0, [this] { client.die(); });
    sim::At(3.0, [this] { EXPECT_EQ(server->idleTimer, nullptr); });
    sim::At(4.0, [this] { ServerHoldRelease(server, 1); });
    EXPECT_EQ(secondOfExit(), 14.0);
}

TEST_F(HelperServerIdleExit, WaitsForTheLastOfTwoClients) {
    TestClient other(101);
    sim::At(1.0, [&] { client.sendCheckIn(); });
    sim::At(1.0, [&] { other.sendCheckIn(); });
    sim::At(2.0, [&] { client.die(); });
    sim::At(7.0, [&] { other.die(); });
    EXPECT_EQ(secondOfExit(), 17.0);
}

TEST_F(HelperServerIdleExit, IsPostponedByTenSecondsWhileTheIdleHandlerIsBusy) {
    int asked = 0;
    MobileHelperServerSetIdleHandler(server, [&] { return ++asked < 4; });
    holdForOneSecond();
    EXPECT_EQ(secondOfExit(), 41.0);
    EXPECT_EQ(asked, 4);
    EXPECT_EQ(sim::JournalCount("RunLoopTimer.create"), 1U);
}

TEST_F(HelperServerIdleExit, KeepsTheIdleHandlerWhenAnEmptyOneIsGiven) {
    int asked = 0;
    MobileHelperServerSetIdleHandler(server, [&] { return ++asked < 2; });
    MobileHelperServerSetIdleHandler(server, nullptr);
    MobileHelperServerSetIdleHandler(nullptr, [] { return true; });
    holdForOneSecond();
    EXPECT_EQ(secondOfExit(), 21.0);
}

TEST_F(HelperServerIdleExit, AsksTheLastIdleHandlerOnly) {
    int askedFirst = 0;
    MobileHelperServerSetIdleHandler(server, [&] { return ++askedFirst > 0; });
    MobileHelperServerSetIdleHandler(server, [] { return false; });
    holdForOneSecond();
    EXPECT_EQ(secondOfExit(), 11.0);
    EXPECT_EQ(askedFirst, 0);
}

TEST_F(HelperServerIdleExit, ComesAtOnceWhenTheTimerCannotBeMade) {
    sim::FailCall("RunLoopTimer.create", 1);
    holdForOneSecond();
    EXPECT_EQ(secondOfExit(), 1.0);
    EXPECT_EQ(server->idleTimer, nullptr);
}

TEST_F(HelperServerIdleExit, ComesAtOnceWhenTheTimerCannotBeMadeAtAClientsDeath) {
    sim::FailCall("RunLoopTimer.create", 1);
    sim::At(1.0, [this] { client.sendCheckIn(); });
    sim::At(2.0, [this] { client.die(); });
    EXPECT_EQ(secondOfExit(), 2.0);
}

TEST_F(HelperServerIdleExit, ComesAtOnceWhenTheProcessIsAskedToEnd) {
    sim::At(4.0, [this] { MobileHelperServerStop(server); });
    sim::At(1.0, [this] { client.sendCheckIn(); });
    EXPECT_EQ(secondOfExit(), 4.0);
}

TEST_F(HelperServerIdleExit, ForgetsAClientThatWasDeadOnArrivalWithItsTimerCancelled) {
    // The removal arms the timer and the end of the check-in cancels it: nothing is armed.
    sim::At(1.0, [this] {
        client.sendCheckIn();
        client.watch.close();
    });
    EXPECT_THROW((void)MobileHelperServerRun(server), sim::NothingLeftToHappen);
    EXPECT_TRUE(sim::JournalHasInOrder({"RunLoopTimer.create", "RunLoopTimer.invalidate"}));
    EXPECT_EQ(client.readCheckIn(), KERN_FAILURE);
    EXPECT_EQ(server->idleTimer, nullptr);
}

TEST_F(HelperServerIdleExit, ComesAfterTheNextHoldWhenAClientWasDeadOnArrival) {
    sim::At(1.0, [this] {
        client.sendCheckIn();
        client.watch.close();
    });
    sim::At(5.0, [this] { ServerHoldRelease(server, ServerHoldAcquire(server)); });
    EXPECT_EQ(secondOfExit(), 15.0);
}

// Check-in.

TEST_F(HelperServerCheckIn, AnswersWithASendRightToAPrivatePort) {
    client.sendCheckIn();
    sim::Settle();
    const auto reply = client.service.receive();
    ASSERT_TRUE(reply.has_value());
    messages::Bytes expected = messages::Message(kCheckInId + 100, 40, MACH_MSGH_BITS_COMPLEX);
    std::fill(expected.begin() + 8, expected.begin() + 20, std::byte{0});
    messages::Put(expected, 24, std::uint32_t{1});
    messages::Put(expected, 38, std::uint8_t{19});
    EXPECT_EQ(reply->bytes, expected);
    EXPECT_EQ(reply->descriptors.size(), 1U);
}

TEST_F(HelperServerCheckIn, RegistersBothPortsOfTheClient) {
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    ASSERT_EQ(server->clients.size(), 1U);
    const auto& [watch, privatePort] = server->clients.front();
    EXPECT_EQ(ServerForPort(watch->port()), server);
    EXPECT_EQ(ServerForPort(privatePort), server);
    EXPECT_NE(server->clientSources.get(privatePort), nullptr);
    EXPECT_EQ(watch->info(), server);
    EXPECT_EQ(sim::PortNames(), 3U);
}

TEST_F(HelperServerCheckIn, ServesRequestsOnThePrivatePort) {
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    EXPECT_EQ(client.codeOf(messages::Request(0, {"token"})), KERN_SUCCESS);
    ASSERT_EQ(recording::Calls().size(), 1U);
    EXPECT_EQ(recording::Calls()[0].texts, std::vector<std::string>{"token"});
    EXPECT_EQ(ServerForPort(recording::Calls()[0].port), server);
}

TEST_F(HelperServerCheckIn, AClientsDeathReleasesItsPorts) {
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    const auto [watch, privatePort] = server->clients.front();
    client.die();
    sim::Settle();
    EXPECT_EQ(ServerForPort(watch->port()), nullptr);
    EXPECT_EQ(ServerForPort(privatePort), nullptr);
    EXPECT_EQ(server->clientSources.size(), 0U);
    EXPECT_EQ(sim::PortNames(), 1U);
}

TEST_F(HelperServerCheckIn, AClosedPrivatePortAloneLeavesTheClientInPlace) {
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    client.privatePort.close();
    sim::Settle();
    EXPECT_EQ(server->clients.size(), 1U);
    client.watch.close();
    sim::Settle();
    EXPECT_TRUE(server->clients.empty());
}

TEST_F(HelperServerCheckIn, DataOnTheWatchPortWakesNobody) {
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    ASSERT_TRUE(client.watch.send(messages::Request(2)));
    EXPECT_EQ(RunLoop::current().run(1.0, AfterSource::kReturn), RunLoopResult::kTimedOut);
    EXPECT_TRUE(recording::Calls().empty());
    EXPECT_EQ(server->clients.size(), 1U);
}

TEST_F(HelperServerCheckIn, RefusesAProcessWithoutTheEntitlementAndLogsNothing) {
    TestClient stranger(200, kOtherGroup);
    EXPECT_EQ(stranger.checkIn(), KERN_INVALID_SECURITY);
    EXPECT_TRUE(stranger.watch.isHungUp());
    EXPECT_TRUE(server->clients.empty());
    EXPECT_TRUE(sim::UnifiedLog().empty());
    EXPECT_EQ(sim::JournalCount("mach_port_allocate"), 0U);
}

TEST_F(HelperServerCheckIn, RefusesAStrangerBeforeItLooksAtTheKindOfTheWatchPort) {
    TestClient stranger(200, kOtherGroup);
    stranger.service = sim::Connect(stranger.identity, kServiceName);
    (void)stranger.service.send(messages::CheckIn(), {std::make_shared<sim::OtherFile>()});
    sim::Settle();
    EXPECT_EQ(stranger.readCheckIn(), KERN_INVALID_SECURITY);
}

TEST_F(HelperServerCheckIn, FailsWithAWatchPortWhoseEndCannotBeNoticed) {
    client.service = sim::Connect(client.identity, kServiceName);
    (void)client.service.send(messages::CheckIn(), {std::make_shared<sim::OtherFile>()});
    sim::Settle();
    EXPECT_EQ(client.readCheckIn(), KERN_FAILURE);
    EXPECT_EQ(sim::PortNames(), 1U);
}

TEST_F(HelperServerCheckIn, FailsWithAWatchPortThatIsDeadAlready) {
    client.sendCheckIn();
    client.watch.close();
    sim::Settle();
    EXPECT_EQ(client.readCheckIn(), KERN_FAILURE);
    EXPECT_TRUE(server->clients.empty());
    EXPECT_EQ(server->clientSources.size(), 0U);
    EXPECT_EQ(sim::PortNames(), 1U);
}

TEST_F(HelperServerCheckIn, TakesEffectInItsOrder) {
    sim::ClearJournal();
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    EXPECT_TRUE(sim::JournalHasInOrder({"AdoptPortDescriptor",
                                        "SecTask.copyValueForEntitlement",
                                        "mach_port_allocate",
                                        "mach_port_insert_right",
                                        "MachPortCreateRunLoopSource",
                                        "MachPort.create",
                                        "MachPort.setInvalidationCallBack"}));
}

TEST_F(HelperServerCheckIn, RemovalInvalidatesTheWatchBeforeItDropsThePorts) {
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    client.die();
    sim::ClearJournal();
    sim::Settle();
    EXPECT_TRUE(sim::JournalHasInOrder({"MachPort.invalidate",
                                        "mach_port_deallocate",
                                        "mach_port_mod_refs",
                                        "mach_port_deallocate"}));
}

struct CheckInFault {
    const char* call;
    kern_return_t code;
};

class HelperServerCheckInFault : public HelperServer,
                                 public testing::WithParamInterface<CheckInFault> {};

TEST_P(HelperServerCheckInFault, IsTheCodeOfTheReplyAndLeaksNothing) {
    const auto descriptors = sim::OpenDescriptors();
    sim::FailCall(GetParam().call, 1);
    EXPECT_EQ(client.checkIn(), GetParam().code);
    EXPECT_EQ(sim::FailedCall(), GetParam().call);
    EXPECT_TRUE(server->clients.empty());
    EXPECT_EQ(server->clientSources.size(), 0U);
    EXPECT_EQ(sim::PortNames(), 1U);
    EXPECT_EQ(sim::OpenDescriptors(), descriptors + 1);  // the client's connection
}

INSTANTIATE_TEST_SUITE_P(
    EachCall,
    HelperServerCheckInFault,
    testing::Values(CheckInFault{"AdoptPortDescriptor", KERN_RESOURCE_SHORTAGE},
                    CheckInFault{"SecTask.createWithAuditToken", KERN_INVALID_SECURITY},
                    CheckInFault{"SecTask.copyValueForEntitlement", KERN_INVALID_SECURITY},
                    CheckInFault{"mach_port_allocate", KERN_RESOURCE_SHORTAGE},
                    CheckInFault{"mach_port_insert_right", KERN_INVALID_RIGHT},
                    CheckInFault{"MachPortCreateRunLoopSource", KERN_FAILURE},
                    CheckInFault{"MachPort.create", KERN_FAILURE}),
    [](const auto& test) {
        std::string name = test.param.call;
        std::erase_if(name, [](char letter) { return letter == '.' || letter == '_'; });
        return name;
    });

TEST_F(HelperServerCheckIn, HearsOfAFullDescriptorTable) {
    sim::SetDescriptorLimit(1);
    client.sendCheckIn();
    sim::Settle();
    EXPECT_EQ(client.readCheckIn(), KERN_RESOURCE_SHORTAGE);
    sim::SetDescriptorLimit(100);
    EXPECT_EQ(client.checkIn(), KERN_SUCCESS);
}

TEST_F(HelperServerCheckIn, ClosesAConnectionForWhichThereIsNoDescriptor) {
    sim::SetDescriptorLimit(0);
    client.sendCheckIn();
    sim::Settle();
    EXPECT_EQ(client.readCheckIn(), kNoReply);
    EXPECT_TRUE(client.service.isHungUp());
    EXPECT_EQ(sim::WaitingConnections(kServiceName), 0U);
}

TEST_F(HelperServerCheckIn, KeepsAtMostSixtyFourConnectionsOfOneUser) {
    std::vector<sim::Peer> peers;
    for (int i = 0; i < 65; ++i) {
        peers.push_back(sim::Connect(client.identity, kServiceName));
    }
    sim::Settle();
    EXPECT_TRUE(peers.front().isHungUp());
    EXPECT_FALSE(peers[1].isHungUp());
    EXPECT_EQ(sim::OpenDescriptors(), 64U);
}

TEST_F(HelperServerCheckIn, FindsTheServerOfACallBackWithoutOneByItsPort) {
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    const auto watch = server->clients.front().first;
    MachPortInvalidationCallBack(*watch, nullptr);
    EXPECT_TRUE(server->clients.empty());
    EXPECT_FALSE(watch->isValid());
}

TEST(HelperServerDeathTest, ACallBackOfNoServerIsAMistakeOfOurs) {
    sim::Reset();
    mach_port_t name = MACH_PORT_NULL;
    ASSERT_EQ(mach_port_allocate(MachPortRight::kReceive, &name), KERN_SUCCESS);
    ASSERT_EQ(mach_port_insert_right(name, MachMsgType::kMakeSend), KERN_SUCCESS);
    const auto port = MachPort::create(name, nullptr);
    ASSERT_NE(port, nullptr);
    EXPECT_DEATH(MachPortInvalidationCallBack(*port, nullptr),
                 "Assertion failed: .server., function MachPortInvalidationCallBack, file .*"
                 "Helper/Shared/Server/HelperServerUtils.cpp, line");
}

TEST_F(HelperServerCheckIn, RemovesAClientWithoutAWatchObject) {
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    const mach_port_t privatePort = server->clients.front().second;
    const std::lock_guard guard(server->lock);
    RemoveClient(nullptr, privatePort, server);
    EXPECT_EQ(server->clientSources.size(), 0U);
    EXPECT_EQ(ServerForPort(privatePort), nullptr);
    EXPECT_TRUE(client.privatePort.isHungUp());
}

TEST_F(HelperServerCheckIn, AnswersAProcessFromTheCacheTheSecondTime) {
    TestClient again(client.identity.pid);
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    sim::ClearJournal();
    EXPECT_EQ(again.checkIn(), KERN_SUCCESS);
    EXPECT_EQ(sim::JournalCount("SecTask"), 0U);
    EXPECT_EQ(sim::JournalCount("ProcessExitSource.create"), 0U);
}

TEST_F(HelperServerCheckIn, ChecksTheNextBearerOfAProcessIdAfresh) {
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    client.die();
    sim::GrantToGroup(kEntitledGroup, kAllowed, PropertyList(std::int64_t{1}));
    TestClient next(client.identity.pid);
    EXPECT_EQ(next.checkIn(), KERN_INVALID_SECURITY);
    sim::GrantToGroup(kEntitledGroup, kAllowed, PropertyList("true"));
    EXPECT_EQ(next.checkIn(), KERN_INVALID_SECURITY);
}

TEST_F(HelperServerCheckIn, AcceptsTwoClientsOfOneProcess) {
    TestClient again(client.identity.pid);
    ASSERT_EQ(client.checkIn(), KERN_SUCCESS);
    ASSERT_EQ(again.checkIn(), KERN_SUCCESS);
    client.closeAll();
    sim::Settle();
    EXPECT_EQ(server->clients.size(), 1U);
    EXPECT_EQ(again.codeOf(messages::Request(2)), KERN_SUCCESS);
}

// Everything, with each call failing in turn.

/// Creates a server, checks in and sends a request; true when all of it went well.
bool CreateCheckInAndAsk(TestClient& client) {
    MobileHelperServer* const server = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
    if (server == nullptr) {
        return false;
    }
    const bool isServed =
        client.checkIn() == KERN_SUCCESS && client.codeOf(messages::Request(2)) == KERN_SUCCESS;
    EXPECT_EQ(server->clients.size(), client.privatePort.isOpen() ? 1U : 0U);
    EXPECT_EQ(sim::PortNames(), 1 + 2 * server->clients.size());
    MobileHelperServerDestroy(server);
    return isServed;
}

TEST(HelperServerSweep, LosesNothingWhicheverCallFails) {
    bool isServed = false;
    for (unsigned n = 1; !isServed && n < 100; ++n) {
        sim::Reset();
        TestClient::entitleGroup();
        sim::FailCall(n);
        TestClient client;
        isServed = CreateCheckInAndAsk(client);
        // A process that cannot be watched is served all the same, and not remembered.
        const bool isHarmless =
            sim::FailedCall().empty() || sim::FailedCall() == "ProcessExitSource.create";
        EXPECT_EQ(isServed, isHarmless) << sim::FailedCall();
        isServed = isServed && sim::FailedCall().empty();
        EXPECT_EQ(sim::PortNames(), 0U) << sim::FailedCall();
        EXPECT_EQ(sim::OpenDescriptors(), 0U) << sim::FailedCall();
    }
    EXPECT_TRUE(isServed);
}

}  // namespace
