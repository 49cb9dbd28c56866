// Geocoding services whose answers a test decides.
#include "platform/ORBServices.h"

#include <cstdio>
#include <utility>

#include "platform/sim/SimLocation.h"
#include "platform/sim/World.h"

namespace {

struct Script {
    std::optional<std::string> countryCode = "US";
    sim::GeocodeAnswer geocode{};
    sim::IpAnswer ip{};
};

Script& TheScript() {
    static Script& script = *new Script;
    return script;
}

}  // namespace

namespace sim {

void SetCountryCode(std::optional<std::string> countryCode) {
    TheScript().countryCode = std::move(countryCode);
}

void AnswerReverseGeocode(GeocodeAnswer answer) {
    TheScript().geocode = std::move(answer);
}

void AnswerIpLookup(IpAnswer answer) {
    TheScript().ip = std::move(answer);
}

platform::ORBMapItems MapItemsOf(platform::ORBStructuredAddress address) {
    return {platform::ORBMapItem{
        .orbAddress = platform::ORBAddress{.structuredAddress = std::move(address)}}};
}

void ResetGeocoding() {
    TheScript() = {};
}

}  // namespace sim

namespace platform {
namespace {

/// A ticket counts as used from its submission on.
class TicketUse {
public:
    void use(const char* call, const SerialQueue& queue) {
        sim::NoteCall(call, queue.label());
        if (std::exchange(isUsed_, true)) {
            throw sim::ContractBroken("a ticket is submitted once");
        }
    }

private:
    bool isUsed_ = false;
};

class ReverseGeocodeTicket final : public ORBReverseGeocodeTicket {
public:
    TicketUse use;
};

class IpLookupTicket final : public OrbIpLookupTicket {
public:
    TicketUse use;
};

class CountryConfiguration final : public ORBCountryConfiguration {};

class MapService final : public ORBMapService {};

std::string Details(ORBCoordinate coordinate, ORBReverseGeocodeOptions options) {
    std::array<char, 128> text{};
    (void)std::snprintf(text.data(),
                        text.size(),
                        "%g %g%s%s",
                        coordinate.latitude,
                        coordinate.longitude,
                        options.includeETA ? " includeETA" : "",
                        options.shiftLocationsIfNeeded ? " shiftLocationsIfNeeded" : "");
    return text.data();
}

}  // namespace

ORBCountryConfiguration& ORBCountryConfiguration::sharedConfiguration() {
    static CountryConfiguration configuration;
    return configuration;
}

// NOLINTNEXTLINE(readability-convert-member-functions-to-static): the other twin's objects differ.
std::optional<std::string> ORBCountryConfiguration::countryCode() const {
    return sim::CallFails("ORBCountryConfiguration.countryCode") ? std::nullopt
                                                                 : TheScript().countryCode;
}

ORBMapService& ORBMapService::sharedService() {
    static MapService service;
    return service;
}

std::shared_ptr<ORBReverseGeocodeTicket> ORBMapService::ticketForReverseGeocodeCoordinate(
    ORBCoordinate coordinate, ORBReverseGeocodeOptions options) {
    const bool fails = sim::CallFails("ORBMapService.ticketForReverseGeocodeCoordinate",
                                      Details(coordinate, options));
    return fails ? nullptr : std::make_shared<ReverseGeocodeTicket>();
}

std::shared_ptr<OrbIpLookupTicket> ORBMapService::ticketForOrbIpLookupForIpAddr(
    const std::optional<std::string>& address) {
    const bool fails =
        sim::CallFails("ORBMapService.ticketForOrbIpLookupForIpAddr", address.value_or("(own)"));
    return fails ? nullptr : std::make_shared<IpLookupTicket>();
}

void ORBReverseGeocodeTicket::submitWithHandler(ORBReverseGeocodeHandler handler,
                                                const SerialQueue& queue) {
    static_cast<ReverseGeocodeTicket*>(this)->use.use("ORBReverseGeocodeTicket.submit", queue);
    const auto& answer = TheScript().geocode;
    if (!answer.isNever) {
        sim::In(answer.delay, [answer, queue, handler = std::move(handler)] {
            queue.async([answer, handler] { handler(answer.items, answer.error); });
        });
    }
}

void OrbIpLookupTicket::submitWithHandler(OrbIpLookupHandler handler, const SerialQueue& queue) {
    static_cast<IpLookupTicket*>(this)->use.use("OrbIpLookupTicket.submit", queue);
    const auto& answer = TheScript().ip;
    if (!answer.isNever) {
        sim::In(answer.delay, [answer, queue, handler = std::move(handler)] {
            queue.async([answer, handler] { handler(answer.result, answer.error); });
        });
    }
}

}  // namespace platform
