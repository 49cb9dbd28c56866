// The heartbeat through the real daemon, over real ICMP to the gateway, and captured there.
#include <gtest/gtest.h>

#include <cstring>
#include <ctime>
#include <fstream>

#include "tests/e2e/Gateway.h"
#include "tests/support/PhoneRoot.h"

namespace {

using gateway::Capture;
using gateway::Packet;

constexpr std::int32_t kSetHeartbeatEnabled = 8683562;
constexpr std::uint32_t kHost = 0xC0000201;             // 192.0.2.1
constexpr std::uint32_t kCellularAddress = 0xCB007102;  // 203.0.113.2
constexpr std::uint32_t kWifiAddress = 0xC6336402;      // 198.51.100.2

phone::Daemon::Options Brisk(std::vector<std::string> wrapper = {}) {
    return {.program = phone::ProgramPath("LinefoldMobileHelper-brisk"),
            .wrapper = std::move(wrapper)};
}

std::int32_t SetHeartbeat(const phone::Client& client, std::int32_t isEnabled) {
    auto request = phone::Message(kSetHeartbeatEnabled, 36);
    platform::Store(std::span<std::byte>(request), 32, isEnabled);
    return client.privatePort.call(request).code();
}

/// Longer than the brisk daemon needs to leave when nothing keeps it.
void WaitLongerThanTheIdleInterval() {
    const timespec pause{.tv_sec = 2, .tv_nsec = 0};
    nanosleep(&pause, nullptr);
}

void WaitAWhile() {
    const timespec pause{.tv_sec = 0, .tv_nsec = 300'000'000};
    nanosleep(&pause, nullptr);
}

/// The phone's network and a daemon in it; each test runs in a root of its own or after another.
class Heartbeat : public testing::Test {
protected:
    Heartbeat() { gateway::SetAnswering(true); }

    void expectRequest(const Packet& packet) {
        ASSERT_EQ(packet.message.size(), 48U);
        std::vector<std::byte> expected(48);
        expected[0] = std::byte{8};
        expected[4] = static_cast<std::byte>(daemon_.pid() >> 8 & 0xFF);
        expected[5] = static_cast<std::byte>(daemon_.pid() & 0xFF);
        std::memcpy(&expected[32], &packet.message[32], 12);  // the time of day is looked at below
        gateway::Seal(expected);
        EXPECT_EQ(packet.message, expected);
        std::int64_t seconds = 0;
        std::int32_t microseconds = 0;
        std::memcpy(&seconds, &packet.message[32], sizeof seconds);
        std::memcpy(&microseconds, &packet.message[40], sizeof microseconds);
        const double sent = static_cast<double>(seconds) + microseconds * 1e-6;
        EXPECT_LE(sent, packet.time);
        EXPECT_GT(sent, packet.time - 60);
        EXPECT_EQ(packet.destination, kHost);
    }

