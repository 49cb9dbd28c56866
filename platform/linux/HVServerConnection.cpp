// The telephony daemon's port, /run/linefold/com.vendra.linefold.server: each message is a header
// and a property list behind it. docs/wire-protocol.md tells the messages.
#include "platform/HVServerConnection.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <sys/un.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <limits>
#include <mutex>
#include <utility>
#include <vector>

#include "platform/Clock.h"
#include "platform/MachMessage.h"
#include "platform/linux/OwnedFd.h"
#include "platform/linux/ServiceSocket.h"

namespace platform {
namespace {

constexpr std::string_view kPortName = "com.vendra.linefold.server";
constexpr double kSecondsMax = 2.0;

/// Of one connection: a daemon that goes on and on is not listened to for ever.
constexpr int kNotificationsMax = 64;
constexpr std::size_t kDatagramMax = 64U << 10;

constexpr std::int32_t kOpen = 1;
constexpr std::int32_t kSetCivicInfo = 2;
constexpr std::int32_t kSetLocalRoutableAddress = 3;
constexpr std::int32_t kReplyOffset = 100;
constexpr std::int32_t kNotification = 200;

HVError ErrorOf(int number) {
    return {.domain = kHVErrorDomainPOSIX, .error = number};
}

/// The identifiers that are exempted, in the order of their coming.
class IdentifierExceptions {
public:
    void add(std::string_view identifier) {
        const std::lock_guard guard(lock_);
        if (std::ranges::find(identifiers_, identifier) == identifiers_.end()) {
            identifiers_.emplace_back(identifier);
        }
    }

    [[nodiscard]] PropertyList list() {
        const std::lock_guard guard(lock_);
        PropertyList::Array list;
        for (const std::string& identifier : identifiers_) {
            list.emplace_back(identifier);
        }
        return PropertyList(std::move(list));
    }

private:
    std::mutex lock_;
    std::vector<std::string> identifiers_;  // under lock_
};

IdentifierExceptions& TheIdentifierExceptions() {
    static auto& exceptions = *new IdentifierExceptions;
    return exceptions;
}

sockaddr_un PortAddress() {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    const std::string path = std::string(kServiceDirectory) + "/" + std::string(kPortName);
    static_assert(kServiceDirectory.size() + kPortName.size() + 2 <= sizeof address.sun_path);
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    return address;
}

/// Only root puts things into the folder. A link there is none of ours all the same: it could lead
/// the report to somebody else.
bool IsSocket(const char* path) {
    struct stat status {};

    return lstat(path, &status) == 0 && S_ISSOCK(status.st_mode);
}

/// Adds an argument, unless it is absent.
void Put(PropertyList::Dictionary& body,
         const char* key,
         const std::optional<std::string>& argument) {
    if (argument) {
        body.emplace_back(key, PropertyList(*argument));
    }
}

/// A number of a reply; none when it is not there, no integer, or too large for a status.
std::optional<std::int32_t> Number(const PropertyList& reply, const char* key) {
    using Limits = std::numeric_limits<std::int32_t>;
    const PropertyList* const value = reply.find(key);
    const auto* const number = value == nullptr ? nullptr : value->as<std::int64_t>();
    return number != nullptr && *number >= Limits::min() && *number <= Limits::max()
               ? std::optional(static_cast<std::int32_t>(*number))
               : std::nullopt;
}

class PortConnection final : public HVServerConnection {
public:
    PortConnection(OwnedFd socket, HVServerConnectionCallback callback, void* context)
        : callback_(callback), context_(context), socket_(std::move(socket)) {}

    ~PortConnection() = default;
    PortConnection(const PortConnection&) = delete;
    PortConnection& operator=(const PortConnection&) = delete;

    /// False when nobody owns the port. One that has no room for us now is tried again by the call.
    [[nodiscard]] bool begin() {
        const sockaddr_un address = PortAddress();
        if (!socket_.isOpen() || !IsSocket(address.sun_path)) {
            return false;
        }
        isConnected_ = connectTo(address) == 0;
        return isConnected_ || errno == EAGAIN;
    }

    [[nodiscard]] HVError call(std::int32_t id, PropertyList::Dictionary body) {
        int error = isConnected_ ? 0 : finishConnecting();
        if (error == 0 && !std::exchange(isOpened_, true)) {
            error = send(kOpen, {{"IdentifierExceptions", TheIdentifierExceptions().list()}});
        }
        if (error == 0) {
            error = send(id, std::move(body));
        }
        return error == 0 ? awaitReply(id + kReplyOffset) : ErrorOf(error);
    }

private:
    [[nodiscard]] double secondsLeft() const { return deadline_ - AbsoluteTimeGetCurrent(); }

