// What the heartbeat needs: the cellular interface, the right to echo sockets, the protocol's name.
#include <net/if.h>
#include <netdb.h>

#include <fstream>
#include <string>

#include "tools/lfhelper/doctor/Checks.h"
#include "tools/lfhelper/doctor/EchoGroups.h"

namespace lfhelper::doctor {
namespace {

constexpr const char* kInterface = "cellular-interface";
constexpr const char* kSocket = "echo-socket";
constexpr const char* kProtocol = "echo-protocol";
constexpr const char* kInterfaceName = "pdp_ip0";
constexpr const char* kRange = "/proc/sys/net/ipv4/ping_group_range";
/// The service runs as root's group.
constexpr std::uint32_t kServiceGroup = 0;

Finding JudgeInterface() {
    const std::string name = kInterfaceName;
    return if_nametoindex(kInterfaceName) != 0
               ? Ok(kInterface, "the interface " + name + " is there")
               : Note(kInterface,
                      "there is no interface " + name +
                          ": the heartbeat goes out by whatever route there is");
}

Finding JudgeRange() {
    std::ifstream file(kRange);
    std::string text;
    std::getline(file, text);
    const auto groups = ParseEchoGroups(text);
    if (!groups) {
        return Note(kSocket, std::string(kRange) + " cannot be read", "run this as root");
    }
    return groups->contain(kServiceGroup)
               ? Ok(kSocket, "root's group may open echo sockets")
               : Problem(kSocket,
                         "root's group may not open echo sockets: the heartbeat sends nothing",
                         "sysctl net.ipv4.ping_group_range='0 2147483647'");
}

Finding JudgeProtocol() {
    return getprotobyname("icmp") != nullptr
               ? Ok(kProtocol, "the protocol icmp is known")
               : Problem(kProtocol,
                         "the protocol icmp is not known: the heartbeat sends nothing",
                         "install the package netbase, which brings /etc/protocols");
}

}  // namespace

Findings CheckHeartbeat(const Subject& /*subject*/) {
    return {JudgeInterface(), JudgeRange(), JudgeProtocol()};
}

}  // namespace lfhelper::doctor
