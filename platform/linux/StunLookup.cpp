// One thread serves all look-ups. Names are resolved on a thread for each, since the resolver
// offers nothing to wait for together with other things, and can take longer than anybody waits.
#include "platform/linux/StunLookup.h"

#include <netdb.h>
#include <pthread.h>
#include <sys/epoll.h>
#include <sys/random.h>
#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <utility>
#include <vector>

#include "platform/linux/EventLoop.h"
#include "platform/linux/NetworkQueue.h"
#include "platform/linux/OwnedFd.h"
#include "platform/linux/StunMessage.h"

namespace platform {
namespace {

constexpr const char* kDefaultPort = "3478";

/// A little less than the time for which look-ups are waited, so that the reason is heard in time.
constexpr double kSecondsMax = 4.75;

/// The first retransmission; each later one waits twice as long as the one before.
constexpr double kFirstRetransmission = 0.5;

constexpr std::size_t kLargestDatagram = 1500;
constexpr int kDatagramsPerTurn = 16;

struct FreeAddresses {
    void operator()(addrinfo* list) const { freeaddrinfo(list); }
};

using AddressList = std::unique_ptr<addrinfo, FreeAddresses>;

struct Resolution {
    AddressList addresses{};
    std::string error{};
};

Resolution Resolve(const StunServer& server, int flags) {
    addrinfo hints{};
    hints.ai_flags = flags | AI_NUMERICSERV;
    hints.ai_socktype = SOCK_DGRAM;
    addrinfo* list = nullptr;
    const int error = getaddrinfo(server.host.c_str(), server.port.c_str(), &hints, &list);
    return {.addresses = AddressList(list), .error = error == 0 ? "" : gai_strerror(error)};
}

/// Runs the task on a thread of its own that nobody waits for. False when there can be none.
bool StartThread(std::function<void()> task) {
    auto owned = std::make_unique<std::function<void()>>(std::move(task));
    const auto run = [](void* context) -> void* {
        const std::unique_ptr<std::function<void()>> mine(
            static_cast<std::function<void()>*>(context));
        (*mine)();
        return nullptr;
    };
    pthread_t thread{};
    if (pthread_create(&thread, nullptr, run, owned.get()) != 0) {
        return false;
    }
    (void)owned.release();
    pthread_detach(thread);
    pthread_setname_np(thread, "ORB resolver");
    return true;
}

class StunLookup;

/// The socket of one attempt. The kernel lets through only what comes from the server that it is
/// connected to.
class StunSocket final : public EventSource {
public:
    StunSocket(OwnedFd socket, std::weak_ptr<StunLookup> lookup)
        : EventSource(socket.get(), EPOLLIN), socket_(std::move(socket)), lookup_(lookup) {}

    void ready(std::uint32_t events) override;

private:
    const OwnedFd socket_;
    const std::weak_ptr<StunLookup> lookup_;
};

/// One look-up: the server's addresses are tried in their order, and the first that answers
/// decides. Everything but begin runs on the network's queue.
class StunLookup final : public std::enable_shared_from_this<StunLookup> {
public:
    StunLookup(StunServer server,
               std::shared_ptr<void> share,
               std::function<void(StunAnswer)> answered)
        : server_(std::move(server)), share_(std::move(share)), answered_(std::move(answered)) {}

    void begin() {
        NetworkQueue().async([self = shared_from_this()] { self->resolve(); });
        NetworkQueue().after(kSecondsMax, [self = shared_from_this()] {
            self->fail("the STUN server does not answer");
        });
    }

    void socketReady() {
        std::array<std::byte, kLargestDatagram> datagram;
        for (int i = 0; i < kDatagramsPerTurn && socket_ != nullptr; ++i) {
            const ssize_t size =
                recv(socket_->descriptor(), datagram.data(), datagram.size(), MSG_DONTWAIT);
            if (size >= 0) {
                take(std::span(datagram).first(static_cast<std::size_t>(size)));
            } else if (errno == EAGAIN || errno == EINTR) {
                return;
            } else {
                tryNextAddress(errno);
            }
        }
    }

private:
    /// Addresses need no resolver; names get a thread.
    void resolve() {
        if (Resolution numeric = Resolve(server_, AI_NUMERICHOST); numeric.error.empty()) {
            resolved(std::move(numeric));
            return;
        }
        const bool isStarted =
            StartThread([self = shared_from_this(), share = share_, server = server_] {
                // Shared, since tasks are copied.
                const auto found = std::make_shared<Resolution>(Resolve(server, 0));
                NetworkQueue().async([self, found] { self->resolved(std::move(*found)); });
            });
        if (!isStarted) {
            fail("there is no thread to resolve the STUN server's name");
        }
    }

