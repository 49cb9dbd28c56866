// Clients that hold, flood, starve or ignore the daemon; an honest one beside them is served.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <filesystem>
#include <fstream>
#include <thread>

#include "tests/support/PhoneRoot.h"

namespace {

using platform::OwnedFd;

constexpr std::int32_t kLinkCarrierBundle = 8683558;

[[nodiscard]] bool IsServed(const phone::Client& client) {
    return client.callTexts(kLinkCarrierBundle, {"/a", "/refused", ""}) == 8;
}

std::size_t OpenDescriptors(const phone::Daemon& daemon) {
    const std::filesystem::directory_iterator folder("/proc/" + std::to_string(daemon.pid()) +
                                                     "/fd");
    return static_cast<std::size_t>(std::distance(begin(folder), end(folder)));
}

/// How often the daemon went to sleep, over all of its threads: every wake-up ends in one.
std::uint64_t Sleeps(const phone::Daemon& daemon) {
    std::uint64_t sum = 0;
    for (const auto& task :
         std::filesystem::directory_iterator("/proc/" + std::to_string(daemon.pid()) + "/task")) {
        std::ifstream status(task.path() / "status");
        for (std::string line; std::getline(status, line);) {
            const std::string name = "voluntary_ctxt_switches:";
            sum += line.starts_with(name) ? std::stoull(line.substr(name.size())) : 0;
        }
    }
    return sum;
}

/// Processor time that the daemon has used, in clock ticks: a loop that spins uses all there is.
long ProcessorTicks(const phone::Daemon& daemon) {
    std::ifstream file("/proc/" + std::to_string(daemon.pid()) + "/stat");
    std::string word;
    long ticks = 0;
    for (int field = 1; field <= 15 && file >> word; ++field) {
        ticks += field >= 14 ? std::stol(word) : 0;
    }
    return ticks;
}

/// True when the daemon hardly runs during a second.
bool Rests(const phone::Daemon& daemon) {
    const long before = ProcessorTicks(daemon);
    std::this_thread::sleep_for(std::chrono::seconds(1));
    return ProcessorTicks(daemon) - before < sysconf(_SC_CLK_TCK) / 10;
}

/// Connects again and again as a user; what the daemon closes stays in the list.
std::vector<phone::Connection> ConnectMany(std::size_t count, uid_t user) {
    std::vector<phone::Connection> connections;
    for (std::size_t i = 0; i < count; ++i) {
        connections.push_back(phone::Connection::toService(user, user));
    }
    return connections;
}

class UnfriendlyClients : public testing::Test {
protected:
    phone::Daemon daemon_;
    phone::Client honest_ = phone::Client::checkIn();
};

TEST_F(UnfriendlyClients, SilentConnectionsOfOneUserAreFew) {
    const auto before = OpenDescriptors(daemon_);
    const auto silent = ConnectMany(1000, phone::kMobileUser);
    EXPECT_TRUE(IsServed(honest_));
    EXPECT_EQ(phone::Client::checkIn().code, 0);
    EXPECT_TRUE(phone::Eventually([&] { return OpenDescriptors(daemon_) <= before + 64 + 2; }));
}

TEST_F(UnfriendlyClients, SilentConnectionsOfManyUsersAreLimitedTogether) {
    const auto before = OpenDescriptors(daemon_);
    std::vector<std::vector<phone::Connection>> silent;
    for (uid_t user = 2000; user < 2020; ++user) {
        silent.push_back(ConnectMany(50, user));
    }
    EXPECT_TRUE(IsServed(honest_));
    EXPECT_EQ(phone::Client::checkIn().code, 0);
    EXPECT_TRUE(phone::Eventually([&] { return OpenDescriptors(daemon_) <= before + 512 + 2; }));
    EXPECT_GT(OpenDescriptors(daemon_), before + 400) << "and not closed without need";
}

TEST_F(UnfriendlyClients, OldestOfTheGreediestUserIsClosed) {
    const auto modest = phone::Connection::toService(2100, 2100);
    std::vector<std::vector<phone::Connection>> silent;
    for (uid_t user = 2000; user < 2012; ++user) {
        silent.push_back(ConnectMany(60, user));
    }
    EXPECT_TRUE(silent.front().front().receive().isEnd());
    EXPECT_EQ(modest.call(phone::Message(1, 24)).code(), -303) << "who holds one keeps it";
}

TEST_F(UnfriendlyClients, RepliesThatNobodyReadsHoldUpOnlyTheirReader) {
    const auto deaf = phone::Client::checkIn();
    ASSERT_EQ(fcntl(deaf.privatePort.get(), F_SETFL, O_NONBLOCK), 0);
    int sent = 0;
    while (sent < 100'000 && deaf.privatePort.send(phone::Message(1, 24))) {
        ++sent;
    }
    EXPECT_LT(sent, 100'000) << "the daemon stops reading";
    EXPECT_TRUE(IsServed(honest_));
    ASSERT_EQ(fcntl(deaf.privatePort.get(), F_SETFL, 0), 0);
    for (int i = 0; i < sent; ++i) {
        ASSERT_EQ(deaf.privatePort.receive().code(), -303) << i;
    }
}

TEST_F(UnfriendlyClients, ClosedPrivatePortStaysAClientUntilItsWatchPortEnds) {
    phone::Daemon daemon({.program = phone::ProgramPath("LinefoldMobileHelper-brisk")});
    auto half = phone::Client::checkIn();
    half.privatePort.close();
    EXPECT_TRUE(Rests(daemon)) << "its end is noticed once";
    EXPECT_TRUE(daemon.isRunning());
    half.watch.reset();
    EXPECT_EQ(daemon.waitForExit(), 0);
}

TEST_F(UnfriendlyClients, FloodedWatchPortWakesNobody) {
    std::array<int, 2> ends{};
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends.data()), 0);
    const OwnedFd kept(ends[0]);
    OwnedFd passed(ends[1]);
    const auto reply =
        phone::Connection::toService().call(phone::CheckInMessage(), std::array{passed.get()});
    ASSERT_TRUE(reply.descriptor.isOpen());
    passed.reset();
    const auto before = Sleeps(daemon_);
    const std::array<char, 4096> flood{};
    while (write(kept.get(), flood.data(), flood.size()) > 0) {
    }
    EXPECT_LE(Sleeps(daemon_), before + 2);
    EXPECT_TRUE(IsServed(honest_));
}

