// Whoever must not use the cellular network sends nothing over it. Runs in a private phone root,
// where wlan0 and pdp_ip0 lead to the gateway.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <net/if.h>
#include <netinet/in.h>

#include <cstdlib>
#include <fstream>
#include <memory>

#include "platform/linux/OutgoingInterface.h"
#include "tests/http/Fetch.h"
#include "tests/http/PacketCapture.h"
#include "tests/http/RawServer.h"

namespace {

using hvu::Http::CellularUse;
using hvu::Http::ErrorType;
using web::Get;
using web::PacketCapture;
using web::RawServer;

constexpr const char* kWifi = "198.51.100.1";
constexpr const char* kCellular = "203.0.113.1";
constexpr const char* kCellularV6 = "fd00:ce11::1";

/// A command line that has to succeed.
void Do(const std::string& command) {
    ASSERT_EQ(std::system(command.c_str()), 0) << command;
}

std::unique_ptr<RawServer> GatewayServer(
    const char* address,
    const std::string& answer = "HTTP/1.1 200 OK\r\nContent-Length: 2\r\n\r\nok") {
    std::unique_ptr<RawServer> server;
    web::InGateway([&] {
        server = std::make_unique<RawServer>(
            [answer](const web::RawConnection& client) { (void)client.send(answer); }, address);
    });
    return server;
}

/// A change of the phone's routes that is undone at the end.
class Route {
public:
    explicit Route(std::string text) : text_(std::move(text)) { Do("ip route add " + text_); }

    Route(const Route&) = delete;
    Route& operator=(const Route&) = delete;

    ~Route() { Do("ip route del " + text_); }

private:
    const std::string text_;
};

/// The server answers whoever may use any network, and nobody who may not; of those it sees
/// nothing.
void ExpectRefused(const RawServer& server) {
    PacketCapture capture("gcell0");
    const auto refused = Get(server.url(), CellularUse::kForbidden);
    EXPECT_EQ(refused.error, ErrorType::kCellularForbidden);
    EXPECT_EQ(refused.status, 0);
    EXPECT_EQ(capture.tcpPackets(), 0U);
    EXPECT_EQ(Get(server.url(), CellularUse::kAllowed).body, "ok");
    EXPECT_GT(capture.tcpPackets(), 0U) << "the capture sees what passes";
}

TEST(CellularRule, LetsEverybodyUseWifi) {
    const auto server = GatewayServer(kWifi);
    EXPECT_EQ(Get(server->url(), CellularUse::kForbidden).body, "ok");
    EXPECT_EQ(Get(server->url(), CellularUse::kAllowed).body, "ok");
}

TEST(CellularRule, RefusesWhatIsReachedOverTheCellularInterface) {
    ExpectRefused(*GatewayServer(kCellular));
}

TEST(CellularRule, IsNotMisledByARouteWithTheAddressOfAnotherInterface) {
    const auto server = GatewayServer("192.0.2.1");
    const Route route("192.0.2.1/32 via 203.0.113.1 dev pdp_ip0 src 198.51.100.2");
    ExpectRefused(*server);
}

TEST(CellularRule, HoldsForIpv6) {
    Do("ip -6 addr add fd00:ce11::2/64 dev pdp_ip0 nodad");
    Do("nsenter --net=/run/netns/gateway ip -6 addr add fd00:ce11::1/64 dev gcell0 nodad");
    ExpectRefused(*GatewayServer(kCellularV6));
    Do("ip -6 addr del fd00:ce11::2/64 dev pdp_ip0");
}

TEST(CellularRule, HoldsForWhereARedirectLeads) {
    const auto cellular = GatewayServer(kCellular);
    const auto wifi = GatewayServer(
        kWifi,
        "HTTP/1.1 302 Found\r\nContent-Length: 0\r\nLocation: " + cellular->url() + "\r\n\r\n");
    ExpectRefused(*cellular);
    PacketCapture capture("gcell0");
    EXPECT_EQ(Get(wifi->url(), CellularUse::kForbidden).error, ErrorType::kCellularForbidden);
    EXPECT_EQ(capture.tcpPackets(), 0U);
    EXPECT_EQ(Get(wifi->url(), CellularUse::kAllowed).body, "ok");
}

TEST(CellularRule, RefusesWhatNoRouteLeadsTo) {
    const Route route("unreachable 192.0.2.1/32");
    const auto server = GatewayServer("192.0.2.1");
    EXPECT_EQ(Get(server->url(), CellularUse::kForbidden).error, ErrorType::kCannotConnect);
}

TEST(CellularRule, HoldsWhenWifiIsGone) {
    const auto server = GatewayServer("192.0.2.1");
    EXPECT_EQ(Get(server->url(), CellularUse::kForbidden).body, "ok");
    Do("ip link set wlan0 down");
    ExpectRefused(*server);
    Do("ip link set wlan0 up && ip route add default via 198.51.100.1 dev wlan0 metric 100");
    EXPECT_EQ(Get(server->url(), CellularUse::kForbidden).body, "ok");
}

TEST(CellularRule, KnowsCellularInterfacesByNameAndKind) {
    constexpr int kEthernet = 1;
    for (const char* name : {"pdp_ip0", "pdp_ip12", "wwan0", "rmnet_data0"}) {
        EXPECT_TRUE(platform::IsCellularKind(name, kEthernet, "")) << name;
    }
    for (const char* name : {"wlan0", "eth0", "lo", "usb0", "xpdp_ip0"}) {
        EXPECT_FALSE(platform::IsCellularKind(name, kEthernet, "INTERFACE=x\n")) << name;
    }
    EXPECT_TRUE(platform::IsCellularKind("usb0", kEthernet, "DEVTYPE=wwan\nINTERFACE=usb0\n"));
    EXPECT_TRUE(platform::IsCellularKind("ppp0", 512, ""));
    EXPECT_TRUE(platform::IsCellularKind("modem0", 519, ""));
}

TEST(CellularRule, TakesAnInterfaceThatIsUnknownForCellular) {
    EXPECT_FALSE(platform::IsCellular("wlan0"));
    EXPECT_TRUE(platform::IsCellular("pdp_ip0"));
    EXPECT_TRUE(platform::IsCellular("gone0"));
}

std::string InterfaceTo(const char* text) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    inet_pton(AF_INET, text, &address.sin_addr);
    return platform::OutgoingInterface(reinterpret_cast<const sockaddr&>(address));
}

TEST(OutgoingInterface, IsWhatTheKernelsRoutingSays) {
    EXPECT_EQ(InterfaceTo("127.0.0.1"), "lo");
    EXPECT_EQ(InterfaceTo(kWifi), "wlan0");
    EXPECT_EQ(InterfaceTo(kCellular), "pdp_ip0");
    EXPECT_EQ(InterfaceTo("192.0.2.77"), "wlan0");
    const Route route("unreachable 192.0.2.77/32");
    EXPECT_EQ(InterfaceTo("192.0.2.77"), "");
}

TEST(OutgoingInterface, OfALinkLocalAddressIsItsScope) {
    sockaddr_in6 address{};
    address.sin6_family = AF_INET6;
    inet_pton(AF_INET6, "fe80::1", &address.sin6_addr);
    address.sin6_scope_id = if_nametoindex("pdp_ip0");
    EXPECT_EQ(platform::OutgoingInterface(reinterpret_cast<const sockaddr&>(address)), "pdp_ip0");
}

}  // namespace
