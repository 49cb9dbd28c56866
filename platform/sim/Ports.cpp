#include "platform/sim/Ports.h"

#include <algorithm>
#include <cstdio>
#include <map>
#include <utility>

#include "platform/MachCarriage.h"
#include "platform/sim/World.h"

using namespace platform;

namespace sim {
namespace {

constexpr std::size_t kDescriptorLimit = 4096;

struct Service {
    std::deque<std::shared_ptr<Endpoint>> waiting;
    bool isHeldElsewhere = false;
};

struct PortSpace {
    std::map<mach_port_t, Port> ports;
    mach_port_t lastName = 0x103;  // goes on through all worlds: names are not reused soon
    std::map<std::string, Service, std::less<>> services;
    std::map<int, Descriptor> descriptors;
    int lastDescriptor = 2;
    std::size_t connections = 0;
    std::size_t limit = kDescriptorLimit;
};

PortSpace& Space() {
    static PortSpace& space = *new PortSpace;
    return space;
}

Service& ServiceOf(std::string_view name) {
    return Space().services[std::string(name)];
}

std::string Hex(mach_port_t name) {
    char text[16];
    (void)std::snprintf(text, sizeof text, "0x%x", name);
    return text;
}

mach_port_t AddPort(Port port) {
    mach_port_t& name = Space().lastName;
    name += 0x100;
    Space().ports.emplace(name, std::move(port));
    return name;
}

void ForgetIfUnused(mach_port_t name) {
    const auto port = Space().ports.find(name);
    if (!port->second.hasReceive && port->second.sendRights == 0) {
        const Port released = std::move(port->second);
        Space().ports.erase(port);
    }
}

}  // namespace

Port* FindPort(mach_port_t name) {
    const auto port = Space().ports.find(name);
    return port == Space().ports.end() ? nullptr : &port->second;
}

std::shared_ptr<Endpoint> MakePair(std::shared_ptr<Endpoint>* other) {
    auto one = std::make_shared<Endpoint>();
    *other = std::make_shared<Endpoint>();
    one->other = *other;
    (*other)->other = one;
    return one;
}

bool HasWaitingConnection(std::string_view service) {
    return WaitingConnections(service) != 0;
}

std::shared_ptr<Endpoint> AcceptConnection(std::string_view service) {
    auto& waiting = ServiceOf(service).waiting;
    if (waiting.empty()) {
        return nullptr;
    }
    auto connection = std::move(waiting.front());
    waiting.pop_front();
    return connection;
}

int AddDescriptor(Descriptor descriptor) {
    const int number = ++Space().lastDescriptor;
    Space().descriptors.emplace(number, std::move(descriptor));
    return number;
}

Descriptor DescriptorOf(int number) {
    const auto found = Space().descriptors.find(number);
    return found == Space().descriptors.end() ? nullptr : found->second;
}

void CloseDescriptor(int number) {
    if (Space().descriptors.erase(number) == 0) {
        throw ContractBroken("a descriptor is closed that is not open");
    }
}

void CountConnection(int change) {
    Space().connections += static_cast<std::size_t>(change);
}

bool DescriptorTableIsFull() {
    return OpenDescriptors() >= Space().limit;
}

void SetDescriptorLimit(std::size_t limit) {
    Space().limit = limit;
}

std::size_t OpenDescriptors() {
    std::size_t count = Space().descriptors.size() + Space().connections;
    for (const auto& [name, port] : Space().ports) {
        count += (port.receive != nullptr ? 1U : 0U) + (port.send != nullptr ? 1U : 0U);
    }
    return count;
}

std::size_t PortNames() {
    return Space().ports.size();
}

std::vector<mach_port_t> ListPortNames() {
    std::vector<mach_port_t> names;
    for (const auto& [name, port] : Space().ports) {
        names.push_back(name);
    }
    return names;
}

bool Peer::send(std::span<const std::byte> datagram, std::vector<Descriptor> descriptors) {
    const auto other = endpoint_ == nullptr ? nullptr : endpoint_->other.lock();
    if (other == nullptr || !other->hasRoom()) {
        return false;
    }
    other->inbox.push_back({.bytes = std::vector<std::byte>(datagram.begin(), datagram.end()),
                            .descriptors = std::move(descriptors)});
    return true;
}

std::optional<Datagram> Peer::receive() {
    if (endpoint_ == nullptr || endpoint_->inbox.empty()) {
        return std::nullopt;
    }
    auto datagram = std::move(endpoint_->inbox.front());
    endpoint_->inbox.pop_front();
    return datagram;
}

WatchPair MakeWatchPair() {
    std::shared_ptr<Endpoint> passed;
    Peer kept(MakePair(&passed));
    return {.kept = std::move(kept), .passed = std::move(passed)};
}

Peer PeerOf(const Descriptor& descriptor) {
    return Peer(std::dynamic_pointer_cast<Endpoint>(descriptor));
}

Peer Connect(const Identity& identity, std::string_view service) {
    StartProcess(identity.pid);
    std::shared_ptr<Endpoint> waiting;
    Peer peer(MakePair(&waiting));
    waiting->peer = identity;
    ServiceOf(service).waiting.push_back(std::move(waiting));
    return peer;
}

std::size_t WaitingConnections(std::string_view service) {
    return ServiceOf(service).waiting.size();
}

void HoldServiceElsewhere(std::string_view service) {
    ServiceOf(service).isHeldElsewhere = true;
}

void EndDaemon() {
    ResetMainLoop();
    ResetQueues();
    const auto ports = std::exchange(Space().ports, {});
    const auto descriptors = std::exchange(Space().descriptors, {});
}

void ResetPorts() {
    EndDaemon();
    const auto services = std::exchange(Space().services, {});
    Space().limit = kDescriptorLimit;
}

}  // namespace sim

