// One request from start to end, as a test sees it.
#pragma once

#include <string>

#include "platform/hvu/Http.h"

namespace web {

struct Fetched {
    bool hasResponse = false;
    hvu::Http::ErrorType error = hvu::Http::ErrorType::kUnknown;
    int status = 0;
    std::string body{};
    hvu::Http::HeaderMap headers{};
    bool isOnQueue = false;  ///< the completion came on the queue that was given
};

/// Waits for the completion.
[[nodiscard]] Fetched Get(const std::string& url,
                          hvu::Http::CellularUse use = hvu::Http::CellularUse::kAllowed);

/// The error alone.
[[nodiscard]] hvu::Http::ErrorType ErrorOf(
    const std::string& url, hvu::Http::CellularUse use = hvu::Http::CellularUse::kAllowed);

}  // namespace web
