#include "platform/EchoSocket.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <deque>
#include <map>
#include <memory>
#include <set>
#include <utility>

#include "platform/Utf8.h"
#include "platform/sim/Ports.h"
#include "platform/sim/SimEcho.h"
#include "platform/sim/World.h"

using namespace platform;

namespace sim {
namespace {

constexpr double kUsualDelay = 0.05;
constexpr std::int64_t kTimeOfDayAtStart = 1'700'000'000;
constexpr std::uint16_t kFirstIdentifierOfOurChoice = 49152;
constexpr std::size_t kHeaderSize = 20;

struct EchoNetwork {
    EchoGateway gateway = [](const SentEcho& request) {
        return std::vector{EchoAnswer{.delay = kUsualDelay, .datagram = EchoReplyTo(request)}};
    };
    std::set<std::string, std::less<>> interfaces{"pdp_ip0"};
    std::map<std::string, HostAddress, std::less<>> hosts;
    std::set<std::uint16_t> heldIdentifiers;
    std::vector<SentEcho> sent;
    std::int32_t scriptedError = EIO;
    std::int32_t lastError = 0;
    std::size_t sendLimit = SIZE_MAX;
    double clockShift = 0;
    std::size_t openSockets = 0;
};

EchoNetwork& Network() {
    static EchoNetwork& network = *new EchoNetwork;
    return network;
}

/// The open socket behind a descriptor.
class EchoFile final : public OpenFile {
public:
    EchoFile() { ++Network().openSockets; }

    ~EchoFile() override { --Network().openSockets; }

    std::deque<std::vector<std::byte>> inbox;
    std::string boundTo;
    double timeout = kNever;
};

std::shared_ptr<EchoFile> FileOf(int descriptor) {
    return std::dynamic_pointer_cast<EchoFile>(DescriptorOf(descriptor));
}

/// Notes a call; a failing one leaves the error of the script, one on a closed socket EBADF.
bool Fails(std::string_view call, std::string_view details = {}) {
    const bool fails = CallFails(call, details);
    Network().lastError = fails ? Network().scriptedError : Network().lastError;
    return fails;
}

std::shared_ptr<EchoFile> OpenFileFor(int descriptor,
                                      std::string_view call,
                                      std::string_view details = {}) {
    if (Fails(call, details)) {
        return nullptr;
    }
    auto file = FileOf(descriptor);
    if (file == nullptr) {
        Network().lastError = EBADF;
    }
    return file;
}

/// What arrives later finds the socket, or nobody.
void Deliver(const std::shared_ptr<EchoFile>& file, EchoAnswer answer) {
    const double delay = answer.delay;
    In(delay, [socket = std::weak_ptr(file), datagram = std::move(answer.datagram)] {
        if (const auto receiver = socket.lock(); receiver != nullptr) {
            receiver->inbox.push_back(datagram);
        }
    });
}

/// False when the time-out passed first. Everything else goes on meanwhile.
bool WaitForDatagram(EchoFile& file) {
    const auto isOver = std::make_shared<bool>(false);
    if (file.timeout != kNever) {
        In(file.timeout, [isOver] { *isOver = true; });
    }
    RunOthersUntil([&] { return *isOver || !file.inbox.empty(); });
    return !file.inbox.empty();
}

}  // namespace

void SetEchoGateway(EchoGateway gateway) {
    Network().gateway = std::move(gateway);
}

std::vector<std::byte> EchoReplyTo(const SentEcho& request) {
    std::vector<std::byte> reply(kHeaderSize + request.bytes.size());
    reply[0] = std::byte{0x45};
    std::ranges::copy(request.bytes, reply.begin() + kHeaderSize);
    reply.at(kHeaderSize) = std::byte{0};
    return reply;
}

const std::vector<SentEcho>& SentEchoes() {
    return Network().sent;
}

void SetInterface(std::string_view name, bool isThere) {
    if (isThere) {
        Network().interfaces.emplace(name);
    } else {
        Network().interfaces.erase(std::string(name));
    }
}

void SetHost(std::string_view name, const HostAddress& address) {
    Network().hosts.insert_or_assign(std::string(name), address);
}

void HoldEchoIdentifier(std::uint16_t identifier) {
    Network().heldIdentifiers.insert(identifier);
}

void SetSystemError(std::int32_t error) {
    Network().scriptedError = error;
}

void CutEchoesSent(std::size_t bytes) {
    Network().sendLimit = bytes;
}

void ShiftTimeOfDay(double seconds) {
    Network().clockShift += seconds;
}

std::size_t OpenEchoSockets() {
    return Network().openSockets;
}

void ResetEcho() {
    const auto openSockets = Network().openSockets;
    Network() = EchoNetwork();
    Network().openSockets = openSockets;
}

}  // namespace sim

