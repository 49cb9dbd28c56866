#include "heartbeat/HeartbeatMonitor.h"

#include <gtest/gtest.h>

#include <bit>

#include "Helper/Shared/Server/HelperServerUtils.h"
#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimClient.h"
#include "platform/sim/SimEcho.h"
#include "tests/support/TestClient.h"

namespace {

/// The real server in a simulated world, and a client that asks it for heartbeats.
class Heartbeat : public testing::Test {
protected:
    Heartbeat() {
        sim::Reset();
        TestClient::entitleGroup();
        forgetMonitor();
        server_ = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
        server_->runLoop = &platform::RunLoop::current();
        EXPECT_EQ(client_.checkIn(), 0);
    }

    ~Heartbeat() override {
        MobileHelperServerDestroy(server_);
        sim::EndDaemon();
        EXPECT_EQ(sim::OpenEchoSockets(), 0U);
        forgetMonitor();
    }

    static void forgetMonitor() {
        TheHeartbeatMonitor().timer = nullptr;
        TheHeartbeatMonitor().hold = 0;
        TheHeartbeatMonitor().server = nullptr;
    }

    /// Sends routine 13. A beat that waits lets everything else go on, scripted events too, and
    /// ends before the run that it began in.
    void enable(std::int32_t isEnabled) {
        auto request = messages::Request(13);
        messages::Put(request, 32, isEnabled);
        ASSERT_TRUE(client_.privatePort.send(request));
    }

    [[nodiscard]] platform::kern_return_t answer() {
        const auto reply = client_.privatePort.receive();
        return reply ? messages::CodeOf(reply->bytes) : kNoReply;
    }

    /// Runs on the heartbeat queue, as requests of other servers would.
    static void onQueue(std::function<void()> task) {
        TheHeartbeatMonitor().queue.async(std::move(task));
        sim::Settle();
    }

    static void muteGateway() {
        sim::SetEchoGateway([](const sim::SentEcho&) { return std::vector<sim::EchoAnswer>(); });
    }

    static void delayReplies(double seconds) {
        sim::SetEchoGateway([seconds](const sim::SentEcho& request) {
            return std::vector{
                sim::EchoAnswer{.delay = seconds, .datagram = sim::EchoReplyTo(request)}};
        });
    }

    /// When the requests went out.
    static std::vector<double> beats() {
        std::vector<double> times;
        for (const auto& echo : sim::SentEchoes()) {
            times.push_back(echo.time);
        }
        return times;
    }

    static void expectBeats(const std::vector<double>& expected) {
        const auto times = beats();
        ASSERT_EQ(times.size(), expected.size());
        for (std::size_t i = 0; i < times.size(); ++i) {
            EXPECT_NEAR(times[i], expected[i], 6e-6) << "beat " << i;
        }
    }

