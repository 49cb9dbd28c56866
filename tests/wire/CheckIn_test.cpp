// The check-in: each field wrong in turn, each kind of watch port, and the connection it comes on.
#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/timerfd.h>
#include <sys/wait.h>

#include <climits>
#include <csignal>
#include <ctime>
#include <functional>
#include <string_view>

#include "tests/wire/WireTest.h"

namespace wire {
namespace {

using phone::CheckInMessage;
using phone::Connection;
using phone::Message;

constexpr gid_t kStranger = 0;

/// The code of a check-in: 0 for a reply that hands over a private port, of which each byte is
/// checked, into `privatePort`.
std::int32_t CheckIn(const Connection& service,
                     const Bytes& request,
                     std::span<const int> descriptors,
                     Connection* privatePort = nullptr) {
    auto reply = service.call(request, descriptors);
    if (reply.bytes.size() != 40) {
        const std::int32_t code = reply.isEnd() ? INT32_MIN : reply.code();
        EXPECT_EQ(reply.bytes, SimpleReply(4792174, code));
        return code;
    }
    Bytes expected(40);
    Put(expected, 0, kComplex);
    Put(expected, 4, std::uint32_t{40});
    Put(expected, 20, std::int32_t{4792274});
    Put(expected, 24, std::uint32_t{1});
    Put(expected, 28, platform::Load<std::uint32_t>(reply.bytes, 28));
    Put(expected, 38, std::uint8_t{19});
    EXPECT_EQ(reply.bytes, expected);
    EXPECT_NE(platform::Load<std::uint32_t>(reply.bytes, 28), 0U);
    EXPECT_TRUE(reply.descriptor.isOpen());
    if (privatePort != nullptr) {
        *privatePort = Connection(std::move(reply.descriptor));
    }
    return kSuccess;
}

class CheckInTest : public WireTest {
protected:
    /// A check-in of the entitled group with a proper watch port beside these bytes.
    [[nodiscard]] std::int32_t checkIn(const Bytes& request) const {
        return CheckIn(Connection::toService(), request, std::array{watch_.second.get()});
    }

    /// All clients of a test that share the watch port end here.
    void TearDown() override {
        watch_.first.reset();
        WireTest::TearDown();
    }

