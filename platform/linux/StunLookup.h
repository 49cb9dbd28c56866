// Asking a STUN server under which address it sees this device.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

struct StunServer {
    std::string host;
    std::string port;

    bool operator==(const StunServer&) const = default;
};

/// Of "host", "host:port", "address" or "[address]:port"; none for what is neither.
[[nodiscard]] std::optional<StunServer> ParseStunServer(std::string_view text);

/// An address, or an error that tells why there is none.
struct StunAnswer {
    std::string address{};
    std::string error{};
};

/// Starts a look-up, which never waits on the caller's thread, and gives its answer once on a
/// thread of its own, within 5 seconds. `share` is kept until all that belongs to the look-up is
/// over, also a name resolution that nobody waits for any more.
void StartStunLookup(const StunServer& server,
                     std::shared_ptr<void> share,
                     std::function<void(StunAnswer)> answered);

}  // namespace platform
