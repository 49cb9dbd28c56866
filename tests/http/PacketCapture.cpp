#include "tests/http/PacketCapture.h"

#include <arpa/inet.h>
#include <linux/if_ether.h>
#include <linux/if_packet.h>
#include <net/if.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <array>
#include <cstdint>
#include <cstdlib>

#include "tests/http/RawServer.h"

namespace web {
namespace {

/// Of the packet behind the link header.
bool IsTcp(const std::array<std::uint8_t, 2048>& packet, std::uint16_t protocol) {
    constexpr std::size_t kProtocolInV4 = 9;
    constexpr std::size_t kNextHeaderInV6 = 6;
    return (protocol == ETH_P_IP && packet[kProtocolInV4] == IPPROTO_TCP) ||
           (protocol == ETH_P_IPV6 && packet[kNextHeaderInV6] == IPPROTO_TCP);
}

}  // namespace

PacketCapture::PacketCapture(const char* interface) {
    InGateway([&] {
        socket_.reset(
            socket(AF_PACKET, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, htons(ETH_P_ALL)));
        sockaddr_ll place{};
        place.sll_family = AF_PACKET;
        place.sll_protocol = htons(ETH_P_ALL);
        place.sll_ifindex = static_cast<int>(if_nametoindex(interface));
        if (place.sll_ifindex == 0 ||
            bind(socket_.get(), reinterpret_cast<sockaddr*>(&place), sizeof place) != 0) {
            std::abort();
        }
    });
}

std::size_t PacketCapture::tcpPackets() {
    std::array<std::uint8_t, 2048> packet{};
    sockaddr_ll from{};
    socklen_t size = sizeof from;
    while (recvfrom(socket_.get(),
                    packet.data(),
                    packet.size(),
                    0,
                    reinterpret_cast<sockaddr*>(&from),
                    &size) > 0) {
        // A socket hears of all interfaces until it is bound to one, and of what leaves as well.
        if (from.sll_pkttype == PACKET_HOST && IsTcp(packet, ntohs(from.sll_protocol))) {
            ++count_;
        }
    }
    return count_;
}

}  // namespace web