    Ends watch_ = Pipe();
};

template <typename T>
Bytes CheckInWith(std::size_t offset, T value) {
    auto request = CheckInMessage();
    Put(request, offset, value);
    return request;
}

}  // namespace

TEST_F(CheckInTest, HandsOverAPrivatePortAndClosesTheServiceConnection) {
    const auto service = Connection::toService();
    Connection privatePort;
    ASSERT_EQ(CheckIn(service, CheckInMessage(), std::array{watch_.second.get()}, &privatePort),
              kSuccess);
    EXPECT_TRUE(service.receive().isEnd());
    EXPECT_EQ(CodeOf(privatePort, Message(0, kHeaderSize)), kBadId);
}

TEST_F(CheckInTest, MayBeTriedAgainOnTheSameConnectionUntilItSucceeds) {
    const auto service = Connection::toService();
    EXPECT_EQ(CheckIn(service, CheckInMessage(), {}), kBadArguments);
    EXPECT_EQ(CodeOf(service, Message(0, kHeaderSize)), kBadId);
    EXPECT_EQ(CheckIn(service, CheckInMessage(), std::array{watch_.second.get()}), kSuccess);
    EXPECT_TRUE(service.receive().isEnd());
}

TEST_F(CheckInTest, IsTheOnlyRoutineOfTheServicePort) {
    const auto service = Connection::toService(kStranger);
    for (std::int32_t id : {0, -1, INT_MIN, INT_MAX, 4792173, 4792175}) {
        EXPECT_EQ(CodeOf(service, Message(id, 40)), kBadId) << id;
    }
    for (const RoutineLayout& layout : kRoutineLayouts) {
        EXPECT_EQ(CodeOf(service, WellFormedRequest(layout)), kBadId) << layout.name;
    }
}

TEST_F(CheckInTest, OfEachWrongSizeIsRefused) {
    std::vector<std::uint32_t> sizes{1000, 3104, 65'576};
    for (std::uint32_t size = kHeaderSize; size <= 48; ++size) {
        sizes.push_back(size);
    }
    for (const auto size : sizes) {
        auto request = CheckInMessage();
        request.resize(size);
        Put(request, 4, size);
        EXPECT_EQ(checkIn(request), size == 40 ? kSuccess : kBadArguments) << size;
    }
}

TEST_F(CheckInTest, ShorterThanAHeaderClosesTheConnectionInSilence) {
    for (std::size_t size = 0; size < kHeaderSize; ++size) {
        const auto service = Connection::toService();
        ASSERT_TRUE(service.send(Bytes(size), std::array{watch_.second.get()}));
        EXPECT_TRUE(service.receive().isEnd()) << size << " bytes";
    }
}

TEST_F(CheckInTest, WithoutTheComplexBitIsRefused) {
    EXPECT_EQ(checkIn(CheckInWith(0, 0U)), kBadArguments);
    EXPECT_EQ(checkIn(CheckInWith(0, 0x7FFFFFFFU)), kBadArguments);
    EXPECT_EQ(checkIn(CheckInWith(0, 0xFFFFFFFFU)), kSuccess);
}

TEST_F(CheckInTest, WithAnotherDescriptorCountIsRefused) {
    for (const std::uint32_t count : {0U, 2U, 0xFFFFFFFFU}) {
        EXPECT_EQ(checkIn(CheckInWith(24, count)), kBadArguments) << count;
    }
}

TEST_F(CheckInTest, WithAnotherDispositionOrTypeIsRefused) {
    for (const int value : {0, 16, 18, 19, 20, 255}) {
        EXPECT_EQ(checkIn(CheckInWith(38, static_cast<std::uint8_t>(value))), kTypeError) << value;
    }
    for (const int value : {1, 2, 3, 255}) {
        EXPECT_EQ(checkIn(CheckInWith(39, static_cast<std::uint8_t>(value))), kTypeError) << value;
    }
}

TEST_F(CheckInTest, WithAnythingInNamesAndPaddingSucceeds) {
    for (const std::size_t offset : {8U, 12U, 16U, 28U, 32U}) {
        EXPECT_EQ(checkIn(CheckInWith(offset, 0xFFFFFFFFU)), kSuccess) << offset;
    }
    EXPECT_EQ(checkIn(CheckInWith(36, std::uint16_t{0xFFFF})), kSuccess);
}

TEST_F(CheckInTest, CountsAsWhatArrivedWhateverItsHeaderSays) {
    for (const std::uint32_t claimed : {0U, 23U, 39U, 41U, 0xFFFFFFFFU}) {
        EXPECT_EQ(checkIn(CheckInWith(4, claimed)), kSuccess) << claimed;
    }
}

TEST_F(CheckInTest, WithNoneOrManyDescriptorsIsRefusedBeforeItsSenderIsLookedAt) {
    for (const gid_t group : {phone::kEntitledGroup, kStranger}) {
        const auto service = Connection::toService(group);
        for (const std::size_t count : {0U, 2U, 3U, 100U}) {
            const std::vector<int> descriptors(count, watch_.second.get());
            EXPECT_EQ(CheckIn(service, CheckInMessage(), descriptors), kBadArguments) << count;
        }
    }
}

TEST_F(CheckInTest, HasItsShapeLookedAtFirstThenItsTypeThenItsDescriptor) {
    const auto service = Connection::toService(kStranger);
    auto request = CheckInWith(38, std::uint8_t{0});
    EXPECT_EQ(CheckIn(service, request, {}), kTypeError);
    Put(request, 24, std::uint32_t{0});
    EXPECT_EQ(CheckIn(service, request, {}), kBadArguments);
    EXPECT_EQ(CheckIn(service, CheckInMessage(), {}), kBadArguments);
    EXPECT_EQ(CheckIn(service, CheckInMessage(), std::array{watch_.second.get()}),
              kInvalidSecurity);
}

TEST_F(CheckInTest, OfAStrangerIsRefusedEachTime) {
    for (const uid_t user : {uid_t{0}, phone::kMobileUser}) {
        const auto service = Connection::toService(kStranger, user);
        const std::array descriptors{watch_.second.get()};
        EXPECT_EQ(CheckIn(service, CheckInMessage(), descriptors), kInvalidSecurity) << user;
        EXPECT_EQ(CheckIn(service, CheckInMessage(), descriptors), kInvalidSecurity) << user;
    }
}

namespace {

struct WatchKind {
    std::string_view name;
    std::function<Ends()> make;  ///< the end that is kept, the end that is passed
};

OwnedFd TcpListener(sockaddr_in* address) {
    OwnedFd listener(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    *address = {};
    address->sin_family = AF_INET;
    address->sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t size = sizeof *address;
    auto* const name = reinterpret_cast<sockaddr*>(address);
    EXPECT_EQ(bind(listener.get(), name, size), 0);
    EXPECT_EQ(listen(listener.get(), 1), 0);
    EXPECT_EQ(getsockname(listener.get(), name, &size), 0);
    return listener;
}

Ends TcpConnection() {
    sockaddr_in address{};
    const auto listener = TcpListener(&address);
    OwnedFd passed(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    EXPECT_EQ(connect(passed.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address),
              0);
    return {OwnedFd(accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC)), std::move(passed)};
}

/// The last close of the passed end waits for ten minutes, or for the kept end to go.
Ends SlowToClose() {
    auto ends = TcpConnection();
    const linger slow{.l_onoff = 1, .l_linger = 600};
    EXPECT_EQ(setsockopt(ends.second.get(), SOL_SOCKET, SO_LINGER, &slow, sizeof slow), 0);
    const Bytes unread(1 << 16);
    while (::send(ends.second.get(), unread.data(), unread.size(), MSG_DONTWAIT) > 0) {
    }
    return ends;
}

Ends Alone(int descriptor) {
    EXPECT_GE(descriptor, 0);
    return {OwnedFd(), OwnedFd(descriptor)};
}

Ends PipeByItsReadEnd() {
    auto [read, write] = Pipe();
    return {std::move(write), std::move(read)};
}

const std::array<WatchKind, 4> kGoodWatchPorts{{
    {"write end of a pipe", Pipe},
    {"read end of a pipe", PipeByItsReadEnd},
    {"stream pair", [] { return SocketPair(SOCK_STREAM); }},
    {"seqpacket pair", [] { return SocketPair(SOCK_SEQPACKET); }},
}};

const std::array<WatchKind, 13> kBadWatchPorts{{
    {"datagram pair", [] { return SocketPair(SOCK_DGRAM); }},
    {"unconnected stream", [] { return Alone(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)); }},
    {"unconnected seqpacket",
     [] { return Alone(socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0)); }},
    {"TCP connection", TcpConnection},
    {"UDP socket", [] { return Alone(socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0)); }},
    {"regular file", [] { return Alone(open("/etc/hosts", O_RDONLY | O_CLOEXEC)); }},
    {"directory", [] { return Alone(open("/", O_RDONLY | O_DIRECTORY | O_CLOEXEC)); }},
    {"path only", [] { return Alone(open("/", O_PATH | O_CLOEXEC)); }},
    {"memory file", [] { return Ends(OwnedFd(), MemoryFile(1, 0)); }},
    {"epoll", [] { return Alone(epoll_create1(EPOLL_CLOEXEC)); }},
    {"eventfd", [] { return Alone(eventfd(0, EFD_CLOEXEC)); }},
    {"timerfd", [] { return Alone(timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC)); }},
    {"device", [] { return Alone(open("/dev/null", O_RDWR | O_CLOEXEC)); }},
}};

}  // namespace