TEST_F(UnfriendlyClients, IdleMeansNoWakeUp) {
    ASSERT_TRUE(IsServed(honest_));
    std::this_thread::sleep_for(std::chrono::milliseconds(200));
    const auto before = Sleeps(daemon_);
    std::this_thread::sleep_for(std::chrono::seconds(3));
    EXPECT_EQ(Sleeps(daemon_), before);
}

TEST_F(UnfriendlyClients, HalfAMessageClosesOnlyItsOwnConnection) {
    const auto broken = phone::Client::checkIn();
    EXPECT_TRUE(broken.privatePort.call(phone::Bytes(23)).isEnd());
    EXPECT_TRUE(phone::Connection::toService().call(phone::Bytes(1)).isEnd());
    EXPECT_TRUE(IsServed(honest_));
}

TEST(DescriptorExhaustion, LeavesTheClientsThatAreInServed) {
    phone::Daemon daemon({.descriptors = 128});
    std::vector<phone::Client> clients;
    for (int i = 0; i < 200; ++i) {
        clients.push_back(phone::Client::checkIn());
    }
    EXPECT_TRUE(IsServed(clients.front()));
    EXPECT_NE(clients.back().code, 0) << "there is an end to it";
    EXPECT_LE(OpenDescriptors(daemon), 128U - 64U)
        << "some are kept back for the daemon's own work";
    clients.resize(5);
    EXPECT_TRUE(phone::Eventually([] { return phone::Client::checkIn().code == 0; }))
        << "room again";
    EXPECT_TRUE(IsServed(clients.front()));
}

TEST(DescriptorExhaustion, IsNeverSpunOn) {
    phone::Daemon daemon({.descriptors = 128});
    const auto honest = phone::Client::checkIn();
    std::vector<phone::Client> clients;
    for (int i = 0; i < 100; ++i) {
        clients.push_back(phone::Client::checkIn());
    }
    EXPECT_TRUE(Rests(daemon));
    EXPECT_TRUE(IsServed(honest));
}

}  // namespace
