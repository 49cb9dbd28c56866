#include "platform/MessagePort.h"

#include <map>
#include <stdexcept>
#include <string>
#include <utility>

#include "platform/sim/SimMessagePort.h"
#include "platform/sim/World.h"

namespace sim {
namespace {

struct MessagePort {
    std::size_t capacity = 0;
    std::vector<PortMessage> messages{};
};

std::map<std::string, MessagePort, std::less<>>& OpenPorts() {
    static auto& ports = *new std::map<std::string, MessagePort, std::less<>>;
    return ports;
}

}  // namespace

void OpenMessagePort(std::string_view name, std::size_t capacity) {
    OpenPorts().insert_or_assign(std::string(name), MessagePort{.capacity = capacity});
}

void CloseMessagePort(std::string_view name) {
    OpenPorts().erase(std::string(name));
}

std::vector<PortMessage> TakePortMessages(std::string_view name) {
    const auto port = OpenPorts().find(name);
    if (port == OpenPorts().end()) {
        throw std::invalid_argument("nobody owns the port " + std::string(name));
    }
    return std::exchange(port->second.messages, {});
}

void ResetMessagePorts() {
    OpenPorts().clear();
}

}  // namespace sim

bool platform::MessagePortSendRequest(std::string_view portName,
                                      std::int32_t messageId,
                                      std::span<const std::byte> data) {
    const bool fails = sim::CallFails("MessagePortSendRequest", portName);
    const auto port = sim::OpenPorts().find(portName);
    if (fails || port == sim::OpenPorts().end() ||
        port->second.messages.size() == port->second.capacity) {
        return false;
    }
    port->second.messages.push_back(
        {.id = messageId, .data = std::vector(data.begin(), data.end())});
    return true;
}
