#include "location/TelephonyClient.h"

#include <optional>

#include "platform/HVServerConnection.h"
#include "platform/Log.h"
#include "platform/SystemLog.h"
#include "platform/Utf8.h"

using namespace platform;

namespace {

constexpr const char* kClientIdentifier = "LinefoldMobileHelper";

void _ServerConnectionCallback(HVServerConnection& /*connection*/,
                               const PropertyList& /*notification*/,
                               void* /*context*/) {
    SystemLog(SystemLogPriority::kNotice, "_ServerConnectionCallback for LinefoldMobileHelper");
}

std::shared_ptr<HVServerConnection> OpenConnection() {
    // Before every connection, since the daemon may have been started anew.
    _HVServerConnectionAddIdentifierException(kClientIdentifier);
    return _HVServerConnectionCreate(_ServerConnectionCallback, nullptr);
}

/// What cannot be converted is absent, and the daemon decides what that means; an empty text is
/// one.
std::optional<std::string> Converted(const std::string& text) {
    return IsUtf8(text) ? std::optional(text) : std::nullopt;
}

}  // namespace

void TelephonyClient::sendCivicInfoToHV(const CivicFields& fields) {
    const auto connection = OpenConnection();
    if (connection == nullptr) {
        SystemLog(SystemLogPriority::kError,
                  "sendCivicInfoToHV to Linefold failed, could not open HVServerConnection");
        return;
    }
    const HVError status =
        _HVServerConnectionSetCivicInfoBasedOnCurrentLocation(*connection,
                                                              Converted(fields.countryCode),
                                                              Converted(fields.state),
                                                              Converted(fields.city),
                                                              Converted(fields.postalCode));
    // Both at notice priority, on purpose.
    if (status.error != 0) {
        SystemLog(SystemLogPriority::kNotice,
                  "sendCivicInfoToHV failed civic info to Linefold due to error: %d",
                  status.error);
    } else {
        SystemLog(SystemLogPriority::kNotice,
                  "sendCivicInfoToHV sent civic info to Linefold successfully");
    }
}

void TelephonyClient::sendWanIPToHV(const std::string& address) {
    const auto connection = OpenConnection();
    if (connection == nullptr) {
        Log(LogLevel::kError,
            "sendWanIPToHV to Linefold failed, could not open HVServerConnection");
        return;
    }
    const HVError status =
        _HVServerConnectionSetLocalRoutableAddress(*connection, Converted(address));
    if (status.error != 0) {
        Log(LogLevel::kError,
            "sendWanIPToHV failed WAN IP to Linefold due to error: %d",
            status.error);
    } else {
        Log(LogLevel::kDefault, "sendWanIPToHV sent WAN IP to Linefold successfully");
    }
}
