// The TCP packets that arrive at an interface of the gateway.
#pragma once

#include <cstddef>

#include "platform/linux/OwnedFd.h"

namespace web {

class PacketCapture {
public:
    /// From now on, over IPv4 and IPv6.
    explicit PacketCapture(const char* interface);

    /// How many have come since construction.
    [[nodiscard]] std::size_t tcpPackets();

private:
    platform::OwnedFd socket_;
    std::size_t count_ = 0;
};

}  // namespace web