    [[nodiscard]] int connectTo(const sockaddr_un& address) const {
        return connect(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
    }

    /// Waits for a place in the port's queue. The kernel offers nothing to poll for there, but its
    /// connect heeds the time limit for sending.
    [[nodiscard]] int finishConnecting() {
        const double seconds = secondsLeft();
        if (seconds < 1e-3) {
            return ETIMEDOUT;
        }
        const timeval limit{
            .tv_sec = static_cast<time_t>(seconds),
            .tv_usec = static_cast<suseconds_t>((seconds - std::floor(seconds)) * 1e6)};
        if (setsockopt(socket_.get(), SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit) != 0 ||
            fcntl(socket_.get(), F_SETFL, 0) != 0) {
            return errno;
        }
        if (connectTo(PortAddress()) != 0) {
            return errno == EAGAIN || errno == EINTR ? ETIMEDOUT : errno;
        }
        isConnected_ = true;
        return 0;
    }

    /// 0 when the socket is ready for these events, or has ended.
    [[nodiscard]] int await(short events) const {
        for (;;) {
            const double seconds = secondsLeft();
            if (seconds <= 0) {
                return ETIMEDOUT;
            }
            pollfd state{.fd = socket_.get(), .events = events, .revents = 0};
            if (poll(&state, 1, static_cast<int>(std::ceil(seconds * 1e3))) == 1) {
                return 0;
            }
        }
    }

    [[nodiscard]] int send(std::int32_t id, PropertyList::Dictionary body) const {
        const auto data = PropertyListCreateXmlData(PropertyList(std::move(body)));
        if (!data) {
            return EINVAL;
        }
        std::vector<std::byte> message(sizeof(MachMsgHeader) + data->size());
        const MachMsgHeader header{.size = static_cast<std::uint32_t>(message.size()), .id = id};
        Store(std::span(message), 0, header);
        std::ranges::copy(*data, message.begin() + sizeof header);
        while (::send(socket_.get(), message.data(), message.size(), MSG_NOSIGNAL | MSG_DONTWAIT) <
               0) {
            if (errno != EAGAIN && errno != EINTR) {
                return errno == EPIPE ? ECONNRESET : errno;
            }
            if (const int error = await(POLLOUT); error != 0) {
                return error;
            }
        }
        return 0;
    }

    /// 0 with a whole datagram, whose header tells its size.
    [[nodiscard]] int receive(std::vector<std::byte>& datagram) const {
        datagram.resize(kDatagramMax);
        const ssize_t length =
            recv(socket_.get(), datagram.data(), datagram.size(), MSG_TRUNC | MSG_DONTWAIT);
        if (length < 0) {
            return errno;
        }
        if (length == 0) {
            return ECONNRESET;
        }
        const auto size = static_cast<std::size_t>(length);
        if (size < sizeof(MachMsgHeader) || size > datagram.size() ||
            Load<MachMsgHeader>(datagram, 0).size != size) {
            return EBADMSG;
        }
        datagram.resize(size);
        return 0;
    }

    [[nodiscard]] HVError awaitReply(std::int32_t replyId) {
        std::vector<std::byte> datagram;
        for (;;) {
            if (const int error = await(POLLIN); error != 0) {
                return ErrorOf(error);
            }
            if (const int error = receive(datagram); error != 0) {
                if (error == EAGAIN || error == EINTR) {
                    continue;
                }
                return ErrorOf(error);
            }
            const std::int32_t id = Load<MachMsgHeader>(datagram, 0).id;
            const auto body =
                PropertyListCreateWithData(std::span(datagram).subspan(sizeof(MachMsgHeader)));
            if (id == replyId) {
                return body ? statusOf(*body) : ErrorOf(EBADMSG);
            }
            // Other messages are for clients of another kind.
            if (id == kNotification && body && notifications_ < kNotificationsMax) {
                ++notifications_;
                callback_(*this, *body, context_);
            }
        }
    }

    [[nodiscard]] static HVError statusOf(const PropertyList& reply) {
        const auto domain = Number(reply, "Domain");
        const auto error = Number(reply, "Error");
        return domain && error ? HVError{.domain = *domain, .error = *error} : ErrorOf(EBADMSG);
    }

    const double deadline_ = AbsoluteTimeGetCurrent() + kSecondsMax;
    const HVServerConnectionCallback callback_;
    void* const context_;
    const OwnedFd socket_;
    bool isConnected_ = false;
    bool isOpened_ = false;
    int notifications_ = 0;
};

PortConnection& AsPortConnection(HVServerConnection& connection) {
    return static_cast<PortConnection&>(connection);
}

}  // namespace

void _HVServerConnectionAddIdentifierException(std::string_view identifier) {
    TheIdentifierExceptions().add(identifier);
}

std::shared_ptr<HVServerConnection> _HVServerConnectionCreate(HVServerConnectionCallback callback,
                                                              void* context) {
    OwnedFd socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    auto connection = std::make_shared<PortConnection>(std::move(socket), callback, context);
    return connection->begin() ? std::move(connection) : nullptr;
}

HVError _HVServerConnectionSetCivicInfoBasedOnCurrentLocation(
    HVServerConnection& connection,
    const std::optional<std::string>& countryCode,
    const std::optional<std::string>& state,
    const std::optional<std::string>& city,
    const std::optional<std::string>& postalCode) {
    PropertyList::Dictionary body;
    Put(body, "CountryCode", countryCode);
    Put(body, "State", state);
    Put(body, "City", city);
    Put(body, "PostalCode", postalCode);
    return AsPortConnection(connection).call(kSetCivicInfo, std::move(body));
}

HVError _HVServerConnectionSetLocalRoutableAddress(HVServerConnection& connection,
                                                   const std::optional<std::string>& address) {
    PropertyList::Dictionary body;
    Put(body, "Address", address);
    return AsPortConnection(connection).call(kSetLocalRoutableAddress, std::move(body));
}

}  // namespace platform