TEST_F(CheckInTest, TakesEachKindOfWatchPortAndEndsWithItsHangUp) {
    for (const auto& [name, make] : kGoodWatchPorts) {
        SCOPED_TRACE(name);
        auto [kept, passed] = make();
        Connection privatePort;
        const auto service = Connection::toService();
        ASSERT_EQ(CheckIn(service, CheckInMessage(), std::array{passed.get()}, &privatePort),
                  kSuccess);
        passed.reset();
        EXPECT_EQ(CodeOf(privatePort, Message(0, kHeaderSize)), kBadId);
        kept.reset();
        EXPECT_TRUE(privatePort.receive().isEnd());
    }
}

TEST_F(CheckInTest, IsRefusedWhenItsWatchPortHasHungUpAlready) {
    for (const auto& [name, make] : kGoodWatchPorts) {
        auto [kept, passed] = make();
        kept.reset();
        const auto service = Connection::toService();
        EXPECT_EQ(CheckIn(service, CheckInMessage(), std::array{passed.get()}), kFailure) << name;
    }
}

TEST_F(CheckInTest, IsRefusedWithAnyOtherKindOfWatchPort) {
    const auto service = Connection::toService();
    for (const auto& [name, make] : kBadWatchPorts) {
        const auto [kept, passed] = make();
        EXPECT_EQ(CheckIn(service, CheckInMessage(), std::array{passed.get()}), kFailure) << name;
    }
}

