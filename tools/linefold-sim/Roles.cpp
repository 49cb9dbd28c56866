#include "tools/linefold-sim/Roles.h"

#include <vector>

#include "tools/linefold-sim/Geocoder.h"
#include "tools/linefold-sim/Stun.h"
#include "tools/linefold-sim/Telephony.h"

namespace simulator {

std::span<const Role> Roles() {
    static const std::vector<Role> roles{
        {"geocoder", "a geocoding server", kGeocoderHelp, PlayGeocoder},
        {"stun", "a STUN server", kStunHelp, PlayStun},
        {"telephony", "the telephony daemon", kTelephonyHelp, PlayTelephony},
    };
    return roles;
}

}  // namespace simulator
