// Lives of the helper in random worlds: clients come, ask and die, work goes on behind their backs,
// the helper leaves when it is idle and is started again when somebody waits.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <memory>
#include <set>
#include <vector>

#include "Helper/Shared/Server/HelperServerUtils.h"
#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/SerialQueue.h"
#include "tests/simulation/PatientClient.h"
#include "tests/simulation/Seed.h"
#include "tests/support/RecordingHandlers.h"

using namespace platform;

namespace {

constexpr std::uint64_t kRounds = 4000;
constexpr double kScriptEnd = 150.0;
/// By then every round is over: the script, one idle interval, and a busy baseband's postponing.
constexpr double kWorldEnd = 400.0;

bool Chance(unsigned percent) {
    return sim::Random(100) < percent;
}

/// What happened in all rounds: a simulation in which nothing happens proves nothing.
struct Happenings {
    int instances = 0;
    int idleExits = 0;
    int answers = 0;
    int refusals = 0;
    int heldWork = 0;
    int deadOnArrival = 0;
    int connectedAgain = 0;
};

Happenings happened;

class World {
public:
    explicit World(std::uint64_t seed) {
        sim::Reset(seed);
        recording::Reset();
        TestClient::entitleGroup();
        isOnGrid_ = Chance(50);
        sim::InterleaveAtCalls(!isOnGrid_ && Chance(50));
        recording::NextAnswer().meanwhile = [this](const recording::Call& call) { work(call); };
        scriptClients();
        scriptServices();
        sim::WatchSteps([this] { checkInvariants(); });
        sim::At(kScriptEnd, [this] { end(); });
        sim::At(kWorldEnd, [this] { terminate(); });
    }

    World(const World&) = delete;
    World& operator=(const World&) = delete;

    ~World() { recording::Reset(); }

    /// The service manager's part: an instance whenever somebody waits, until all is over.
    void live() {
        while (!testing::Test::HasFailure()) {
            sim::RunOthersUntil(
                [this] { return isOver_ || sim::WaitingConnections(kServiceName) != 0; });
            if (sim::WaitingConnections(kServiceName) == 0) {
                break;
            }
            liveOnce();
        }
        expectEverybodyServed();
    }

private:
    /// Any instant; in every other world on a grid, where things fall on one instant with the exit.
    [[nodiscard]] double randomSeconds(double most) const {
        const double seconds = most * static_cast<double>(sim::Random(1'000'001)) / 1'000'000.0;
        return isOnGrid_ ? std::ceil(seconds * 2) / 2 : seconds;
    }

    void scriptClients() {
        const std::uint64_t count = 1 + sim::Random(8);
        for (std::uint64_t i = 0; i < count; ++i) {
            const bool isEntitled = Chance(80);
            clients_.push_back(std::make_unique<PatientClient>(
                static_cast<std::int32_t>(100 + i), isEntitled ? kEntitledGroup : kOtherGroup));
            PatientClient& client = *clients_.back();
            sim::At(randomSeconds(0.8 * kScriptEnd), [this, &client, isEntitled] {
                client.checkIn([this, &client, isEntitled](kern_return_t code) {
                    checkedIn(client, isEntitled, code);
                });
                if (Chance(5)) {
                    client.client.watch.close();
                    ++happened.deadOnArrival;
                    hadDeadWatchPort_ = true;
                }
            });
        }
    }

    void scriptServices() {
        for (int i = 0; i < 4; ++i) {
            sim::At(randomSeconds(kScriptEnd), [] { sim::SetBasebandBusy(Chance(50)); });
        }
        if (Chance(20)) {
            sim::At(randomSeconds(kScriptEnd), [this] { terminate(); });
        }
    }

    void checkedIn(PatientClient& client, bool isEntitled, kern_return_t code) {
        if (code == KERN_SUCCESS) {
            EXPECT_TRUE(isEntitled);
            sim::In(randomSeconds(Chance(50) ? 5.0 : 30.0), [&client] { client.die(); });
            ask(client);
        } else {
            ++happened.refusals;
            EXPECT_EQ(code, isEntitled ? KERN_FAILURE : KERN_INVALID_SECURITY);
            EXPECT_TRUE(!isEntitled || hadDeadWatchPort_);
        }
    }

    /// One request after the other, good ones and bad ones, until the client dies.
    void ask(PatientClient& client) {
        sim::In(randomSeconds(4.0), [this, &client] {
            struct Question {
                messages::Bytes message;
                kern_return_t code;
            };

            const std::vector<Question> questions{
                {messages::Request(2), KERN_SUCCESS},
                {messages::Request(13), KERN_SUCCESS},
                {messages::Request(14), KERN_SUCCESS},
                {messages::SetPreference("domain", "key", "value"), KERN_SUCCESS},
                {messages::Message(8683549, 287), MIG_BAD_ARGUMENTS},
                {messages::Message(8683573, 24), MIG_BAD_ID}};
            const Question& question = questions[sim::Random(questions.size())];
            if (client.client.privatePort.send(question.message)) {
                sim::In(0.001, [this, &client, code = question.code] { readAnswer(client, code); });
            }
        });
    }

