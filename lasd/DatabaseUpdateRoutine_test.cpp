#include "Helper/Shared/Server/HelperServerUtils.h"
#include "Helper/Shared/Server/RequestProtocol.h"
#include "lasd/Updater_test.h"
#include "tests/support/TestClient.h"

using namespace updater_test;

namespace {

messages::Bytes RequestFor(std::uint32_t mask) {
    auto message = messages::Request(14);
    messages::Put(message, 32, mask);
    return message;
}

/// The server with a client that asks for updates.
class DatabaseUpdateRoutine : public testing::Test {
protected:
    DatabaseUpdateRoutine() {
        sim::Reset();
        sim::OpenMessagePort(kPort);
        TestClient::entitleGroup();
        server = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
    }

    ~DatabaseUpdateRoutine() override { MobileHelperServerDestroy(server); }

    /// The client asks so often in the first second, and dies later.
    void scriptClient(int requests, double death) {
        sim::At(0, [this] { client.sendCheckIn(); });
        sim::At(0.5, [this] {
            EXPECT_EQ(client.readCheckIn(), platform::KERN_SUCCESS);
            client.privatePort.setCapacity(1000);
        });
        for (int i = 0; i < requests; ++i) {
            sim::At(0.5 + 0.001 * i,
                    [this] { EXPECT_TRUE(client.privatePort.send(RequestFor(8))); });
        }
        sim::At(death, [this] { client.die(); });
    }

    /// The database's download takes so many seconds.
    static void serveSlowly(double seconds) {
        ServeIndex({Offer("gsm", "2")});
        sim::ServeUrl(kServer + "gsm.db.gz",
                      {.headers = {{"Content-Type", "application/gzip"}},
                       .body = Gzip("gsm 2"),
                       .delay = seconds});
    }

    double secondOfExit() {
        EXPECT_EQ(MobileHelperServerRun(server), platform::RunLoopResult::kStopped);
        return sim::Now();
    }

    MobileHelperServer* server = nullptr;
    TestClient client;
};

TEST_F(DatabaseUpdateRoutine, AnswersAtOnceAndTellsTheOutcomeLater) {
    serveSlowly(100);
    ASSERT_EQ(client.checkIn(), platform::KERN_SUCCESS);
    ASSERT_TRUE(client.privatePort.send(RequestFor(8)));
    sim::At(50, [this] {
        const auto reply = client.privatePort.receive();
        EXPECT_TRUE(reply && messages::CodeOf(reply->bytes) == platform::KERN_SUCCESS);
        EXPECT_EQ(Heard(), Words{});
    });
    sim::RunFor(101);
    EXPECT_EQ(Heard(), Words{"UpdateAvailable gsm"});
}

TEST_F(DatabaseUpdateRoutine, AnswersTheSameWhateverComesOfIt) {
    ASSERT_EQ(client.checkIn(), platform::KERN_SUCCESS);
    for (const std::uint32_t mask : {0U, 1U, 31U, 32U, 0x80000000U, 0xFFFFFFFFU}) {
        EXPECT_EQ(client.codeOf(RequestFor(mask)), platform::KERN_SUCCESS);
    }
    EXPECT_EQ(Heard(), Words(6, "UpdateFailed"));
}

TEST_F(DatabaseUpdateRoutine, ServesOthersMeanwhile) {
    serveSlowly(100);
    TestClient other(101);
    ASSERT_EQ(client.checkIn(), platform::KERN_SUCCESS);
    ASSERT_TRUE(client.privatePort.send(RequestFor(8)));
    sim::At(50, [&other] { other.sendCheckIn(); });
    auto code = kNoReply;
    sim::At(50.001, [&] { code = other.readCheckIn(); });
    sim::RunFor(101);
    EXPECT_EQ(code, platform::KERN_SUCCESS);
}

TEST_F(DatabaseUpdateRoutine, KeepsTheProcessUntilTenSecondsAfterTheDownload) {
    serveSlowly(100);
    scriptClient(1, 1.0);
    EXPECT_EQ(secondOfExit(), 110.5);
    EXPECT_EQ(Heard(), Words{"UpdateAvailable gsm"});
    EXPECT_EQ(server->holdMask, 0U);
}

TEST_F(DatabaseUpdateRoutine, KeepsTheProcessUntilTenSecondsAfterAFailure) {
    sim::ServeUrl(kIndexUrl, {.error = hvu::Http::ErrorType::kTimedOut, .delay = 30});
    scriptClient(1, 1.0);
    EXPECT_EQ(secondOfExit(), 40.5);
    EXPECT_EQ(Heard(), Words{"UpdateFailed"});
}

TEST_F(DatabaseUpdateRoutine, LeavesTheProcessToItsClientWhenTheCheckIsOver) {
    serveSlowly(5);
    scriptClient(1, 60.0);
    EXPECT_EQ(secondOfExit(), 70.0);
}

/// The 33rd request and those behind it share the first one's hold. It is kept as it is.
TEST_F(DatabaseUpdateRoutine, KeepsTheProcessForThirtyTwoRequestsAtOnce) {
    const auto index = ServeIndex({Offer("gsm", "2")});
    sim::ServeUrl(kIndexUrl, {.body = index, .delay = 20});
    scriptClient(32, 1.0);
    EXPECT_EQ(secondOfExit(), 0.5 + 32 * 20 + 10);
    EXPECT_EQ(Heard().size(), 32U);
}

TEST_F(DatabaseUpdateRoutine, MayLoseRequestsBehindTheFirstThirtyTwoAtTheIdleExit) {
    const auto index = ServeIndex({Offer("gsm", "2")});
    sim::ServeUrl(kIndexUrl, {.body = index, .delay = 20});
    scriptClient(40, 1.0);
    (void)secondOfExit();
    EXPECT_EQ(Heard().size(), 33U) << "the last one was under way when the timer fired";
}

TEST_F(DatabaseUpdateRoutine, WorksOffTwoHundredRequestsOfAClientThatStays) {
    const auto index = ServeIndex({Offer("gsm", "2")});
    sim::ServeUrl(kIndexUrl, {.body = index, .delay = 20});
    scriptClient(200, 5000.0);
    EXPECT_EQ(secondOfExit(), 5010.0);
    EXPECT_EQ(Heard().size(), 200U);
}

}  // namespace
