// Cached preference values, dropped when a carrier's settings change under their readers.
#pragma once

#include <string_view>

/// Flushes the domain's caches for any user; a domain that is not UTF-8 flushes all of them.
void FlushPreferenceCaches(std::string_view domain);
