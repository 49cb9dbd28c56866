// The servers that the simulated HTTP client finds, and what it asked of them.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/hvu/Http.h"

namespace sim {

/// What a server does with a request.
struct HttpAnswer {
    enum class Kind : std::uint8_t {
        kResponse,    ///< it answers, or fails with the error
        kNoResponse,  ///< the system has no HTTP client: the handler gets null
        kNever,       ///< the request stays without any end
    };

    Kind kind = Kind::kResponse;
    int status = 200;
    hvu::Http::HeaderMap headers{};
    std::string body{};
    hvu::Http::ErrorType error = hvu::Http::ErrorType::kNone;
    double delay = 0;  ///< seconds until the completion is handed to its queue
};

/// From now on requests for this URL are answered so. A URL without an answer cannot be connected
/// to.
void ServeUrl(std::string_view url, HttpAnswer answer);

enum class Network : std::uint8_t { kNone, kWifi, kCellular };

/// What the phone is attached to: Wi-Fi after Reset.
void AttachToNetwork(Network network);

struct HttpRequestSeen {
    std::string url;
    hvu::Http::HeaderMap headers;
    hvu::Http::CellularUse cellularUse = hvu::Http::CellularUse::kAllowed;
    std::string queue;  ///< label of the one that the completion goes to
};

/// The requests that were started, in their order, whatever became of them.
[[nodiscard]] const std::vector<HttpRequestSeen>& HttpRequests();

}  // namespace sim
