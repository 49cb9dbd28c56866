#include "client/HelperConnection.h"

#include <sys/socket.h>

#include <cerrno>
#include <cstring>
#include <ctime>

#include "client/RequestMessage.h"
#include "client/linefold_helper.h"

namespace linefold_client {
namespace {

/// Pauses of 2, 4, 8 ... 1024 ms between two tries: about two seconds in all.
constexpr unsigned kMaxPauses = 10;
constexpr long kFirstPauseNs = 2'000'000;
constexpr long kSecondNs = 1'000'000'000;

void PauseBeforeTry(unsigned tryNumber) {
    const long lengthNs = kFirstPauseNs << tryNumber;
    timespec rest{.tv_sec = lengthNs / kSecondNs, .tv_nsec = lengthNs % kSecondNs};
    while (nanosleep(&rest, &rest) != 0 && errno == EINTR) {
    }
}

/// Nothing when connecting again may help.
std::optional<std::int32_t> CodeOfConnectResult(ConnectResult result) {
    switch (result) {
        case ConnectResult::kConnected:
            return LF_MOBILE_HELPER_SUCCESS;
        case ConnectResult::kNoService:
            return LF_MOBILE_HELPER_ERROR_NO_SERVICE;
        case ConnectResult::kRefused:
            return std::nullopt;
        case ConnectResult::kNotAService:
            return LF_MOBILE_HELPER_ERROR_NOT_A_SERVICE;
        case ConnectResult::kNoPermission:
            return LF_MOBILE_HELPER_ERROR_NO_PERMISSION;
        case ConnectResult::kNoResources:
            break;
    }
    return LF_MOBILE_HELPER_ERROR_NO_RESOURCES;
}

/// A pair of which one end goes to the service; it sees the other end close.
bool MakeWatchPort(Descriptor& ours, Descriptor& theirs) {
    std::array<int, 2> ends{-1, -1};
    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()) != 0) {
        return false;
    }
    ours = Descriptor(ends[0]);
    theirs = Descriptor(ends[1]);
    return true;
}

}  // namespace

HelperConnection::HelperConnection(std::string_view servicePath) {
    address_.sun_family = AF_UNIX;
    isPathTooLong_ = servicePath.size() >= sizeof address_.sun_path;
    if (!isPathTooLong_) {
        std::memcpy(address_.sun_path, servicePath.data(), servicePath.size());
    }
}

std::int32_t HelperConnection::checkIn() {
    forgetAfterFork();
    if (privatePort_.isOpen()) {
        return LF_MOBILE_HELPER_SUCCESS;
    }
    if (isPathTooLong_) {
        return LF_MOBILE_HELPER_ERROR_PATH_TOO_LONG;
    }
    for (unsigned tryNumber = 0; tryNumber <= kMaxPauses; ++tryNumber) {
        if (const auto code = tryCheckIn()) {
            return *code;
        }
        if (tryNumber < kMaxPauses) {
            PauseBeforeTry(tryNumber);
        }
    }
    return LF_MOBILE_HELPER_ERROR_NO_SERVICE;
}

std::int32_t HelperConnection::exchange(const OutgoingMessage& request,
                                        std::span<std::byte> buffer,
                                        IncomingMessage& incoming) {
    constexpr int kMaxTries = 2;
    for (int tryNumber = 0; tryNumber < kMaxTries; ++tryNumber) {
        if (const auto code = checkIn(); code != LF_MOBILE_HELPER_SUCCESS) {
            return code;
        }
        switch (SendMessage(privatePort_.get(), request)) {
            case SendResult::kSent:
                return receiveReply(buffer, incoming);
            case SendResult::kPeerGone:
                disconnect();
                break;
            case SendResult::kTooLarge:
                return LF_MOBILE_HELPER_ERROR_ARGUMENT_TOO_LONG;
            case SendResult::kNoResources:
                return LF_MOBILE_HELPER_ERROR_NO_RESOURCES;
        }
    }
    return LF_MOBILE_HELPER_ERROR_NO_SERVICE;
}

