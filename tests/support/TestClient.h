// A process that checks in with the helper and sends it requests.
#pragma once

#include <optional>
#include <utility>

#include "platform/PropertyList.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimClient.h"
#include "tests/support/Messages.h"

inline constexpr std::string_view kAllowed = "com.vendra.Halvane.LinefoldHelper.allow";
inline constexpr std::uint32_t kEntitledGroup = 300;
inline constexpr std::uint32_t kOtherGroup = 400;

/// What a call answers when no reply came.
inline constexpr platform::kern_return_t kNoReply = 0x7FFFFFFF;

class TestClient {
public:
    explicit TestClient(std::int32_t pid = 100, std::uint32_t gid = kEntitledGroup)
        : identity{.pid = pid, .uid = 501, .gid = gid} {}

    static void entitleGroup() {
        sim::GrantToGroup(kEntitledGroup, kAllowed, platform::PropertyList(true));
    }

    /// Connects and sends the check-in with a new watch port.
    void sendCheckIn() {
        auto pair = sim::MakeWatchPair();
        watch = std::move(pair.kept);
        service = sim::Connect(identity, kServiceName);
        (void)service.send(messages::CheckIn(), {std::move(pair.passed)});
    }

    /// Takes the private port out of the reply, if there is one.
    platform::kern_return_t readCheckIn() {
        const auto reply = service.receive();
        if (!reply.has_value()) {
            return kNoReply;
        }
        if (!reply->descriptors.empty()) {
            privatePort = sim::PeerOf(reply->descriptors.front());
        }
        return messages::CodeOf(reply->bytes);
    }

    platform::kern_return_t checkIn() {
        sendCheckIn();
        sim::Settle();
        return readCheckIn();
    }

    std::optional<sim::Datagram> call(const messages::Bytes& request,
                                      std::vector<sim::Descriptor> descriptors = {}) {
        if (!privatePort.send(request, std::move(descriptors))) {
            return std::nullopt;
        }
        sim::Settle();
        return privatePort.receive();
    }

    platform::kern_return_t codeOf(const messages::Bytes& request,
                                   std::vector<sim::Descriptor> descriptors = {}) {
        const auto reply = call(request, std::move(descriptors));
        return reply.has_value() ? messages::CodeOf(reply->bytes) : kNoReply;
    }

    void closeAll() {
        watch.close();
        service.close();
        privatePort.close();
    }

    void die() {
        closeAll();
        sim::ExitProcess(identity.pid);
    }

    const sim::Identity identity;
    sim::Peer service;
    sim::Peer privatePort;
    sim::Peer watch;
};
