// The device's public address, looked up and reported to the telephony daemon.
#pragma once

#include "location/LocationQueues.h"

/// On LocationLookupQueue.
void _RequestWanIPFromLocation(const LocationShare& share);
