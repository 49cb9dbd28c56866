// The heartbeat: an echo request every two seconds, and a hold on the server while it beats.
#pragma once

#include <cstdint>
#include <memory>

#include "platform/SerialQueue.h"

struct MobileHelperServer;

/// The heartbeat of the process. All but the queue is touched on that queue only. It is there from
/// the start of the process and never goes: the queue's thread may reach it until the very end.
struct HeartbeatMonitor {
    platform::SerialQueue queue{"com.vendra.otaheartbeat"};
    std::shared_ptr<platform::SerialQueue::Timer> timer;  ///< null when stopped
    std::uint32_t hold = 0;                               ///< 0 when none is held
    MobileHelperServer* server = nullptr;                 ///< of the client that started it last
};

[[nodiscard]] HeartbeatMonitor& TheHeartbeatMonitor();

/// On the heartbeat queue. Beats twice, then every two seconds, and takes a hold on the server. A
/// second start without a stop forgets the first one's hold, which then nobody ever releases: on
/// purpose. Without a server nothing is started.
void HeartbeatStart(MobileHelperServer* server);

/// On the heartbeat queue. Stops beating and releases the hold, on this server and not on the one
/// that it was taken on. A stop while stopped changes nothing; there may be no server.
void HeartbeatStop(MobileHelperServer* server);

/// What the end of the process does: hands a stop to the queue and waits for nothing.
void HeartbeatCleanUp();
