#include "lasd/Notifications.h"

#include "platform/MessagePort.h"

using platform::PropertyList;

namespace {

constexpr const char* kPortName = "com.vendra.Linefold.lasd";
constexpr std::int32_t kMessageId = 0;

const char* NameOf(NotificationKind kind) {
    switch (kind) {
        case NotificationKind::kUpdateAvailable:
            return "com.vendra.lasd.UpdateAvailable";
        case NotificationKind::kNoUpdateRequired:
            return "com.vendra.lasd.NoUpdateRequired";
        case NotificationKind::kUpdateFailed:
            break;
    }
    return "com.vendra.lasd.UpdateFailed";
}

}  // namespace

PropertyList MakeNotification(NotificationKind kind, DatabaseType type) {
    PropertyList::Dictionary notification{{"Notification", PropertyList(NameOf(kind))}};
    if (kind == NotificationKind::kUpdateAvailable && IsKnownDatabaseType(type)) {
        notification.emplace_back("DBType", PropertyList(DatabaseTypeName(type)));
    }
    return PropertyList(std::move(notification));
}

void SendNotification(const PropertyList& notification) {
    if (const auto data = platform::PropertyListCreateBinaryData(notification)) {
        // Whether somebody is there to hear of it makes no difference.
        (void)platform::MessagePortSendRequest(kPortName, kMessageId, *data);
    }
}
