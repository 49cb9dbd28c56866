// Addresses of servers as the configuration spells them.
#pragma once

#include <string_view>

namespace lfhelper::doctor {

/// host or host:port, where an IPv6 address stands in brackets.
[[nodiscard]] bool IsHostAndPort(std::string_view text);

/// An http or https URL with a host.
[[nodiscard]] bool IsHttpUrl(std::string_view text);

}  // namespace lfhelper::doctor
