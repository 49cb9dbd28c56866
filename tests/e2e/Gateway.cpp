#include "tests/e2e/Gateway.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <linux/if_packet.h>
#include <net/ethernet.h>
#include <net/if.h>
#include <netinet/in.h>
#include <netinet/ip.h>
#include <poll.h>
#include <sched.h>
#include <sys/socket.h>

#include <array>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <stdexcept>
#include <thread>

#include "tests/support/PhoneRoot.h"

namespace gateway {
namespace {

using platform::OwnedFd;

/// Runs on a thread of its own, which lives in the gateway's network.
OwnedFd OpenAtGateway(const std::function<int()>& open) {
    OwnedFd opened;
    std::thread([&] {
        const OwnedFd network(::open("/run/netns/gateway", O_RDONLY | O_CLOEXEC));
        if (setns(network.get(), CLONE_NEWNET) == 0) {
            opened.reset(open());
        }
    }).join();
    if (!opened.isOpen()) {
        throw std::runtime_error("no socket at the gateway");
    }
    return opened;
}

int OpenCapture(const std::string& interface) {
    OwnedFd socket(::socket(AF_PACKET, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    sockaddr_ll address{};
    address.sll_family = AF_PACKET;
    address.sll_protocol = htons(ETH_P_IP);
    address.sll_ifindex = static_cast<int>(if_nametoindex(interface.c_str()));
    const int isOn = 1;
    const bool isReady =
        address.sll_ifindex != 0 &&
        setsockopt(socket.get(), SOL_SOCKET, SO_TIMESTAMPNS, &isOn, sizeof isOn) == 0 &&
        bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
    return isReady ? socket.release() : -1;
}

double TimeOf(msghdr& message) {
    for (cmsghdr* part = CMSG_FIRSTHDR(&message); part != nullptr;
         part = CMSG_NXTHDR(&message, part)) {
        if (part->cmsg_level == SOL_SOCKET && part->cmsg_type == SCM_TIMESTAMPNS) {
            timespec time{};
            std::memcpy(&time, CMSG_DATA(part), sizeof time);
            return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
        }
    }
    throw std::runtime_error("a packet without a time");
}

/// The next packet that is an echo request to the gateway; nothing when none is there.
std::optional<Packet> NextRequest(int socket) {
    for (;;) {
        std::array<std::byte, 2048> bytes;
        std::array<std::byte, 256> control;
        sockaddr_ll from{};
        iovec part{.iov_base = bytes.data(), .iov_len = bytes.size()};
        msghdr message{};
        message.msg_name = &from;
        message.msg_namelen = sizeof from;
        message.msg_iov = &part;
        message.msg_iovlen = 1;
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        const ssize_t size = recvmsg(socket, &message, 0);
        if (size < 0) {
            return std::nullopt;
        }
        iphdr header{};
        if (from.sll_pkttype != PACKET_HOST || static_cast<std::size_t>(size) <= sizeof header) {
            continue;
        }
        std::memcpy(&header, bytes.data(), sizeof header);
        const std::size_t start = header.ihl * std::size_t{4};
        if (header.protocol == IPPROTO_ICMP && bytes.at(start) == std::byte{8}) {
            return Packet{.time = TimeOf(message),
                          .source = ntohl(header.saddr),
                          .destination = ntohl(header.daddr),
                          .message = {bytes.begin() + static_cast<std::ptrdiff_t>(start),
                                      bytes.begin() + ntohs(header.tot_len)}};
        }
    }
}

}  // namespace

Capture::Capture(const std::string& interface)
    : socket_(OpenAtGateway([&] { return OpenCapture(interface); })) {}

const std::vector<Packet>& Capture::packets() {
    while (auto packet = NextRequest(socket_.get())) {
        packets_.push_back(std::move(*packet));
    }
    return packets_;
}

bool Capture::has(std::size_t count) {
    return phone::Eventually([&] { return packets().size() >= count; });
}

Responder::Responder()
    : socket_(
          OpenAtGateway([] { return socket(AF_INET, SOCK_RAW | SOCK_CLOEXEC, IPPROTO_ICMP); })) {}

void Responder::send(const Packet& request, std::vector<std::byte> message) const {
    Seal(message);
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(request.source);
    if (sendto(socket_.get(),
               message.data(),
               message.size(),
               0,
               reinterpret_cast<const sockaddr*>(&address),
               sizeof address) != static_cast<ssize_t>(message.size())) {
        throw std::runtime_error("no answer can be sent");
    }
}

std::vector<std::byte> ReplyTo(const Packet& request) {
    auto reply = request.message;
    reply.at(0) = std::byte{0};
    return reply;
}

void Seal(std::vector<std::byte>& message) {
    message.at(2) = message.at(3) = std::byte{0};
    std::uint32_t sum = 0;
    for (std::size_t i = 0; i < message.size(); ++i) {
        sum += std::to_integer<std::uint32_t>(message[i]) << (i % 2 == 0 ? 8 : 0);
    }
    while (sum > 0xFFFF) {
        sum = (sum & 0xFFFF) + (sum >> 16);
    }
    message[2] = static_cast<std::byte>(~sum >> 8 & 0xFF);
    message[3] = static_cast<std::byte>(~sum & 0xFF);
}

void SetAnswering(bool isAnswering) {
    Run("nsenter --net=/run/netns/gateway sh -c 'echo " + std::string(isAnswering ? "0" : "1") +
        " >/proc/sys/net/ipv4/icmp_echo_ignore_all'");
}

void Run(const std::string& command) {
    if (std::system(command.c_str()) != 0) {
        throw std::runtime_error("failed: " + command);
    }
}

}  // namespace gateway
