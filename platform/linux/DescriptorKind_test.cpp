#include "platform/linux/DescriptorKind.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <array>
#include <utility>

namespace platform {
namespace {

using Pair = std::pair<OwnedFd, OwnedFd>;

Pair SocketPair(int type) {
    std::array<int, 2> ends{-1, -1};
    EXPECT_EQ(socketpair(AF_UNIX, type | SOCK_CLOEXEC, 0, ends.data()), 0);
    return {OwnedFd(ends[0]), OwnedFd(ends[1])};
}

Pair Pipe() {
    std::array<int, 2> ends{-1, -1};
    EXPECT_EQ(pipe2(ends.data(), O_CLOEXEC), 0);
    return {OwnedFd(ends[0]), OwnedFd(ends[1])};
}

/// Two ends of a connection over the loopback.
Pair InternetPair() {
    sockaddr_in address{
        .sin_family = AF_INET, .sin_port = 0, .sin_addr = {htonl(INADDR_LOOPBACK)}, .sin_zero = {}};
    socklen_t size = sizeof address;
    auto* const place = reinterpret_cast<sockaddr*>(&address);
    const OwnedFd listening(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    EXPECT_EQ(bind(listening.get(), place, size), 0);
    EXPECT_EQ(listen(listening.get(), 1), 0);
    EXPECT_EQ(getsockname(listening.get(), place, &size), 0);
    OwnedFd client(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    EXPECT_EQ(connect(client.get(), place, size), 0);
    return {std::move(client), OwnedFd(accept4(listening.get(), nullptr, nullptr, SOCK_CLOEXEC))};
}

bool HangsUpSoon(int descriptor) {
    pollfd state{.fd = descriptor, .events = POLLIN | POLLRDHUP, .revents = 0};
    return poll(&state, 1, 20'000) == 1 && (state.revents & (POLLHUP | POLLRDHUP | POLLERR)) != 0;
}

TEST(DescriptorKind, APipeIsOneByEitherEndAndByName) {
    const auto [reading, writing] = Pipe();
    EXPECT_EQ(ClassifyDescriptor(reading.get()), DescriptorKind::kPipe);
    EXPECT_EQ(ClassifyDescriptor(writing.get()), DescriptorKind::kPipe);
    ASSERT_EQ(mkfifo("/tmp/kind-fifo", 0600), 0);
    const OwnedFd named(open("/tmp/kind-fifo", O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    EXPECT_EQ(ClassifyDescriptor(named.get()), DescriptorKind::kPipe);
    unlink("/tmp/kind-fifo");
}

TEST(DescriptorKind, AConnectedLocalSocketIsAStreamOrSeqpacketOne) {
    for (const int type : {SOCK_STREAM, SOCK_SEQPACKET}) {
        const auto [one, other] = SocketPair(type);
        EXPECT_EQ(ClassifyDescriptor(one.get()), DescriptorKind::kConnectedLocalSocket);
    }
    const auto [one, other] = SocketPair(SOCK_DGRAM);
    EXPECT_EQ(ClassifyDescriptor(one.get()), DescriptorKind::kOther);
}

TEST(DescriptorKind, ALocalSocketWithoutAPeerIsNotConnected) {
    const OwnedFd fresh(socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    EXPECT_EQ(ClassifyDescriptor(fresh.get()), DescriptorKind::kOther);
    const sockaddr_un unnamed{.sun_family = AF_UNIX, .sun_path = {}};
    ASSERT_EQ(
        bind(fresh.get(), reinterpret_cast<const sockaddr*>(&unnamed), sizeof unnamed.sun_family),
        0);
    ASSERT_EQ(listen(fresh.get(), 1), 0);
    EXPECT_EQ(ClassifyDescriptor(fresh.get()), DescriptorKind::kOther);
}

TEST(DescriptorKind, AMemoryFileIsOneSealedOrNot) {
    const OwnedFd file(memfd_create("kind", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    EXPECT_EQ(ClassifyDescriptor(file.get()), DescriptorKind::kMemoryFile);
    EXPECT_FALSE(IsSealedMemoryFile(file.get()));
    ASSERT_EQ(fcntl(file.get(), F_ADD_SEALS, F_SEAL_GROW | F_SEAL_SHRINK), 0);
    EXPECT_FALSE(IsSealedMemoryFile(file.get()));
    ASSERT_EQ(fcntl(file.get(), F_ADD_SEALS, F_SEAL_WRITE), 0);
    EXPECT_TRUE(IsSealedMemoryFile(file.get()));
    EXPECT_EQ(ClassifyDescriptor(file.get()), DescriptorKind::kMemoryFile);
}

TEST(DescriptorKind, EverythingElseIsOther) {
    const auto internet = InternetPair();
    const OwnedFd epoll(epoll_create1(EPOLL_CLOEXEC));
    const OwnedFd event(eventfd(0, EFD_CLOEXEC));
    const OwnedFd folder(open("/", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const OwnedFd place(open("/proc/self/exe", O_PATH | O_CLOEXEC));
    const OwnedFd device(open("/dev/null", O_RDWR | O_CLOEXEC));
    const OwnedFd file(open("/proc/self/status", O_RDONLY | O_CLOEXEC));
    for (const OwnedFd* other :
         {&internet.first, &epoll, &event, &folder, &place, &device, &file}) {
        EXPECT_EQ(ClassifyDescriptor(other->get()), DescriptorKind::kOther) << other->get();
        EXPECT_FALSE(IsSealedMemoryFile(other->get()));
    }
    EXPECT_EQ(ClassifyDescriptor(-1), DescriptorKind::kOther);
}

TEST(DescriptorKind, AFileThatIsNotAMemoryFilesIsNeverSealed) {
    const OwnedFd file(open("/tmp/kind-file", O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    EXPECT_FALSE(IsSealedMemoryFile(file.get()));
    unlink("/tmp/kind-file");
}

TEST(DescriptorKind, WhatClosesAtOnceIsClosedAtOnce) {
    auto [passed, kept] = SocketPair(SOCK_STREAM);
    const int number = passed.get();
    CloseForeignDescriptor(std::move(passed));
    EXPECT_EQ(fcntl(number, F_GETFD), -1);
    EXPECT_TRUE(HangsUpSoon(kept.get()));
}

TEST(DescriptorKind, WhatMayBlockIsClosedElsewhere) {
    auto [passed, kept] = InternetPair();
    CloseForeignDescriptor(std::move(passed));
    EXPECT_TRUE(HangsUpSoon(kept.get()));
    CloseForeignDescriptor(OwnedFd());
}

TEST(DescriptorKind, TheLastDescriptorsAreKeptBack) {
    rlimit limit{};
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &limit), 0);
    UpdateForeignDescriptorLimit();
    EXPECT_EQ(ForeignDescriptorLimit(), static_cast<int>(limit.rlim_cur) - 64);
}

}  // namespace
}  // namespace platform
