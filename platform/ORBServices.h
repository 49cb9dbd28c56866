// The geocoding services: the configured country, reverse geocoding, and this device's public
// address.
//
// Nothing here waits: what takes time is a ticket, whose answer runs as one task on the queue that
// it was submitted with. Every submitted ticket is answered at most once; some never are, so who
// waits sets a limit of his own. From any thread.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/SerialQueue.h"

namespace platform {

/// Why a look-up came to nothing.
struct ORBError {
    std::string description;
};

/// Texts are UTF-8 without control characters; one that is not known is not there.
struct ORBStructuredAddress {
    std::optional<std::string> countryCode{};         ///< two capital letters
    std::optional<std::string> administrativeArea{};  ///< the state
    std::optional<std::string> locality{};            ///< the city
    std::optional<std::string> postCode{};
};

struct ORBAddress {
    std::optional<ORBStructuredAddress> structuredAddress{};
};

struct ORBMapItem {
    bool isValid = true;
    std::optional<ORBAddress> orbAddress{};
};

/// The best item first; an item that is not there has no value.
using ORBMapItems = std::vector<std::optional<ORBMapItem>>;

struct OrbIpLookupResult {
    std::string ipAddress;  ///< IPv4 or IPv6 in text form; empty when the service told none
};

class ORBCountryConfiguration {
public:
    [[nodiscard]] static ORBCountryConfiguration& sharedConfiguration();

    ORBCountryConfiguration(const ORBCountryConfiguration&) = delete;
    ORBCountryConfiguration& operator=(const ORBCountryConfiguration&) = delete;

    /// As it is configured now; none when it is not.
    [[nodiscard]] std::optional<std::string> countryCode() const;

protected:
    ORBCountryConfiguration() = default;
    ~ORBCountryConfiguration() = default;
};

/// Either items or an error, or neither.
using ORBReverseGeocodeHandler = std::function<void(const std::optional<ORBMapItems>& items,
                                                    const std::optional<ORBError>& error)>;

/// Either a result or an error, or neither.
using OrbIpLookupHandler = std::function<void(const std::optional<OrbIpLookupResult>& result,
                                              const std::optional<ORBError>& error)>;

/// One look-up, which begins when it is submitted, once.
class ORBReverseGeocodeTicket {
public:
    ORBReverseGeocodeTicket(const ORBReverseGeocodeTicket&) = delete;
    ORBReverseGeocodeTicket& operator=(const ORBReverseGeocodeTicket&) = delete;

    void submitWithHandler(ORBReverseGeocodeHandler handler, const SerialQueue& queue);

protected:
    ORBReverseGeocodeTicket() = default;
    ~ORBReverseGeocodeTicket() = default;
};

class OrbIpLookupTicket {
public:
    OrbIpLookupTicket(const OrbIpLookupTicket&) = delete;
    OrbIpLookupTicket& operator=(const OrbIpLookupTicket&) = delete;

    void submitWithHandler(OrbIpLookupHandler handler, const SerialQueue& queue);

protected:
    OrbIpLookupTicket() = default;
    ~OrbIpLookupTicket() = default;
};

/// Degrees.
struct ORBCoordinate {
    double latitude = 0;
    double longitude = 0;
};

struct ORBReverseGeocodeOptions {
    bool includeETA = false;
    bool shiftLocationsIfNeeded = false;
};

class ORBMapService {
public:
    [[nodiscard]] static ORBMapService& sharedService();

    ORBMapService(const ORBMapService&) = delete;
    ORBMapService& operator=(const ORBMapService&) = delete;

    /// Null when the service has none to give. Any numbers will do: what is no place on earth is an
    /// error in the answer.
    [[nodiscard]] std::shared_ptr<ORBReverseGeocodeTicket> ticketForReverseGeocodeCoordinate(
        ORBCoordinate coordinate, ORBReverseGeocodeOptions options);

    /// Of an address, or, without one, of this device's own public address. Null as above.
    [[nodiscard]] std::shared_ptr<OrbIpLookupTicket> ticketForOrbIpLookupForIpAddr(
        const std::optional<std::string>& address);

protected:
    ORBMapService() = default;
    ~ORBMapService() = default;
};

}  // namespace platform