namespace platform {

bool CopyHostText(std::string_view host, std::span<char> text) {
    if (sim::Fails("CopyHostText", host)) {
        return false;
    }
    if (!IsUtf8(host) || host.find('\0') != std::string_view::npos || host.size() >= text.size()) {
        sim::Network().lastError = EINVAL;
        return false;
    }
    std::ranges::copy(host, text.begin());
    text[host.size()] = '\0';
    return true;
}

std::optional<HostAddress> ParseInternetAddress(const char* text) {
    unsigned parts[4];
    char rest = 0;
    if (sim::Fails("ParseInternetAddress", text) ||
        std::sscanf(text, "%3u.%3u.%3u.%3u%c", &parts[0], &parts[1], &parts[2], &parts[3], &rest) !=
            4 ||
        std::ranges::any_of(parts, [](unsigned part) { return part > 255; })) {
        return std::nullopt;
    }
    HostAddress address;
    std::ranges::transform(
        parts, address.bytes.begin(), [](unsigned part) { return static_cast<std::byte>(part); });
    return address;
}

std::optional<HostAddress> ResolveHostName(const char* name) {
    const auto& hosts = sim::Network().hosts;
    const auto host = hosts.find(name);
    return sim::Fails("ResolveHostName", name) || host == hosts.end() ? std::nullopt
                                                                      : std::optional(host->second);
}

std::optional<std::int32_t> ProtocolByName(const char* name) {
    const bool isKnown = std::string_view(name) == "icmp";
    return sim::Fails("ProtocolByName", name) || !isKnown ? std::nullopt
                                                          : std::optional(std::int32_t{1});
}

std::uint32_t InterfaceIndexByName(const char* name) {
    const auto& interfaces = sim::Network().interfaces;
    const auto found = interfaces.find(name);
    if (sim::Fails("InterfaceIndexByName", name) || found == interfaces.end()) {
        return 0;
    }
    return static_cast<std::uint32_t>(std::distance(interfaces.begin(), found)) + 2;
}

std::optional<TimeOfDay> GetTimeOfDay() {
    if (sim::Fails("GetTimeOfDay")) {
        return std::nullopt;
    }
    const auto microseconds = std::llround((sim::Now() + sim::Network().clockShift) * 1e6) +
                              sim::kTimeOfDayAtStart * 1'000'000;
    return TimeOfDay{.seconds = microseconds / 1'000'000,
                     .microseconds = static_cast<std::int32_t>(microseconds % 1'000'000)};
}

std::int32_t LastSystemError() {
    return sim::Network().lastError;
}

std::optional<EchoSocket> EchoSocket::open(std::int32_t protocol) {
    if (sim::Fails("EchoSocket.open", std::to_string(protocol))) {
        return std::nullopt;
    }
    if (sim::DescriptorTableIsFull()) {
        sim::Network().lastError = EMFILE;
        return std::nullopt;
    }
    return EchoSocket(sim::AddDescriptor(std::make_shared<sim::EchoFile>()));
}

EchoSocket::EchoSocket(EchoSocket&& other) noexcept
    : descriptor_(std::exchange(other.descriptor_, -1)) {}

EchoSocket::~EchoSocket() {
    if (sim::FileOf(descriptor_) != nullptr) {
        sim::CloseDescriptor(descriptor_);
    }
}

std::uint16_t EchoSocket::takeIdentifier(std::uint16_t wanted) {
    const bool fails = sim::Fails("EchoSocket.takeIdentifier", std::to_string(wanted));
    if (!fails && wanted != 0 && !sim::Network().heldIdentifiers.contains(wanted)) {
        return wanted;
    }
    return sim::kFirstIdentifierOfOurChoice;
}

bool EchoSocket::setReceiveBufferSize(std::int32_t bytes) {
    return sim::OpenFileFor(
               descriptor_, "EchoSocket.setReceiveBufferSize", std::to_string(bytes)) != nullptr;
}

bool EchoSocket::bindToInterface(const char* name) {
    const auto file = sim::OpenFileFor(descriptor_, "EchoSocket.bindToInterface", name);
    if (file == nullptr || !sim::Network().interfaces.contains(name)) {
        return false;
    }
    file->boundTo = name;
    return true;
}

bool EchoSocket::setReceiveTimeout(std::int64_t seconds, std::int32_t microseconds) {
    const auto file =
        sim::OpenFileFor(descriptor_,
                         "EchoSocket.setReceiveTimeout",
                         std::to_string(seconds) + " " + std::to_string(microseconds));
    if (file == nullptr) {
        return false;
    }
    file->timeout = static_cast<double>(seconds) + static_cast<double>(microseconds) * 1e-6;
    return true;
}

std::int64_t EchoSocket::send(std::span<const std::byte> message, const HostAddress& destination) {
    const auto file =
        sim::OpenFileFor(descriptor_, "EchoSocket.send", std::to_string(message.size()));
    if (file == nullptr) {
        return -1;
    }
    if (destination.family != kAddressFamilyInet) {
        sim::Network().lastError = EAFNOSUPPORT;
        return -1;
    }
    const auto out = message.first(std::min(message.size(), sim::Network().sendLimit));
    const auto& request =
        sim::Network().sent.emplace_back(sim::SentEcho{.time = sim::Now(),
                                                       .bytes = {out.begin(), out.end()},
                                                       .destination = destination,
                                                       .boundTo = file->boundTo});
    for (auto& answer : sim::Network().gateway(request)) {
        sim::Deliver(file, std::move(answer));
    }
    return static_cast<std::int64_t>(out.size());
}

std::int64_t EchoSocket::receive(std::span<std::byte> datagram) {
    const auto file =
        sim::OpenFileFor(descriptor_, "EchoSocket.receive", std::to_string(datagram.size()));
    if (file == nullptr) {
        return -1;
    }
    if (!sim::WaitForDatagram(*file)) {
        sim::Network().lastError = EAGAIN;
        return -1;
    }
    const auto arrived = std::move(file->inbox.front());
    file->inbox.pop_front();
    const std::size_t size = std::min(datagram.size(), arrived.size());
    std::ranges::copy(std::span(arrived).first(size), datagram.begin());
    return static_cast<std::int64_t>(size);
}

void EchoSocket::close() {
    sim::NoteCall("EchoSocket.close", descriptor_ < 0 ? "again" : "");
    if (sim::FileOf(descriptor_) == nullptr) {
        sim::Network().lastError = EBADF;
        return;
    }
    sim::CloseDescriptor(std::exchange(descriptor_, -1));
}

}  // namespace platform
