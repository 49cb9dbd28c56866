#include "tools/linefold-sim/Roles.h"

#include <vector>

#include "tools/linefold-sim/ConfigurationServer.h"
#include "tools/linefold-sim/Geocoder.h"
#include "tools/linefold-sim/ModemManager.h"
#include "tools/linefold-sim/Stun.h"
#include "tools/linefold-sim/Telephony.h"

namespace simulator {

std::span<const Role> Roles() {
    static const std::vector<Role> roles{
        {.name = "configuration-server",
         .summary = "serve a folder as the index server does, over HTTPS",
         .help = kConfigurationServerHelp,
         .play = &PlayConfigurationServer},
        {.name = "geocoder",
         .summary = "tell the address of a place, by HTTP",
         .help = kGeocoderHelp,
         .play = &PlayGeocoder},
        {.name = "modem-manager",
         .summary = "own the modem manager's name on the bus and print what is asked",
         .help = kModemManagerHelp,
         .play = &PlayModemManager},
        {.name = "stun",
         .summary = "tell who asks under which address he is seen",
         .help = kStunHelp,
         .play = &PlayStun},
        {.name = "telephony",
         .summary = "own the telephony daemon's ports and print what arrives",
         .help = kTelephonyHelp,
         .play = &PlayTelephony},
    };
    return roles;
}

}  // namespace simulator
