#include "location/WanAddress.h"

#include "Helper/Shared/Server/RequestProtocol.h"
#include "location/LocationWaitFlag.h"
#include "location/TelephonyClient.h"
#include "platform/Log.h"
#include "platform/ORBServices.h"

using namespace platform;

namespace {

void WanIPLookupTimedOut() {
    if (LocationWaitFlagTake()) {
        TelephonyClient::sendWanIPToHV("");
    }
}

void WanIPLookupAnswered(const std::optional<OrbIpLookupResult>& result,
                         const std::optional<ORBError>& error) {
    if (!LocationWaitFlagTake()) {
        Log(LogLevel::kDefault, "_RequestWanIPFromLocation wasn't waiting for response from ORB");
        return;
    }
    if (error) {
        Log(LogLevel::kError, "_RequestWanIPFromLocation error: (%s)", error->description.c_str());
        TelephonyClient::sendWanIPToHV("");
        return;
    }
    // Neither an error nor a result: there is no address.
    const std::string address = result ? result->ipAddress : std::string();
    Log(LogLevel::kDefault, "_RequestWanIPFromLocation WAN IP: %s", address.c_str());
    TelephonyClient::sendWanIPToHV(address);
}

}  // namespace

void _RequestWanIPFromLocation(const LocationShare& share) {
    const auto ticket = ORBMapService::sharedService().ticketForOrbIpLookupForIpAddr(std::nullopt);
    LocationWaitFlagSet();
    ScheduleLocationTimeOut(share, WanIPLookupTimedOut);
    // Without a ticket the time-out will report.
    if (ticket != nullptr) {
        ticket->submitWithHandler(WanIPLookupAnswered, LocationLookupQueue());
    }
}

kern_return_t server_LFMobileHelperRequestWanIPFromLocation(mach_port_t /*port*/) {
    Log(LogLevel::kDebug, "server_LFMobileHelperRequestWanIPFromLocation");
    QueueLocationLookup(_RequestWanIPFromLocation);
    return KERN_SUCCESS;
}