    MobileHelperServer* server_ = nullptr;
    TestClient client_;
};

TEST_F(Heartbeat, HasItsQueueFromTheStartOfTheProcess) {
    EXPECT_EQ(TheHeartbeatMonitor().queue.label(), "com.vendra.otaheartbeat");
    EXPECT_EQ(TheHeartbeatMonitor().queue.service(), platform::QualityOfService::kDefault);
    EXPECT_EQ(TheHeartbeatMonitor().timer, nullptr);
}

TEST_F(Heartbeat, BeatsTwiceAtOnceAndThenEveryTwoSeconds) {
    delayReplies(0);
    enable(1);
    sim::RunFor(8.5);
    EXPECT_EQ(answer(), 0);
    expectBeats({0, 0, 2, 4, 6, 8});
    EXPECT_EQ(sim::JournalCount("SerialQueue.repeat com.vendra.otaheartbeat"), 1U);
}

TEST_F(Heartbeat, IsOnForAnyNumberButZero) {
    for (const std::int32_t isEnabled : {1, -1, 7, INT32_MIN}) {
        enable(isEnabled);
        sim::RunFor(1);
        EXPECT_NE(TheHeartbeatMonitor().timer, nullptr) << isEnabled;
        enable(0);
        sim::RunFor(1);
        EXPECT_EQ(TheHeartbeatMonitor().timer, nullptr);
    }
    EXPECT_EQ(server_->holdMask, 0U);
}

TEST_F(Heartbeat, AnswersWhileTheFirstBeatWaits) {
    muteGateway();
    enable(1);
    auto code = kNoReply;
    sim::At(0.1, [&] {
        code = answer();
        EXPECT_EQ(TheHeartbeatMonitor().hold, 0U) << "the hold comes behind the first beat";
    });
    sim::RunFor(1);
    EXPECT_EQ(code, 0);
    EXPECT_NE(TheHeartbeatMonitor().hold, 0U);
}

TEST_F(Heartbeat, MergesTheTicksThatABeatTakes) {
    muteGateway();
    enable(1);
    sim::At(11, [] { delayReplies(0); });
    sim::RunFor(15);
    // Each beat lasts two seconds: the second, due at the start, is merged with the tick of 2 s.
    expectBeats({0, 2, 4, 6, 8, 10, 12, 14});
}

TEST_F(Heartbeat, KeepsUpWithBeatsThatAreShorterThanTheInterval) {
    delayReplies(1.9);
    enable(1);
    sim::At(8, [] { delayReplies(0); });
    sim::RunFor(15);
    // One behind the other, until the two that were due at the start are caught up with.
    expectBeats({0, 1.9, 3.8, 5.7, 7.6, 9.5, 10, 12, 14});
}

TEST_F(Heartbeat, HoldsTheServerFromStartToStop) {
    enable(1);
    sim::RunFor(1);
    EXPECT_EQ(std::popcount(server_->holdMask), 1);
    EXPECT_EQ(TheHeartbeatMonitor().hold, server_->holdMask);
    EXPECT_EQ(TheHeartbeatMonitor().server, server_);
    enable(0);
    sim::RunFor(1);
    EXPECT_EQ(server_->holdMask, 0U);
    EXPECT_EQ(TheHeartbeatMonitor().hold, 0U);
    EXPECT_EQ(TheHeartbeatMonitor().timer, nullptr);
    const auto count = beats().size();
    sim::RunFor(10);
    EXPECT_EQ(beats().size(), count);
}

TEST_F(Heartbeat, KeepsTheProcessAliveWithoutAnyClient) {
    enable(1);
    sim::RunFor(1);
    client_.die();
    sim::RunFor(60);
    EXPECT_EQ(server_->idleTimer, nullptr);
    EXPECT_EQ(server_->stopRequested, 0U);
    onQueue([this] { HeartbeatStop(server_); });
    EXPECT_NE(server_->idleTimer, nullptr);
    sim::RunFor(10.1);
    EXPECT_EQ(server_->stopRequested, 1U);
}

TEST_F(Heartbeat, StartedTwiceLeavesAHoldForGood) {
    enable(1);
    sim::RunFor(1);
    enable(1);
    sim::RunFor(1);
    EXPECT_EQ(std::popcount(server_->holdMask), 2);
    enable(0);
    sim::RunFor(1);
    EXPECT_EQ(std::popcount(server_->holdMask), 1);
    enable(0);
    client_.die();
    sim::RunFor(60);
    EXPECT_EQ(std::popcount(server_->holdMask), 1);
    EXPECT_EQ(server_->stopRequested, 0U);
}

TEST_F(Heartbeat, StartedTwiceBeatsInOneRhythm) {
    delayReplies(0);
    enable(1);
    sim::RunFor(3);
    enable(1);
    sim::RunFor(4.5);
    expectBeats({0, 0, 2, 3, 3, 5, 7});
}

TEST_F(Heartbeat, StartedMoreOftenThanThereAreHoldsLosesNothing) {
    for (int i = 0; i < 40; ++i) {
        enable(1);
        sim::RunFor(0.2);
    }
    EXPECT_EQ(server_->holdMask, 0xFFFFFFFFU);
    enable(0);
    sim::RunFor(1);
    EXPECT_EQ(server_->holdMask, 0xFFFFFFFEU) << "the last token was the first one's again";
    EXPECT_EQ(TheHeartbeatMonitor().hold, 0U);
}

TEST_F(Heartbeat, StoppedWhileStoppedChangesNothing) {
    const std::uint32_t other = ServerHoldAcquire(server_);
    enable(0);
    sim::RunFor(1);
    EXPECT_EQ(answer(), 0);
    EXPECT_EQ(server_->holdMask, other);
    EXPECT_EQ(server_->idleTimer, nullptr);
    EXPECT_TRUE(beats().empty());
}

TEST_F(Heartbeat, StopsBehindTheBeatThatIsUnderWay) {
    muteGateway();
    enable(1);
    sim::At(0.5, [this] { enable(0); });
    sim::RunFor(10);
    EXPECT_EQ(answer(), 0);
    EXPECT_EQ(answer(), 0);
    expectBeats({0});
    EXPECT_EQ(server_->holdMask, 0U);
}

TEST_F(Heartbeat, WithoutAServerIsNotStarted) {
    onQueue([] { HeartbeatStart(nullptr); });
    EXPECT_TRUE(beats().empty());
    EXPECT_EQ(TheHeartbeatMonitor().timer, nullptr);
    EXPECT_EQ(server_->holdMask, 0U);
    EXPECT_EQ(server_LFMobileHelperSetHeartbeatEnabled(0x7777, 1), 0);
    sim::Settle();
    EXPECT_TRUE(beats().empty());
}

TEST_F(Heartbeat, IsStoppedWithoutAServerAndKeepsItsHold) {
    enable(1);
    sim::RunFor(1);
    onQueue([] { HeartbeatStop(nullptr); });
    EXPECT_EQ(TheHeartbeatMonitor().timer, nullptr);
    EXPECT_EQ(TheHeartbeatMonitor().hold, 0U);
    EXPECT_EQ(std::popcount(server_->holdMask), 1);
}

TEST_F(Heartbeat, IsStoppedOnTheServerOfTheStop) {
    MobileHelperServer other;
    other.holdMask = 0b11;
    enable(1);
    sim::RunFor(1);
    onQueue([&] { HeartbeatStop(&other); });
    EXPECT_EQ(other.holdMask, 0b10U);
    EXPECT_EQ(std::popcount(server_->holdMask), 1);
}

TEST_F(Heartbeat, IsStoppedByTheEndOfTheProcess) {
    enable(1);
    sim::RunFor(1);
    HeartbeatCleanUp();
    EXPECT_NE(TheHeartbeatMonitor().timer, nullptr) << "it does not wait for the stop";
    sim::Settle();
    EXPECT_EQ(TheHeartbeatMonitor().timer, nullptr);
    EXPECT_EQ(server_->holdMask, 0U) << "released on the server that it was started on";
}

TEST_F(Heartbeat, WithoutATimerBeatsOnceAndHoldsUntilTheStop) {
    sim::FailCall("SerialQueue.repeat", 1);
    enable(1);
    sim::RunFor(5);
    expectBeats({0});
    EXPECT_EQ(std::popcount(server_->holdMask), 1);
    enable(0);
    sim::RunFor(1);
    EXPECT_EQ(server_->holdMask, 0U);
}

TEST_F(Heartbeat, LogsNothingWhateverBecomesOfIt) {
    enable(1);
    for (const char* call : {"CopyHostText", "ProtocolByName", "EchoSocket.open", "GetTimeOfDay"}) {
        sim::FailCall(call, 1);
        sim::RunFor(4);
        EXPECT_EQ(sim::FailedCall(), call);
    }
    EXPECT_TRUE(sim::UnifiedLog().empty());
    EXPECT_TRUE(sim::SystemLogLines().empty());
    EXPECT_EQ(std::popcount(server_->holdMask), 1);
}

}  // namespace
