// The geocoding services of this system: what the configuration says, and two servers on the
// network. Nothing is ever guessed: what no server tells is an error.
#include "platform/ORBServices.h"

#include <atomic>
#include <cmath>
#include <utility>

#include "platform/linux/Geocoder.h"
#include "platform/linux/NetworkQueue.h"
#include "platform/linux/PlatformConfiguration.h"
#include "platform/linux/StunLookup.h"

namespace platform {
namespace {

/// Each may hold a thread, a socket and an answer.
constexpr int kLookUpsMax = 16;
constexpr const char* kTooMany = "too many look-ups are under way";

constexpr double kLatitudeMax = 90;
constexpr double kLongitudeMax = 180;

constinit std::atomic<int> lookUps = 0;

/// One look-up's share; null when there is none left. It may be given back on any thread.
std::shared_ptr<void> TakeShare() {
    if (++lookUps > kLookUpsMax) {
        --lookUps;
        return nullptr;
    }
    return {&lookUps, [](std::atomic<int>* taken) { --*taken; }};
}

bool IsOnEarth(ORBCoordinate coordinate) {
    return std::isfinite(coordinate.latitude) && std::isfinite(coordinate.longitude) &&
           std::fabs(coordinate.latitude) <= kLatitudeMax &&
           std::fabs(coordinate.longitude) <= kLongitudeMax;
}

class CountryConfiguration final : public ORBCountryConfiguration {};

class MapService final : public ORBMapService {};

class ReverseGeocodeTicket final : public ORBReverseGeocodeTicket {
public:
    explicit ReverseGeocodeTicket(ORBCoordinate coordinate) : coordinate_(coordinate) {}

    void submit(const std::function<void(GeocoderAnswer)>& answered) const {
        const auto server = PlatformConfigurationText("ReverseGeocodeURL");
        const auto refuse = [&answered](const char* why) {
            answered({.items = std::nullopt, .error = ORBError{why}});
        };
        if (!IsOnEarth(coordinate_)) {
            refuse("the coordinate is no place on earth");
        } else if (!server) {
            refuse("no geocoder is configured: ReverseGeocodeURL is missing");
        } else if (auto share = TakeShare()) {
            StartReverseGeocode(ReverseGeocodeUrl(*server, coordinate_),
                                [answered, share = std::move(share)](GeocoderAnswer answer) {
                                    answered(std::move(answer));
                                });
        } else {
            refuse(kTooMany);
        }
    }

private:
    const ORBCoordinate coordinate_;
};

class IpLookupTicket final : public OrbIpLookupTicket {
public:
    explicit IpLookupTicket(std::optional<std::string> address) : address_(std::move(address)) {}

    void submit(const std::function<void(StunAnswer)>& answered) const {
        const auto text = PlatformConfigurationText("StunServer");
        const auto server = text ? ParseStunServer(*text) : std::nullopt;
        if (address_) {
            answered({.error = "only this device's own address can be looked up"});
        } else if (!text) {
            answered({.error = "no STUN server is configured: StunServer is missing"});
        } else if (!server) {
            answered({.error = "StunServer is no host with or without a port"});
        } else if (auto share = TakeShare()) {
            StartStunLookup(*server, std::move(share), answered);
        } else {
            answered({.error = kTooMany});
        }
    }

private:
    const std::optional<std::string> address_;
};

}  // namespace

SerialQueue NetworkQueue() {
    static const SerialQueue& queue = *new SerialQueue("ORB network", QualityOfService::kUtility);
    return queue;
}

ORBCountryConfiguration& ORBCountryConfiguration::sharedConfiguration() {
    static CountryConfiguration configuration;
    return configuration;
}

// NOLINTNEXTLINE(readability-convert-member-functions-to-static): the other twin's objects differ.
std::optional<std::string> ORBCountryConfiguration::countryCode() const {
    return PlatformConfigurationText("CountryCode");
}

ORBMapService& ORBMapService::sharedService() {
    static MapService service;
    return service;
}

// Neither an estimated time of arrival nor shifted maps are things that the server knows of.
std::shared_ptr<ORBReverseGeocodeTicket> ORBMapService::ticketForReverseGeocodeCoordinate(
    ORBCoordinate coordinate, ORBReverseGeocodeOptions /*options*/) {
    return std::make_shared<ReverseGeocodeTicket>(coordinate);
}

std::shared_ptr<OrbIpLookupTicket> ORBMapService::ticketForOrbIpLookupForIpAddr(
    const std::optional<std::string>& address) {
    return std::make_shared<IpLookupTicket>(address);
}

void ORBReverseGeocodeTicket::submitWithHandler(ORBReverseGeocodeHandler handler,
                                                const SerialQueue& queue) {
    static_cast<ReverseGeocodeTicket*>(this)->submit(
        [queue, handler = std::move(handler)](const GeocoderAnswer& answer) {
            queue.async([answer, handler] { handler(answer.items, answer.error); });
        });
}

void OrbIpLookupTicket::submitWithHandler(OrbIpLookupHandler handler, const SerialQueue& queue) {
    static_cast<IpLookupTicket*>(this)->submit(
        [queue, handler = std::move(handler)](const StunAnswer& answer) {
            queue.async([answer, handler] {
                if (answer.error.empty()) {
                    handler(OrbIpLookupResult{.ipAddress = answer.address}, std::nullopt);
                } else {
                    handler(std::nullopt, ORBError{.description = answer.error});
                }
            });
        });
}

}  // namespace platform