std::int32_t HelperConnection::call(const RoutineLayout& layout,
                                    const OutgoingMessage& request,
                                    Reply& reply,
                                    Descriptor& data) {
    IncomingMessage incoming;
    if (const auto code = exchange(request, replyBuffer_, incoming);
        code != LF_MOBILE_HELPER_SUCCESS) {
        return code;
    }
    const std::int32_t code = ParseReply(layout, replyBuffer_, incoming, reply);
    if (code == LF_MOBILE_HELPER_ERROR_INVALID_REPLY) {
        disconnect();
    }
    data = std::move(incoming.descriptor);
    return code;
}

void HelperConnection::disconnect() {
    privatePort_.reset();
    watch_.reset();
}

/// Parent and child would take each other's replies from one socket.
void HelperConnection::forgetAfterFork() {
    if (const pid_t self = getpid(); self != process_) {
        disconnect();
        process_ = self;
    }
}

std::optional<std::int32_t> HelperConnection::tryCheckIn() {
    Descriptor service;
    if (const auto code = CodeOfConnectResult(ConnectToService(address_, service));
        code != LF_MOBILE_HELPER_SUCCESS) {
        return code;
    }
    Descriptor watch;
    Descriptor passed;
    if (!MakeWatchPort(watch, passed)) {
        return LF_MOBILE_HELPER_ERROR_NO_RESOURCES;
    }
    const CheckInMessage message = MakeCheckInMessage();
    switch (SendMessage(service.get(), {.message = message, .descriptor = passed.get()})) {
        case SendResult::kSent:
            passed.reset();
            return takeCheckInReply(service.get(), watch);
        case SendResult::kPeerGone:
            return std::nullopt;
        case SendResult::kTooLarge:
        case SendResult::kNoResources:
            break;
    }
    return LF_MOBILE_HELPER_ERROR_NO_RESOURCES;
}

std::optional<std::int32_t> HelperConnection::takeCheckInReply(int service, Descriptor& watch) {
    IncomingMessage incoming;
    switch (ReceiveMessage(service, replyBuffer_, incoming)) {
        case ReceiveResult::kReceived:
            break;
        case ReceiveResult::kPeerGone:
            return std::nullopt;
        case ReceiveResult::kNoResources:
            return LF_MOBILE_HELPER_ERROR_NO_RESOURCES;
    }
    std::int32_t returnCode = 0;
    const std::int32_t code = ParseCheckInReply(replyBuffer_, incoming, returnCode);
    if (code != LF_MOBILE_HELPER_SUCCESS || returnCode != LF_MOBILE_HELPER_SUCCESS) {
        return code != LF_MOBILE_HELPER_SUCCESS ? code : returnCode;
    }
    if (!MakeBlocking(incoming.descriptor.get())) {
        return LF_MOBILE_HELPER_ERROR_NO_RESOURCES;
    }
    privatePort_ = std::move(incoming.descriptor);
    watch_ = std::move(watch);
    return LF_MOBILE_HELPER_SUCCESS;
}

/// The request has left and may have been carried out, so it is not repeated from here on.
std::int32_t HelperConnection::receiveReply(std::span<std::byte> buffer,
                                            IncomingMessage& incoming) {
    switch (ReceiveMessage(privatePort_.get(), buffer, incoming)) {
        case ReceiveResult::kReceived:
            return LF_MOBILE_HELPER_SUCCESS;
        case ReceiveResult::kPeerGone:
            disconnect();
            return LF_MOBILE_HELPER_ERROR_CONNECTION_LOST;
        case ReceiveResult::kNoResources:
            break;
    }
    // The reply may still come, and would answer the next request.
    disconnect();
    return LF_MOBILE_HELPER_ERROR_NO_RESOURCES;
}

}  // namespace linefold_client
