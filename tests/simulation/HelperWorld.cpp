#include "tests/simulation/HelperWorld.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include "Helper/Shared/Server/RequestProtocol.h"

using namespace platform;

HelperWorld::HelperWorld(std::uint64_t seed, const Shape& shape, Happenings& happened)
    : shape_(shape), happened_(happened) {
    sim::Reset(seed);
    TestClient::entitleGroup();
    isOnGrid_ = Chance(50);
    sim::InterleaveAtCalls(!isOnGrid_ && Chance(50));
}

void HelperWorld::live() {
    scriptClients();
    scriptServices();
    sim::WatchSteps([this] { checkInvariants(); });
    sim::At(shape_.scriptEnd, [this] { killClients(); });
    sim::At(shape_.worldEnd, [this] {
        EXPECT_TRUE(server_ == nullptr || mayStay()) << "nothing keeps it, and it stays";
        terminate();
    });
    while (!testing::Test::HasFailure()) {
        sim::RunOthersUntil(
            [this] { return isOver_ || sim::WaitingConnections(kServiceName) != 0; });
        if (sim::WaitingConnections(kServiceName) == 0) {
            break;
        }
        liveOnce();
    }
    expectEverybodyServed();
    sim::InterleaveAtCalls(false);
}

double HelperWorld::randomSeconds(double most) const {
    const double seconds = most * static_cast<double>(sim::Random(1'000'001)) / 1'000'000.0;
    return isOnGrid_ ? std::ceil(seconds * 2) / 2 : seconds;
}

void HelperWorld::scriptClients() {
    const std::uint64_t count = 1 + sim::Random(shape_.clientsMax);
    for (std::uint64_t i = 0; i < count; ++i) {
        const bool isEntitled = Chance(80);
        clients_.push_back(std::make_unique<PatientClient>(
            static_cast<std::int32_t>(100 + i), isEntitled ? kEntitledGroup : kOtherGroup));
        PatientClient& client = *clients_.back();
        sim::At(randomSeconds(0.8 * shape_.scriptEnd), [this, &client, isEntitled] {
            client.checkIn([this, &client, isEntitled](kern_return_t code) {
                checkedIn(client, isEntitled, code);
            });
            if (Chance(5)) {
                client.client.watch.close();
                ++happened_.deadOnArrival;
                hadDeadWatchPort_ = true;
            }
        });
    }
}

void HelperWorld::scriptServices() {
    for (int i = 0; i < 4; ++i) {
        sim::At(randomSeconds(shape_.scriptEnd), [] { sim::SetBasebandBusy(Chance(50)); });
    }
    if (Chance(20)) {
        sim::At(randomSeconds(shape_.scriptEnd), [this] { terminate(); });
    }
}

void HelperWorld::checkedIn(PatientClient& client, bool isEntitled, kern_return_t code) {
    if (code == KERN_SUCCESS) {
        EXPECT_TRUE(isEntitled);
        sim::In(randomSeconds(Chance(50) ? shape_.lifeMax / 6 : shape_.lifeMax),
                [&client] { client.die(); });
        ask(client);
    } else {
        ++happened_.refusals;
        EXPECT_EQ(code, isEntitled ? KERN_FAILURE : KERN_INVALID_SECURITY);
        EXPECT_TRUE(!isEntitled || hadDeadWatchPort_);
    }
}

/// One request after the other, good ones and bad ones, until the client dies.
void HelperWorld::ask(PatientClient& client) {
    sim::In(randomSeconds(shape_.pauseMax), [this, &client] {
        const Question question = nextQuestion();
        if (client.client.privatePort.send(question.message)) {
            sim::In(0.001, [this, &client, code = question.code] { readAnswer(client, code); });
        }
    });
}

void HelperWorld::readAnswer(PatientClient& client, kern_return_t code) {
    const auto reply = client.client.privatePort.receive();
    if (reply.has_value()) {
        EXPECT_EQ(messages::CodeOf(reply->bytes), code);
        ++happened_.answers;
        ask(client);
    } else {
        // Only a client that is gone, or a daemon that was told to go, leaves a question open.
        EXPECT_TRUE(client.client.privatePort.isHungUp() ||
                    (server_ != nullptr && server_->stopRequested != 0));
    }
}

void HelperWorld::liveOnce() {
    server_ = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
    ASSERT_NE(server_, nullptr);
    wasToldToEnd_ = false;
    if (Chance(50)) {
        MobileHelperServerSetIdleHandler(
            server_, [this] { return sim::Now() < shape_.scriptEnd && Chance(30); });
    }
    EXPECT_EQ(MobileHelperServerRun(server_), RunLoopResult::kStopped);
    ++happened_.instances;
    if (!wasToldToEnd_) {
        ++happened_.idleExits;
        EXPECT_EQ(server_->holdMask, 0U);
        EXPECT_TRUE(server_->clients.empty());
    }
    MobileHelperServerDestroy(std::exchange(server_, nullptr));
    EXPECT_EQ(sim::PortNames(), 0U);
    sim::EndDaemon();
    EXPECT_EQ(sim::AllocatedMemory(), 0U);
    EXPECT_EQ(sim::OpenDescriptors(), 0U);
    instanceEnded();
}

void HelperWorld::terminate() {
    if (server_ != nullptr) {
        wasToldToEnd_ = true;
        MobileHelperServerStop(server_);
    }
}

void HelperWorld::killClients() {
    for (const auto& client : clients_) {
        // An instance that was told to end may still wait for a queue's task to end.
        const bool isEnding = server_ == nullptr || server_->stopRequested != 0;
        if (!client->isAnswered() && isEnding) {
            diedWaiting_.insert(client.get());
        }
        client->die();
    }
    scriptEnded();
}

void HelperWorld::checkInvariants() {
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
    checkMore();
}

/// Exactly the service's port and two of each client lead to the server.
void HelperWorld::checkPortTable() {
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

void HelperWorld::expectEverybodyServed() const {
    for (const auto& client : clients_) {
        EXPECT_TRUE(client->isAnswered() || diedWaiting_.contains(client.get()))
            << client->client.identity.pid;
        happened_.connectedAgain += client->connections() > 1 ? 1 : 0;
    }
}
