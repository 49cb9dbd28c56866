#include "location/CivicAddress.h"

#include "Helper/Shared/Server/RequestProtocol.h"
#include "location/CountryCode.h"
#include "location/LocationWaitFlag.h"
#include "location/TelephonyClient.h"
#include "platform/ORBServices.h"
#include "platform/SystemLog.h"

using namespace platform;

namespace {

constexpr auto kError = SystemLogPriority::kError;
constexpr auto kNotice = SystemLogPriority::kNotice;

void ReportConfiguredCountry() {
    TelephonyClient::sendCivicInfoToHV({.countryCode = CopyConfiguredCountryCode()});
}

void CivicLookupTimedOut() {
    if (LocationWaitFlagTake()) {
        ReportConfiguredCountry();
    }
}

/// Takes over what is known, each value with its line in the log.
CivicFields FieldsOfAddress(const ORBStructuredAddress& address) {
    CivicFields fields;
    if (address.countryCode) {
        SystemLog(kNotice,
                  "_RequestCivicInfoFromLatitudeLongitude country code: %s",
                  address.countryCode->c_str());
        fields.countryCode = *address.countryCode;
    }
    if (address.administrativeArea) {
        SystemLog(kNotice,
                  "_RequestCivicInfoFromLatitudeLongitude state: %s",
                  address.administrativeArea->c_str());
        fields.state = *address.administrativeArea;
    }
    if (address.locality) {
        SystemLog(
            kNotice, "_RequestCivicInfoFromLatitudeLongitude city: %s", address.locality->c_str());
        fields.city = *address.locality;
    }
    if (address.postCode) {
        SystemLog(kNotice,
                  "_RequestCivicInfoFromLatitudeLongitude postal code: %s",
                  address.postCode->c_str());
        fields.postalCode = *address.postCode;
    }
    return fields;
}

/// The first item alone counts. Two of the texts lack a "From": whoever looks for them in the log
/// knows them so.
CivicFields FieldsOfItems(const ORBMapItems& items) {
    SystemLog(kNotice,
              "_RequestCivicInfoFromLatitudeLongitude mapItems: (%lu)",
              static_cast<unsigned long>(items.size()));
    const auto& item = items.front();
    if (!item || !item->isValid) {
        SystemLog(kError, "_RequestCivicInfoLatitudeLongitude NULL mapItem \n");
        return {};
    }
    if (!item->orbAddress || !item->orbAddress->structuredAddress) {
        SystemLog(kError,
                  "_RequestCivicInfoLatitudeLongitude mapItem didn't get a structured address");
        return {};
    }
    return FieldsOfAddress(*item->orbAddress->structuredAddress);
}

CivicFields FieldsOfAnswer(const std::optional<ORBMapItems>& items,
                           const std::optional<ORBError>& error) {
    if (error) {
        SystemLog(kError,
                  "_RequestCivicInfoFromLatitudeLongitude error: (%s)",
                  error->description.c_str());
    }
    // An error has this line, too.
    if (error || !items || items->empty()) {
        SystemLog(kError, "_RequestCivicInfoFromLatitudeLongitude didn't get any mapItems\n");
        return {};
    }
    return FieldsOfItems(*items);
}

/// Whatever the answer says, it is reported, if only with the configured country.
void CivicLookupAnswered(const std::optional<ORBMapItems>& items,
                         const std::optional<ORBError>& error) {
    if (!LocationWaitFlagTake()) {
        SystemLog(kError,
                  "_RequestCivicInfoFromLatitudeLongitude wasn't waiting for response from ORB");
        return;
    }
    CivicFields fields = FieldsOfAnswer(items, error);
    if (fields.countryCode.empty()) {
        fields.countryCode = CopyConfiguredCountryCode();
    }
    TelephonyClient::sendCivicInfoToHV(fields);
}

}  // namespace

void _RequestCivicInfoFromLatitudeLongitude(double latitude,
                                            double longitude,
                                            const LocationShare& share) {
    // Nobody is there: it is what a device says that does not know where it is. A NaN is looked up.
    if (latitude == 0.0 && longitude == 0.0) {
        LocationTimeOutQueue().async([share] { ReportConfiguredCountry(); });
        return;
    }
    const auto ticket = ORBMapService::sharedService().ticketForReverseGeocodeCoordinate(
        {.latitude = latitude, .longitude = longitude},
        {.includeETA = false, .shiftLocationsIfNeeded = true});
    LocationWaitFlagSet();
    ScheduleLocationTimeOut(share, CivicLookupTimedOut);
    // Without a ticket the time-out will report.
    if (ticket != nullptr) {
        ticket->submitWithHandler(CivicLookupAnswered, LocationLookupQueue());
    }
}

kern_return_t server_LFMobileHelperRequestCountryCodeFromLocation(mach_port_t /*port*/,
                                                                  double latitude,
                                                                  double longitude) {
    // At error priority on purpose.
    SystemLog(kError, "server_LFMobileHelperRequestCountryCodeFromLocation \n");
    QueueLocationLookup([latitude, longitude](const LocationShare& share) {
        _RequestCivicInfoFromLatitudeLongitude(latitude, longitude, share);
    });
    return KERN_SUCCESS;
}
