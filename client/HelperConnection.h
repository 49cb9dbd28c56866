// A client's connection to the service: the check-in, the private port, and what renews them.
#pragma once

#include <sys/types.h>
#include <sys/un.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

#include "client/Descriptor.h"
#include "client/MessageSocket.h"
#include "client/Reply.h"

namespace linefold_client {

/// Not for concurrent use. Every result is 0 or a code for the caller of the library.
class HelperConnection final {
public:
    explicit HelperConnection(std::string_view servicePath);

    /// Connects and checks in unless that has been done.
    [[nodiscard]] std::int32_t checkIn();

    /// Sends one request, after a check-in if one is due, and receives its reply into `buffer`. A
    /// request that was not delivered is sent once more through a new check-in.
    [[nodiscard]] std::int32_t exchange(const OutgoingMessage& request,
                                        std::span<std::byte> buffer,
                                        IncomingMessage& incoming);

    /// The same with a buffer of its own; the reply is checked, and a wrong one ends the
    /// connection. The spans of the reply stand until the next call.
    [[nodiscard]] std::int32_t call(const RoutineLayout& layout,
                                    const OutgoingMessage& request,
                                    Reply& reply,
                                    Descriptor& data);

    /// Gives up the private port and the watch port, so the service forgets this client.
    void disconnect();

private:
    void forgetAfterFork();
    /// Nothing when connecting again may help.
    [[nodiscard]] std::optional<std::int32_t> tryCheckIn();
    [[nodiscard]] std::optional<std::int32_t> takeCheckInReply(int service, Descriptor& watch);
    [[nodiscard]] std::int32_t receiveReply(std::span<std::byte> buffer, IncomingMessage& incoming);

    sockaddr_un address_{};
    bool isPathTooLong_ = false;
    pid_t process_ = 0;
    Descriptor privatePort_;
    /// Our end of the watch port: the service sees this client die when it closes.
    Descriptor watch_;
    std::array<std::byte, kReplyBufferSize> replyBuffer_{};
};

}  // namespace linefold_client
