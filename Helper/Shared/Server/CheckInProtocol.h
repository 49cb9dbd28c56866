// The check-in protocol: the one routine on the service port.
#pragma once

#include "Helper/Shared/Server/MigSubsystem.h"

extern const MigSubsystem kCheckInSubsystem;
