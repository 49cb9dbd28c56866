// Which texts are URLs that the HTTP client can use.
#pragma once

#include <string_view>

namespace hvu::Http {

/// True for an http or https URL (RFC 3986) that names a host and, if any, a port from 1 to 65535.
/// Blanks, control characters and bytes beyond ASCII are no part of a URL; at most 8 KiB.
[[nodiscard]] bool IsUsableUrl(std::string_view url);

}  // namespace hvu::Http