    phone::LogReader journal_ = phone::LogReader::journal();
    phone::LogReader systemLog_ = phone::LogReader::systemLog();
    phone::Daemon daemon_{Brisk()};
    phone::Client client_ = phone::Client::checkIn();
    Capture cellular_{"gcell0"};
    Capture wifi_{"gwlan0"};
};

TEST_F(Heartbeat, SendsTwoRequestsAtOnceAndThenOneEveryTwoSeconds) {
    ASSERT_EQ(SetHeartbeat(client_, 1), 0);
    ASSERT_TRUE(cellular_.has(4));
    ASSERT_EQ(SetHeartbeat(client_, 0), 0);
    const auto packets = cellular_.packets();
    for (const Packet& packet : packets) {
        expectRequest(packet);
        EXPECT_EQ(packet.source, kCellularAddress);
    }
    EXPECT_LT(packets[1].time - packets[0].time, 1);
    EXPECT_GT(packets[2].time - packets[1].time, 1);
    EXPECT_GT(packets[3].time - packets[2].time, 1);
    EXPECT_TRUE(wifi_.packets().empty()) << "where the routes lead";
    EXPECT_TRUE(journal_.take().empty());
    EXPECT_TRUE(systemLog_.take().empty());
}

TEST_F(Heartbeat, GoesOnWithoutItsClientUntilAnotherStopsIt) {
    ASSERT_EQ(SetHeartbeat(client_, 1), 0);
    client_.die();
    WaitLongerThanTheIdleInterval();
    ASSERT_TRUE(cellular_.has(3));
    EXPECT_TRUE(daemon_.isRunning());
    auto other = phone::Client::checkIn();
    EXPECT_EQ(SetHeartbeat(other, 0), 0);
    other.die();
    EXPECT_EQ(daemon_.waitForExit(), 0);
    const auto count = cellular_.packets().size();
    WaitLongerThanTheIdleInterval();
    EXPECT_EQ(cellular_.packets().size(), count);
}

TEST_F(Heartbeat, StartedTwiceKeepsTheProcessForGood) {
    ASSERT_EQ(SetHeartbeat(client_, 1), 0);
    ASSERT_EQ(SetHeartbeat(client_, 1), 0);
    ASSERT_TRUE(cellular_.has(3));
    ASSERT_EQ(SetHeartbeat(client_, 0), 0);
    ASSERT_EQ(SetHeartbeat(client_, 0), 0);
    client_.die();
    WaitLongerThanTheIdleInterval();
    EXPECT_TRUE(daemon_.isRunning());
    daemon_.signal(SIGTERM);
    EXPECT_EQ(daemon_.waitForExit(), 0);
}

TEST_F(Heartbeat, StoppedWhileStoppedChangesNothing) {
    ASSERT_EQ(SetHeartbeat(client_, 0), 0);
    ASSERT_EQ(SetHeartbeat(client_, 0), 0);
    client_.die();
    EXPECT_EQ(daemon_.waitForExit(), 0);
    EXPECT_TRUE(cellular_.packets().empty());
}

TEST_F(Heartbeat, AnswersAndEndsWhileABeatWaitsForAMuteGateway) {
    gateway::SetAnswering(false);
    ASSERT_EQ(SetHeartbeat(client_, 1), 0);
    ASSERT_TRUE(cellular_.has(1));
    EXPECT_EQ(SetHeartbeat(client_, 0), 0);
    EXPECT_EQ(SetHeartbeat(client_, 1), 0);
    ASSERT_TRUE(cellular_.has(2));
    const auto packets = cellular_.packets();
    EXPECT_GT(packets[1].time - packets[0].time, 1) << "each waits for a reply";
    daemon_.signal(SIGTERM);
    EXPECT_EQ(daemon_.waitForExit(), 0);
}

TEST_F(Heartbeat, SkipsRepliesOfOthersAndShortOnes) {
    gateway::SetAnswering(false);
    const gateway::Responder responder;
    ASSERT_EQ(SetHeartbeat(client_, 1), 0);
    ASSERT_TRUE(cellular_.has(1));
    const Packet request = cellular_.packets().front();
    auto foreign = gateway::ReplyTo(request);
    foreign[5] ^= std::byte{0xFF};
    auto shortOne = gateway::ReplyTo(request);
    shortOne.pop_back();
    auto otherType = gateway::ReplyTo(request);
    otherType[0] = std::byte{14};
    for (const auto& message : {foreign, shortOne, otherType}) {
        responder.send(request, message);
    }
    WaitAWhile();
    EXPECT_EQ(cellular_.packets().size(), 1U) << "the second beat waits for the first";
    auto longOne = gateway::ReplyTo(request);
    longOne.resize(1000);
    longOne[6] = std::byte{1};
    responder.send(request, longOne);
    ASSERT_TRUE(cellular_.has(2)) << "any length, sequence and payload will do";
}

TEST_F(Heartbeat, TakesWhateverLeadsToTheHostWhenTheInterfaceIsRenamed) {
    ASSERT_EQ(SetHeartbeat(client_, 1), 0);
    ASSERT_TRUE(cellular_.has(2));
    gateway::Run("ip link set pdp_ip0 down && ip link set pdp_ip0 name other0");
    ASSERT_TRUE(wifi_.has(1));
    expectRequest(wifi_.packets().front());
    EXPECT_EQ(wifi_.packets().front().source, kWifiAddress);
    gateway::Run(
        "ip link set other0 name pdp_ip0 && ip link set pdp_ip0 up &&"
        " ip route add default via 203.0.113.1 dev pdp_ip0 metric 600");
    ASSERT_TRUE(cellular_.has(cellular_.packets().size() + 1));
}

TEST_F(Heartbeat, SurvivesTheEndOfTheInterface) {
    ASSERT_EQ(SetHeartbeat(client_, 1), 0);
    ASSERT_TRUE(cellular_.has(2));
    gateway::Run("ip link del pdp_ip0");
    ASSERT_TRUE(wifi_.has(1));
    gateway::Run("ip link del wlan0");
    WaitLongerThanTheIdleInterval();
    EXPECT_EQ(SetHeartbeat(client_, 0), 0) << "no route at all";
    client_.die();
    EXPECT_EQ(daemon_.waitForExit(), 0);
    EXPECT_TRUE(journal_.take().empty());
}

TEST_F(Heartbeat, LivesOnWhereNoEchoSocketMayBeOpened) {
    std::string range;
    std::getline(std::ifstream("/proc/sys/net/ipv4/ping_group_range"), range);
    gateway::Run("echo 1 0 >/proc/sys/net/ipv4/ping_group_range");
    ASSERT_EQ(SetHeartbeat(client_, 1), 0);
    WaitLongerThanTheIdleInterval();
    EXPECT_TRUE(cellular_.packets().empty());
    gateway::Run("echo '" + range + "' >/proc/sys/net/ipv4/ping_group_range");
    ASSERT_TRUE(cellular_.has(1));
    EXPECT_TRUE(journal_.take().empty());
}

/// The calls that a trace shows of the thread that probes, without their arguments' ends.
std::vector<std::string> CallsBehind(const std::string& trace, const std::string& injected) {
    std::vector<std::string> calls;
    std::ifstream file(trace);
    bool isBehind = false;
    for (std::string line; std::getline(file, line);) {
        if (isBehind && calls.size() < 2) {
            calls.push_back(line.substr(line.find_first_not_of("0123456789 ")));
        }
        isBehind = isBehind || line.find(injected) != std::string::npos;
    }
    return calls;
}

TEST(HeartbeatTimeout, ThatFailsClosesTheSocketAndThenNothingOfAnybodys) {
    const std::string trace = "/tmp/trace";
    // The third option of each probe is the time-out.
    phone::Daemon daemon(Brisk({"/usr/bin/strace",
                                "-D",
                                "-f",
                                "-o",
                                trace,
                                "-e",
                                "trace=socket,setsockopt,sendto,close",
                                "-e",
                                "inject=setsockopt:error=ENOMEM:when=3+3"}));
    const auto client = phone::Client::checkIn();
    Capture cellular("gcell0");
    ASSERT_EQ(SetHeartbeat(client, 1), 0);
    ASSERT_TRUE(phone::Eventually([&] { return CallsBehind(trace, "INJECTED").size() == 2; }));
    const auto calls = CallsBehind(trace, "INJECTED");
    EXPECT_TRUE(calls[0].starts_with("close(") && calls[0].ends_with(" = 0")) << calls[0];
    EXPECT_TRUE(calls[1].starts_with("close(-1)")) << calls[1];
    EXPECT_TRUE(cellular.packets().empty());
}

}  // namespace
