// The telephony daemon's client interface: one short connection for each report to it.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/PropertyList.h"

namespace platform {

// The names of the telephony framework keep the spelling that everybody knows them by.

/// The status of a call: a success when `error` is 0.
struct HVError {
    std::int32_t domain = 0;
    std::int32_t error = 0;

    bool operator==(const HVError&) const = default;
};

/// The domain of errors whose number is an errno value, which the platform itself finds.
inline constexpr std::int32_t kHVErrorDomainPOSIX = 1;

/// An open connection; it ends with the last reference.
class HVServerConnection {
public:
    HVServerConnection(const HVServerConnection&) = delete;
    HVServerConnection& operator=(const HVServerConnection&) = delete;

protected:
    HVServerConnection() = default;
    ~HVServerConnection() = default;
};

/// Told what the daemon sends of its own accord while a call is under way, on the caller's thread.
using HVServerConnectionCallback = void (*)(HVServerConnection& connection,
                                            const PropertyList& notification,
                                            void* context);

/// Exempts a client from the daemon's rules for identifiers. It travels with each connection that
/// is made later; the same identifier again changes nothing. From any thread.
void _HVServerConnectionAddIdentifierException(std::string_view identifier);

/// Null when nobody owns the daemon's port. Never waits: a daemon that is too busy to take the
/// connection is waited for by the calls. From any thread, as all that follows.
[[nodiscard]] std::shared_ptr<HVServerConnection> _HVServerConnectionCreate(
    HVServerConnectionCallback callback, void* context);

// The calls wait for the daemon's answer. All that happens on one connection takes at most two
// seconds from its making, connecting included; then the error is {1, ETIMEDOUT}. A connection that
// breaks is {1, ECONNRESET}, an answer that is none {1, EBADMSG}, texts that cannot travel, such as
// those with control characters, {1, EINVAL}. An absent argument is not an empty one: the daemon
// is told which it is.

[[nodiscard]] HVError _HVServerConnectionSetCivicInfoBasedOnCurrentLocation(
    HVServerConnection& connection,
    const std::optional<std::string>& countryCode,
    const std::optional<std::string>& state,
    const std::optional<std::string>& city,
    const std::optional<std::string>& postalCode);

[[nodiscard]] HVError _HVServerConnectionSetLocalRoutableAddress(
    HVServerConnection& connection, const std::optional<std::string>& address);

}  // namespace platform
