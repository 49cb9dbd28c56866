// The source address of a connected socket does not tell the interface: a route may carry the
// address of another one. The kernel's answer to a question about the route does.
#include "platform/linux/OutgoingInterface.h"

#include <fcntl.h>
#include <linux/netlink.h>
#include <linux/rtnetlink.h>
#include <net/if.h>
#include <net/if_arp.h>
#include <netinet/in.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <cstring>
#include <span>

#include "platform/linux/OwnedFd.h"

namespace platform {
namespace {

constexpr std::size_t kAddressMax = sizeof(in6_addr);

struct Question {
    nlmsghdr header;
    rtmsg route;
    rtattr attribute;
    std::array<std::byte, kAddressMax> address;
};

std::string NameOf(unsigned index) {
    std::array<char, IF_NAMESIZE> name{};
    return if_indextoname(index, name.data()) == nullptr ? std::string() : std::string(name.data());
}

std::span<const std::byte> AddressBytes(const sockaddr& address) {
    if (address.sa_family == AF_INET) {
        const auto& own = reinterpret_cast<const sockaddr_in&>(address);
        return std::as_bytes(std::span(&own.sin_addr, 1));
    }
    if (address.sa_family == AF_INET6) {
        const auto& own = reinterpret_cast<const sockaddr_in6&>(address);
        return std::as_bytes(std::span(&own.sin6_addr, 1));
    }
    return {};
}

Question AskFor(sa_family_t family, std::span<const std::byte> address) {
    Question question{};
    question.header.nlmsg_type = RTM_GETROUTE;
    question.header.nlmsg_flags = NLM_F_REQUEST;
    question.header.nlmsg_len =
        static_cast<std::uint32_t>(NLMSG_LENGTH(sizeof(rtmsg)) + RTA_LENGTH(address.size()));
    question.route.rtm_family = static_cast<unsigned char>(family);
    question.route.rtm_dst_len = static_cast<unsigned char>(address.size() * 8);
    question.attribute.rta_type = RTA_DST;
    question.attribute.rta_len = static_cast<unsigned short>(RTA_LENGTH(address.size()));
    std::ranges::copy(address, question.address.begin());
    return question;
}

/// The attribute RTA_OIF of a route, or 0.
unsigned InterfaceIn(const nlmsghdr* message) {
    auto length = static_cast<int>(RTM_PAYLOAD(message));
    const auto* attribute = RTM_RTA(NLMSG_DATA(message));
    for (; RTA_OK(attribute, length); attribute = RTA_NEXT(attribute, length)) {
        if (attribute->rta_type == RTA_OIF && RTA_PAYLOAD(attribute) >= sizeof(unsigned)) {
            unsigned index = 0;
            std::memcpy(&index, RTA_DATA(attribute), sizeof index);
            return index;
        }
    }
    return 0;
}

unsigned RouteTo(sa_family_t family, std::span<const std::byte> address) {
    const OwnedFd netlink(socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, NETLINK_ROUTE));
    const Question question = AskFor(family, address);
    if (send(netlink.get(), &question, question.header.nlmsg_len, 0) < 0) {
        return 0;
    }
    alignas(nlmsghdr) std::array<std::byte, 8192> answer{};
    const ssize_t length = recv(netlink.get(), answer.data(), answer.size(), 0);
    const auto* const message = reinterpret_cast<const nlmsghdr*>(answer.data());
    const bool isRoute = length > 0 && NLMSG_OK(message, static_cast<std::uint32_t>(length)) &&
                         message->nlmsg_type == RTM_NEWROUTE;
    return isRoute ? InterfaceIn(message) : 0;
}

std::string ReadSmallFile(const std::string& path) {
    const OwnedFd file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    std::string text(4096, '\0');
    const ssize_t size = file.isOpen() ? read(file.get(), text.data(), text.size()) : 0;
    text.resize(size > 0 ? static_cast<std::size_t>(size) : 0);
    return text;
}

}  // namespace

std::string OutgoingInterface(const sockaddr& address) {
    if (address.sa_family == AF_INET6) {
        const auto scope = reinterpret_cast<const sockaddr_in6&>(address).sin6_scope_id;
        if (scope != 0) {
            return NameOf(scope);
        }
    }
    const auto bytes = AddressBytes(address);
    const unsigned index = bytes.empty() ? 0 : RouteTo(address.sa_family, bytes);
    return index == 0 ? std::string() : NameOf(index);
}

bool IsCellularKind(std::string_view name, int type, std::string_view event) {
    constexpr std::array<std::string_view, 3> kNames{"pdp_ip", "wwan", "rmnet"};
    // Modems that speak the point-to-point protocol, or bare packets.
    constexpr std::array kTypes{ARPHRD_PPP, ARPHRD_RAWIP};
    return std::ranges::any_of(kNames, [&](auto prefix) { return name.starts_with(prefix); }) ||
           std::ranges::find(kTypes, type) != kTypes.end() ||
           event.find("DEVTYPE=wwan\n") != std::string_view::npos;
}

bool IsCellular(const std::string& interface) {
    const std::string folder = "/sys/class/net/" + interface;
    const std::string text = ReadSmallFile(folder + "/type");
    int type = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), type);
    return error != std::errc() ||
           IsCellularKind(interface, type, ReadSmallFile(folder + "/uevent"));
}

}  // namespace platform
