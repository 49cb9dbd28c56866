// The scripted geocoding services and telephony daemon.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "platform/HVServerConnection.h"
#include "platform/ORBServices.h"

namespace sim {

/// "US" to begin with; none: it is not configured.
void SetCountryCode(std::optional<std::string> countryCode);

/// What becomes of a submitted ticket.
struct GeocodeAnswer {
    double delay = 0;  ///< in seconds
    std::optional<platform::ORBMapItems> items{};
    std::optional<platform::ORBError> error{};
    bool isNever = false;
};

struct IpAnswer {
    double delay = 0;
    std::optional<platform::OrbIpLookupResult> result{};
    std::optional<platform::ORBError> error{};
    bool isNever = false;
};

/// Of all look-ups that are submitted from now on; the first answers come at once with neither
/// result nor error.
void AnswerReverseGeocode(GeocodeAnswer answer);
void AnswerIpLookup(IpAnswer answer);

/// One map item with this structured address.
[[nodiscard]] platform::ORBMapItems MapItemsOf(platform::ORBStructuredAddress address);

/// The telephony daemon, which is there and takes everything to begin with.
struct Telephony {
    bool isReachable = true;
    platform::HVError status{};
    double delay = 0;       ///< of each answer, in seconds; two at most, then it is a time-out
    int notifications = 0;  ///< sent before each answer
    std::function<void()> onReport{};  ///< runs where a report is made
};

void SetTelephony(Telephony telephony);

/// What it was told.
struct TelephonyReport {
    double time = 0;
    std::string call{};  ///< "civic" or "address"
    std::vector<std::optional<std::string>> texts{};
    std::vector<std::string> identifiers{};  ///< the exceptions that the connection had made known

    bool operator==(const TelephonyReport&) const = default;
};

[[nodiscard]] const std::vector<TelephonyReport>& TelephonyReports();

/// Connections that were made and not let go of.
[[nodiscard]] std::size_t TelephonyConnections();

}  // namespace sim
