// What the telephony daemon is told of a check's outcome.
#pragma once

#include <cstdint>

#include "lasd/DatabaseTypes.h"
#include "platform/PropertyList.h"

enum class NotificationKind : std::uint8_t {
    kUpdateAvailable = 0,
    kNoUpdateRequired = 1,
    kUpdateFailed = 2,
};

/// The type is told of an update that was installed, and only if it is one of the five.
[[nodiscard]] platform::PropertyList MakeNotification(NotificationKind kind, DatabaseType type);

/// Sends it to the telephony daemon's port. Where there is none it is lost, and nobody hears of it.
void SendNotification(const platform::PropertyList& notification);
