// The country code that the geocoding services are configured with.
#pragma once

#include <string>

/// Empty, with a line in the system log, when there is none.
[[nodiscard]] std::string CopyConfiguredCountryCode();
