#include "location/CountryCode.h"

#include <algorithm>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/ORBServices.h"
#include "platform/SystemLog.h"

using namespace platform;

std::string CopyConfiguredCountryCode() {
    if (auto countryCode = ORBCountryConfiguration::sharedConfiguration().countryCode()) {
        return std::move(*countryCode);
    }
    SystemLog(SystemLogPriority::kError, "Didn't get valid country code from OrbService.\n");
    return {};
}

kern_return_t server_LFMobileHelperCopyCountryCode(mach_port_t /*port*/,
                                                   OutString<64>& countryCode) {
    const std::string configured = CopyConfiguredCountryCode();
    // A code that fills the field has no NUL behind it, on purpose: readers know the field's size.
    const std::size_t length = configured.copy(countryCode.data(), countryCode.size());
    std::fill(countryCode.begin() + length, countryCode.end(), '\0');
    return KERN_SUCCESS;
}