TEST_F(CheckInTest, OfAStrangerIsRefusedBeforeItsWatchPortIsLookedAt) {
    const auto service = Connection::toService(kStranger);
    for (const auto& [name, make] : kBadWatchPorts) {
        const auto [kept, passed] = make();
        EXPECT_EQ(CheckIn(service, CheckInMessage(), std::array{passed.get()}), kInvalidSecurity)
            << name;
    }
}

TEST_F(CheckInTest, IgnoresDataThatArrivesOnTheWatchPort) {
    const auto [kept, passed] = SocketPair(SOCK_STREAM);
    Connection privatePort;
    const auto service = Connection::toService();
    ASSERT_EQ(CheckIn(service, CheckInMessage(), std::array{passed.get()}, &privatePort), kSuccess);
    ASSERT_EQ(::send(kept.get(), "data", 4, MSG_NOSIGNAL), 4);
    EXPECT_EQ(CodeOf(privatePort, Message(0, kHeaderSize)), kBadId);
}

TEST_F(CheckInTest, IsNotHeldUpByAWatchPortThatIsSlowToClose) {
    for (const gid_t group : {phone::kEntitledGroup, kStranger}) {
        auto [kept, passed] = SlowToClose();
        const auto service = Connection::toService(group);
        // Ours is closed before the daemon runs: the last to close is the one who lingers.
        daemon_->signal(SIGSTOP);
        ASSERT_EQ(waitpid(daemon_->pid(), nullptr, WUNTRACED), daemon_->pid());
        ASSERT_TRUE(service.send(CheckInMessage(), std::array{passed.get()}));
        passed.reset();
        daemon_->signal(SIGCONT);
        EXPECT_NE(service.receive().code(), kSuccess);
        EXPECT_EQ(codeOf(Message(0, kHeaderSize)), kBadId);
    }
}

TEST_F(CheckInTest, IsWaitedForOnSixtyFourConnectionsOfAUser) {
    std::vector<Connection> connections;
    for (int i = 0; i < 66; ++i) {
        connections.push_back(Connection::toService(kStranger, phone::kMobileUser));
    }
    EXPECT_TRUE(connections[0].receive().isEnd());
    EXPECT_TRUE(connections[1].receive().isEnd());
    EXPECT_EQ(CodeOf(connections[2], Message(0, kHeaderSize)), kBadId);
    EXPECT_EQ(CodeOf(connections[65], Message(0, kHeaderSize)), kBadId);
}

TEST_F(CheckInTest, IsWaitedForOnFiveHundredAndTwelveConnectionsInAll) {
    constexpr uid_t kFirstUser = 1000;
    std::vector<Connection> connections;
    for (uid_t i = 0; i < 513; ++i) {
        // The first user has most: 66 would be his, but for the limit of a user.
        connections.push_back(
            Connection::toService(kStranger, i < 64 ? kFirstUser : kFirstUser + 1 + i % 16));
    }
    EXPECT_TRUE(connections[0].receive().isEnd());
    for (std::size_t i = 1; i < connections.size(); ++i) {
        ASSERT_EQ(CodeOf(connections[i], Message(0, kHeaderSize)), kBadId) << i;
    }
}

}  // namespace wire
