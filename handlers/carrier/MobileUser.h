// The mobile user: whose home the carrier's files live in.
#pragma once

#include <cstdint>
#include <string>

/// The home directory of the user "mobile", or null. Owned here; computed once with the two below.
[[nodiscard]] const char* _GetMobileUserDirectory();

/// 0 when there is no such user.
[[nodiscard]] std::uint32_t _GetMobileUserUID();
[[nodiscard]] std::uint32_t _GetMobileUserGID();

/// A copy of the home directory, made when the process starts; without a home it does not start.
extern const std::string MobileUserHome;
