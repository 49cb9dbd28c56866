// The simulated port space: the names of the daemon, and the ends of pairs behind them.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/MachPort.h"
#include "platform/sim/SimClient.h"

namespace sim {

struct Port {
    bool hasReceive = false;
    int sendRights = 0;
    std::shared_ptr<Endpoint> receive{};  ///< null for a service, and for a port that fell silent
    Descriptor send{};                    ///< leaves with the reply that hands the right out
    std::string service{};                ///< of a service port
};

/// The port of a name, or null.
[[nodiscard]] Port* FindPort(platform::mach_port_t name);

/// The next connection that waits at a service, or null.
[[nodiscard]] std::shared_ptr<Endpoint> AcceptConnection(std::string_view service);
[[nodiscard]] bool HasWaitingConnection(std::string_view service);

/// The daemon's descriptor table: what arrived with a message and nobody took over yet.
[[nodiscard]] int AddDescriptor(Descriptor descriptor);
[[nodiscard]] Descriptor DescriptorOf(int number);
void CloseDescriptor(int number);

[[nodiscard]] bool DescriptorTableIsFull();

/// Connections count as descriptors of the daemon.
void CountConnection(int change);

[[nodiscard]] std::shared_ptr<Endpoint> MakePair(std::shared_ptr<Endpoint>* other);

}  // namespace sim
