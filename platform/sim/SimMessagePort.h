// The named ports of other processes in the simulated world, and what arrived there.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

namespace sim {

struct PortMessage {
    std::int32_t id = 0;
    std::vector<std::byte> data{};

    bool operator==(const PortMessage&) const = default;
};

/// Somebody owns the port from now on; up to so many messages may wait there. Nobody does after
/// Reset.
void OpenMessagePort(std::string_view name, std::size_t capacity = 1000);
void CloseMessagePort(std::string_view name);

/// The owner takes what has arrived.
[[nodiscard]] std::vector<PortMessage> TakePortMessages(std::string_view name);

}  // namespace sim
