#include "platform/EchoSocket.h"

#include <dirent.h>
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <cerrno>
#include <fstream>
#include <utility>

using platform::EchoSocket;
using platform::HostAddress;

namespace {

constexpr std::int32_t kIcmp = 1;

std::vector<std::byte> Request() {
    std::vector<std::byte> request(48);
    request[0] = std::byte{8};
    request[47] = std::byte{7};
    return request;
}

HostAddress Loopback() {
    return platform::ParseInternetAddress("127.0.0.1").value();
}

EchoSocket Open() {
    auto socket = EchoSocket::open(kIcmp);
    EXPECT_TRUE(socket && socket->setReceiveTimeout(5, 0));
    return std::move(*socket);
}

std::size_t OpenDescriptors() {
    DIR* const folder = opendir("/proc/self/fd");
    std::size_t count = 0;
    while (readdir(folder) != nullptr) {
        ++count;
    }
    closedir(folder);
    return count;
}

TEST(EchoSocket, SendsRequestsAndReceivesRepliesBehindAHeader) {
    EchoSocket socket = Open();
    const std::uint16_t identifier = socket.takeIdentifier(4242);
    EXPECT_EQ(identifier, 4242);
    ASSERT_EQ(socket.send(Request(), Loopback()), 48);
    std::vector<std::byte> datagram(2048);
    ASSERT_EQ(socket.receive(datagram), 20 + 48);
    EXPECT_EQ(datagram[0], std::byte{0x45});
    EXPECT_EQ(datagram[12], std::byte{127}) << "the source";
    EXPECT_EQ(datagram[20], std::byte{0}) << "an echo reply";
    EXPECT_EQ(datagram[24], std::byte{4242 >> 8});
    EXPECT_EQ(datagram[25], std::byte{4242 & 0xFF});
    EXPECT_EQ(datagram[20 + 47], std::byte{7});
}

TEST(EchoSocket, CutsADatagramAtTheEndOfTheBuffer) {
    for (const std::size_t size : {0U, 1U, 19U, 20U, 21U, 67U, 68U, 69U}) {
        EchoSocket socket = Open();
        ASSERT_EQ(socket.send(Request(), Loopback()), 48);
        std::vector<std::byte> datagram(size + 1, std::byte{0xAA});
        const auto room = std::span(datagram).first(size);
        EXPECT_EQ(socket.receive(room), static_cast<std::int64_t>(std::min(size, std::size_t{68})));
        EXPECT_EQ(datagram[size], std::byte{0xAA}) << "nothing is written behind it";
    }
}

TEST(EchoSocket, HasAnIdentifierOfTheSystemsChoiceForZero) {
    EchoSocket socket = Open();
    const std::uint16_t identifier = socket.takeIdentifier(0);
    EXPECT_NE(identifier, 0);
    ASSERT_EQ(socket.send(Request(), Loopback()), 48);
    std::vector<std::byte> datagram(2048);
    ASSERT_EQ(socket.receive(datagram), 68);
    EXPECT_EQ(std::to_integer<int>(datagram[24]) << 8 | std::to_integer<int>(datagram[25]),
              identifier);
}

TEST(EchoSocket, SaysThatTheTimeoutPassed) {
    EchoSocket socket = Open();
    ASSERT_TRUE(socket.setReceiveTimeout(0, 10'000));
    std::vector<std::byte> datagram(2048);
    EXPECT_EQ(socket.receive(datagram), -1);
    EXPECT_EQ(platform::LastSystemError(), EAGAIN);
}

TEST(EchoSocket, SaysWhyItsCallsFail) {
    EchoSocket socket = Open();
    EXPECT_FALSE(socket.bindToInterface("none0"));
    EXPECT_EQ(platform::LastSystemError(), ENODEV);
    EXPECT_FALSE(socket.setReceiveTimeout(0, 1'000'000));
    EXPECT_EQ(platform::LastSystemError(), EDOM);
    EXPECT_LT(socket.send(Request(), {.family = 10}), 0);
    EXPECT_EQ(platform::LastSystemError(), EAFNOSUPPORT);
    EXPECT_FALSE(EchoSocket::open(12345));
    EXPECT_NE(platform::LastSystemError(), 0);
}

TEST(EchoSocket, LeavesOverTheInterfaceThatItIsBoundTo) {
    EchoSocket socket = Open();
    ASSERT_TRUE(socket.setReceiveTimeout(0, 50'000));
    ASSERT_TRUE(socket.bindToInterface("pdp_ip0"));
    EXPECT_EQ(socket.send(Request(), platform::ParseInternetAddress("192.0.2.1").value()), 48);
}

TEST(EchoSocket, ClosedTwiceLeavesItsOldNumberAlone) {
    EchoSocket socket = Open();
    EXPECT_FALSE(socket.setReceiveTimeout(0, 1'000'000));
    socket.close();
    EXPECT_EQ(platform::LastSystemError(), EDOM) << "closing says nothing of its own";
    const auto stranger = EchoSocket::open(kIcmp);  // gets the number that has become free
    const std::size_t open = OpenDescriptors();
    socket.close();
    EXPECT_EQ(platform::LastSystemError(), EBADF);
    EXPECT_EQ(OpenDescriptors(), open);
    EXPECT_EQ(socket.send(Request(), Loopback()), -1);
    EXPECT_EQ(platform::LastSystemError(), EBADF);
    EXPECT_EQ(socket.takeIdentifier(7), 7);
}

TEST(EchoSocket, IsClosedByItsEndAndOnExec) {
    const std::size_t open = OpenDescriptors();
    {
        EchoSocket first = Open();
        const EchoSocket second = std::move(first);
        EXPECT_EQ(OpenDescriptors(), open + 1);
    }
    EXPECT_EQ(OpenDescriptors(), open);
}

TEST(EchoSocket, NeedsAGroupOfTheRange) {
    std::string range;
    std::getline(std::ifstream("/proc/sys/net/ipv4/ping_group_range"), range);
    std::ofstream("/proc/sys/net/ipv4/ping_group_range") << "1 0\n";
    EXPECT_FALSE(EchoSocket::open(kIcmp));
    EXPECT_EQ(platform::LastSystemError(), EACCES);
    std::ofstream("/proc/sys/net/ipv4/ping_group_range") << range << "\n";
    EXPECT_TRUE(EchoSocket::open(kIcmp));
}

TEST(EchoNames, AreAddressesHostsProtocolsAndInterfaces) {
    EXPECT_EQ(platform::ParseInternetAddress("192.0.2.1").value().bytes[0], std::byte{192});
    EXPECT_FALSE(platform::ParseInternetAddress("localhost"));
    EXPECT_FALSE(platform::ParseInternetAddress("255.255.255.255"));
    EXPECT_EQ(platform::ResolveHostName("localhost"), Loopback());
    EXPECT_FALSE(platform::ResolveHostName("no.such.host.example"));
    EXPECT_FALSE(platform::ResolveHostName(""));
    EXPECT_EQ(platform::ProtocolByName("icmp"), kIcmp);
    EXPECT_FALSE(platform::ProtocolByName("none"));
    EXPECT_NE(platform::InterfaceIndexByName("pdp_ip0"), 0U);
    EXPECT_EQ(platform::InterfaceIndexByName("none0"), 0U);
}

TEST(EchoNames, OfHostsAreTexts) {
    std::array<char, 8> text{};
    EXPECT_TRUE(platform::CopyHostText("seven77", text));
    EXPECT_STREQ(text.data(), "seven77");
    EXPECT_FALSE(platform::CopyHostText("eight888", text));
    EXPECT_FALSE(platform::CopyHostText("\xFF", text));
    EXPECT_FALSE(platform::CopyHostText(std::string_view("a\0b", 3), text));
    EXPECT_EQ(platform::LastSystemError(), EINVAL);
    EXPECT_STREQ(text.data(), "seven77");
}

TEST(TimeOfDay, GoesOnFromTheEpoch) {
    const auto before = platform::GetTimeOfDay().value();
    const auto after = platform::GetTimeOfDay().value();
    EXPECT_GT(before.seconds, 1'600'000'000);
    EXPECT_GE(after.seconds, before.seconds);
    EXPECT_LT(after.microseconds, 1'000'000);
}

}  // namespace
