#include "tools/linefold-sim/Roles.h"

#include <vector>

#include "tools/linefold-sim/ConfigurationServer.h"
#include "tools/linefold-sim/Geocoder.h"
#include "tools/linefold-sim/Stun.h"
#include "tools/linefold-sim/Telephony.h"

namespace simulator {

std::span<const Role> Roles() {
    static const std::vector<Role> roles{
        {.name = "configuration-server",
         .summary = "serve a folder as the index server does, over HTTPS",
         .help = kConfigurationServerHelp,
         .play = &PlayConfigurationServer},
        {"geocoder", "a geocoding server", kGeocoderHelp, PlayGeocoder},
        {"stun", "a STUN server", kStunHelp, PlayStun},
        {"telephony", "the telephony daemon", kTelephonyHelp, PlayTelephony},
    };
    return roles;
}

}  // namespace simulator
