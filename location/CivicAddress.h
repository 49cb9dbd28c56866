// The civic address of a place, found by reverse geocoding and reported to the telephony daemon.
#pragma once

#include "location/LocationQueues.h"

/// On LocationLookupQueue.
void _RequestCivicInfoFromLatitudeLongitude(double latitude,
                                            double longitude,
                                            const LocationShare& share);