    void resolved(Resolution resolution) {
        if (!resolution.error.empty()) {
            fail("the STUN server's name cannot be resolved: " + resolution.error);
            return;
        }
        addresses_ = std::move(resolution.addresses);
        next_ = addresses_.get();
        tryNextAddress(EHOSTUNREACH);
    }

    void tryNextAddress(int errorOfLast) {
        closeSocket();
        while (!isOver() && socket_ == nullptr) {
            if (next_ == nullptr) {
                fail(std::string("the STUN server cannot be reached: ") +
                     strerrordesc_np(errorOfLast));
                return;
            }
            const addrinfo& address = *std::exchange(next_, next_->ai_next);
            errorOfLast = connectTo(address);
        }
        transmit(kFirstRetransmission);
    }

    /// 0 with an open socket.
    int connectTo(const addrinfo& address) {
        OwnedFd socket(::socket(address.ai_family, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
        if (!socket.isOpen() || connect(socket.get(), address.ai_addr, address.ai_addrlen) != 0 ||
            getrandom(transaction_.data(), transaction_.size(), 0) !=
                static_cast<ssize_t>(transaction_.size())) {
            return errno;
        }
        socket_ = std::make_shared<StunSocket>(std::move(socket), weak_from_this());
        EventLoop::ofThisThread->attach(socket_);
        return 0;
    }

    void transmit(double secondsToNext) {
        if (isOver() || socket_ == nullptr) {
            return;
        }
        const auto request = StunBindingRequest(transaction_);
        if (::send(socket_->descriptor(), request.data(), request.size(), MSG_NOSIGNAL) < 0 &&
            errno != EAGAIN && errno != ENOBUFS) {
            tryNextAddress(errno);
            return;
        }
        // A timer of an earlier socket finds another one here, and leaves it alone.
        NetworkQueue().after(
            secondsToNext,
            [self = shared_from_this(), socket = std::weak_ptr(socket_), secondsToNext] {
                if (self->socket_ != nullptr && socket.lock() == self->socket_) {
                    self->transmit(secondsToNext * 2);
                }
            });
    }

    void take(std::span<const std::byte> datagram) {
        const StunResponse response = ReadStunResponse(datagram, transaction_);
        if (response.kind == StunResponse::Kind::kAddress) {
            finish({.address = response.text});
        } else if (response.kind == StunResponse::Kind::kError) {
            fail(response.text);
        }
    }

    [[nodiscard]] bool isOver() const { return answered_ == nullptr; }

    void fail(const std::string& why) { finish({.error = why}); }

    void finish(StunAnswer answer) {
        closeSocket();
        if (const auto answered = std::exchange(answered_, nullptr)) {
            share_ = nullptr;
            answered(std::move(answer));
        }
    }

    void closeSocket() {
        if (const auto socket = std::exchange(socket_, nullptr)) {
            socket->leaveLoop();
        }
    }

    const StunServer server_;
    std::shared_ptr<void> share_;
    std::function<void(StunAnswer)> answered_;  // empty when it is over
    AddressList addresses_{};
    const addrinfo* next_ = nullptr;
    std::shared_ptr<StunSocket> socket_{};
    StunTransaction transaction_{};
};

void StunSocket::ready(std::uint32_t /*events*/) {
    if (const auto lookup = lookup_.lock()) {
        lookup->socketReady();
    }
}

bool IsPort(std::string_view text) {
    constexpr unsigned kLargest = 65'535;
    unsigned number = 0;
    for (const char digit : text) {
        if (digit < '0' || digit > '9' || number > kLargest) {
            return false;
        }
        number = number * 10 + static_cast<unsigned>(digit - '0');
    }
    return number >= 1 && number <= kLargest;
}

}  // namespace

std::optional<StunServer> ParseStunServer(std::string_view text) {
    const bool isBracketed = text.starts_with('[');
    const auto end = isBracketed ? text.find(']') : text.find(':');
    std::string_view host = text.substr(isBracketed ? 1 : 0, end - (isBracketed ? 1 : 0));
    std::string_view rest = end == std::string_view::npos ? "" : text.substr(end);
    if (isBracketed) {
        if (rest.empty()) {
            return std::nullopt;
        }
        rest.remove_prefix(1);
    } else if (rest.find(':', 1) != std::string_view::npos) {
        host = text;  // an IPv6 address as it is
        rest = {};
    }
    const std::string_view port = rest.empty() ? kDefaultPort : rest.substr(1);
    if (host.empty() || (!rest.empty() && rest.front() != ':') || !IsPort(port)) {
        return std::nullopt;
    }
    return StunServer{.host = std::string(host), .port = std::string(port)};
}

void StartStunLookup(const StunServer& server,
                     std::shared_ptr<void> share,
                     std::function<void(StunAnswer)> answered) {
    std::make_shared<StunLookup>(server, std::move(share), std::move(answered))->begin();
}

}  // namespace platform