namespace platform {

kern_return_t mach_port_allocate(MachPortRight right, mach_port_t* name) {
    if (right != MachPortRight::kReceive) {
        return KERN_INVALID_ARGUMENT;
    }
    if (sim::CallFails("mach_port_allocate") || sim::OpenDescriptors() + 2 > sim::Space().limit) {
        return KERN_RESOURCE_SHORTAGE;
    }
    std::shared_ptr<sim::Endpoint> other;
    auto receive = sim::MakePair(&other);
    *name =
        sim::AddPort({.hasReceive = true, .receive = std::move(receive), .send = std::move(other)});
    return KERN_SUCCESS;
}

kern_return_t mach_port_insert_right(mach_port_t name, MachMsgType disposition) {
    if (sim::CallFails("mach_port_insert_right", sim::Hex(name))) {
        return KERN_INVALID_RIGHT;
    }
    sim::Port* const port = sim::FindPort(name);
    if (port == nullptr) {
        return KERN_INVALID_NAME;
    }
    if (disposition != MachMsgType::kMakeSend) {
        return KERN_INVALID_ARGUMENT;
    }
    if (!port->hasReceive) {
        return KERN_INVALID_RIGHT;
    }
    ++port->sendRights;
    return KERN_SUCCESS;
}

kern_return_t mach_port_mod_refs(mach_port_t name, MachPortRight right, int delta) {
    const bool isReceive = right == MachPortRight::kReceive;
    sim::NoteCall("mach_port_mod_refs", sim::Hex(name) + (isReceive ? " receive" : " send"));
    sim::Port* const port = sim::FindPort(name);
    if (delta != -1) {
        return KERN_INVALID_ARGUMENT;
    }
    if (port == nullptr) {
        return KERN_INVALID_NAME;
    }
    if (isReceive ? !port->hasReceive : port->sendRights == 0) {
        return KERN_INVALID_RIGHT;
    }
    if (isReceive) {
        port->hasReceive = false;
        const auto receive = std::exchange(port->receive, nullptr);
        const auto send = std::exchange(port->send, nullptr);
        port->service.clear();
    } else {
        --port->sendRights;
    }
    sim::ForgetIfUnused(name);
    return KERN_SUCCESS;
}

kern_return_t mach_port_deallocate(mach_port_t name) {
    sim::NoteCall("mach_port_deallocate", sim::Hex(name));
    sim::Port* const port = sim::FindPort(name);
    if (port == nullptr) {
        return KERN_INVALID_NAME;
    }
    if (port->sendRights == 0) {
        return KERN_INVALID_RIGHT;
    }
    --port->sendRights;
    sim::ForgetIfUnused(name);
    return KERN_SUCCESS;
}

kern_return_t bootstrap_check_in(std::string_view serviceName, mach_port_t* port) {
    if (sim::CallFails("bootstrap_check_in", serviceName) ||
        sim::ServiceOf(serviceName).isHeldElsewhere) {
        return KERN_FAILURE;
    }
    const bool isTaken = std::ranges::any_of(
        sim::Space().ports, [&](const auto& entry) { return entry.second.service == serviceName; });
    if (isTaken) {
        return KERN_FAILURE;
    }
    *port = sim::AddPort({.hasReceive = true, .service = std::string(serviceName)});
    return KERN_SUCCESS;
}

kern_return_t AdoptPortDescriptor(int descriptor, mach_port_t* name) {
    if (sim::CallFails("AdoptPortDescriptor")) {
        return KERN_RESOURCE_SHORTAGE;
    }
    *name = sim::AddPort({.sendRights = 1, .send = sim::DescriptorOf(descriptor)});
    sim::CloseDescriptor(descriptor);
    return KERN_SUCCESS;
}

kern_return_t ReadMemoryDescriptor(int descriptor, std::span<std::byte> into) {
    if (sim::CallFails("ReadMemoryDescriptor")) {
        return MIG_BAD_ARGUMENTS;
    }
    const auto file = std::dynamic_pointer_cast<sim::MemoryFile>(sim::DescriptorOf(descriptor));
    if (file == nullptr || !file->isSealed || file->bytes.size() < into.size()) {
        return MIG_BAD_ARGUMENTS;
    }
    std::ranges::copy(std::span(file->bytes).first(into.size()), into.begin());
    return KERN_SUCCESS;
}

}  // namespace platform