    void readAnswer(PatientClient& client, kern_return_t code) {
        const auto reply = client.client.privatePort.receive();
        if (reply.has_value()) {
            EXPECT_EQ(messages::CodeOf(reply->bytes), code);
            ++happened.answers;
            ask(client);
        } else {
            // Only a client that is gone, or a daemon that was told to go, leaves a question open.
            EXPECT_TRUE(client.client.privatePort.isHungUp());
        }
    }

    /// Routines 13 and 14 go on working with a hold after they have answered.
    void work(const recording::Call& call) {
        if (call.number != 13 && call.number != 14) {
            return;
        }
        MobileHelperServer* const server = ServerForPort(call.port);
        const auto token = ServerHoldAcquire(server);
        ++happened.heldWork;
        const SerialQueue queue(call.number == 13 ? "com.vendra.otaheartbeat" : "LASDUpdater");
        queue.after(randomSeconds(15.0),
                    [server, token] { EXPECT_TRUE(ServerHoldRelease(server, token)); });
    }

    void liveOnce() {
        server_ = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
        ASSERT_NE(server_, nullptr);
        wasToldToEnd_ = false;
        if (Chance(50)) {
            MobileHelperServerSetIdleHandler(server_,
                                             [] { return sim::Now() < kScriptEnd && Chance(30); });
        }
        EXPECT_EQ(MobileHelperServerRun(server_), RunLoopResult::kStopped);
        ++happened.instances;
        if (!wasToldToEnd_) {
            ++happened.idleExits;
            EXPECT_EQ(server_->holdMask, 0U);
            EXPECT_TRUE(server_->clients.empty());
        }
        MobileHelperServerDestroy(std::exchange(server_, nullptr));
        EXPECT_EQ(sim::PortNames(), 0U);
        sim::EndDaemon();
        EXPECT_EQ(sim::AllocatedMemory(), 0U);
    }

    void terminate() {
        if (server_ != nullptr) {
            wasToldToEnd_ = true;
            MobileHelperServerStop(server_);
        }
    }

    void end() {
        for (const auto& client : clients_) {
            client->die();
        }
        isOver_ = true;
    }

    void checkInvariants() {
        if (server_ == nullptr) {
            return;
        }
        EXPECT_EQ(server_->clients.size(), server_->clientSources.size());
        checkPortTable();
        if (server_->idleTimer != nullptr) {
            EXPECT_EQ(server_->holdMask, 0U);
            EXPECT_TRUE(server_->clients.empty());
        }
        if (server_->stopRequested != 0 && !wasToldToEnd_) {
            EXPECT_EQ(server_->holdMask, 0U);
            EXPECT_TRUE(server_->clients.empty());
        }
    }

    /// Exactly the service's port and two of each client lead to the server.
    void checkPortTable() {
        const auto names = sim::ListPortNames();
        EXPECT_EQ(names.size(), 1 + 2 * server_->clients.size());
        for (const mach_port_t name : names) {
            EXPECT_EQ(ServerForPort(name), server_);
        }
        for (const mach_port_t name : seenNames_) {
            EXPECT_TRUE(std::ranges::find(names, name) != names.end() ||
                        ServerForPort(name) == nullptr);
        }
        seenNames_.insert(names.begin(), names.end());
    }

    void expectEverybodyServed() const {
        for (const auto& client : clients_) {
            EXPECT_TRUE(client->isAnswered()) << client->client.identity.pid;
            happened.connectedAgain += client->connections() > 1 ? 1 : 0;
        }
    }

    std::vector<std::unique_ptr<PatientClient>> clients_;
    MobileHelperServer* server_ = nullptr;
    std::set<mach_port_t> seenNames_;
    bool wasToldToEnd_ = false;
    bool hadDeadWatchPort_ = false;
    bool isOver_ = false;
    bool isOnGrid_ = false;
};

TEST(HelperLife, KeepsItsPromisesInRandomWorlds) {
    happened = {};
    ForEachSeed(kRounds, [](std::uint64_t seed) { World(seed).live(); });
    if (SeedToReplay() == 0 && !HasFailure()) {
        constexpr int kRoundsMade = static_cast<int>(kRounds);
        EXPECT_GT(happened.instances, kRoundsMade);
        EXPECT_GT(happened.idleExits, kRoundsMade);
        EXPECT_GT(happened.answers, kRoundsMade);
        EXPECT_GT(happened.refusals, 0);
        EXPECT_GT(happened.heldWork, kRoundsMade);
        EXPECT_GT(happened.deadOnArrival, 0);
        EXPECT_GT(happened.connectedAgain, 0);
    }
}

}  // namespace
