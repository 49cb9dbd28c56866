#include "tests/wire/WireTest.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/socket.h>

#include <cstring>
#include <filesystem>
#include <iterator>

namespace wire {
namespace {

/// Has the daemon open what it opens once and keeps: both logs, and the thread that closes
/// strange descriptors.
void WarmUp(const phone::Client& client) {
    ASSERT_EQ(client.callTexts(8683558, {"x", "/nowhere", ""}), kNoAccess);
    ASSERT_EQ(client.callTexts(8683560, {"/nowhere", "com.vendra.warm"}), kNoAccess);
    auto [kept, passed] = SocketPair(SOCK_DGRAM);
    const auto request = phone::Message(0, kHeaderSize);
    ASSERT_EQ(CodeOf(client.privatePort, request, std::array{passed.get()}), kBadId);
    passed.reset();
    ASSERT_TRUE(
        phone::Eventually([&kept = kept] { return send(kept.get(), "", 1, MSG_NOSIGNAL) < 0; }));
}

}  // namespace

Bytes WellFormedRequest(const RoutineLayout& layout) {
    auto request = phone::Message(layout.id, layout.requestSize);
    if (layout.bringsData()) {
        Put(request, 0, kComplex);
        Put(request, 24, std::uint32_t{1});
        Put(request, 39, std::uint8_t{1});
    }
    return request;
}

Bytes SimpleReply(std::int32_t requestId, std::int32_t code) {
    Bytes reply(36);
    Put(reply, 4, std::uint32_t{36});
    Put(reply, 20, static_cast<std::uint32_t>(requestId) + 100);
    Put(reply, 28, std::uint8_t{1});
    Put(reply, 32, code);
    return reply;
}

std::int32_t CodeOf(const phone::Connection& connection,
                    std::span<const std::byte> request,
                    std::span<const int> descriptors) {
    const auto reply = connection.call(request, descriptors);
    if (reply.bytes.size() != 36) {  // an end, or a success with more than a code
        ADD_FAILURE() << "a reply of " << reply.bytes.size() << " bytes";
        return INT32_MIN;
    }
    const auto id = platform::Load<std::int32_t>(request, 20);
    EXPECT_EQ(reply.bytes, SimpleReply(id, reply.code()));
    EXPECT_FALSE(reply.descriptor.isOpen());
    return reply.code();
}

Ends Pipe() {
    std::array<int, 2> ends{-1, -1};
    EXPECT_EQ(pipe2(ends.data(), O_CLOEXEC), 0) << std::strerror(errno);
    return {OwnedFd(ends[0]), OwnedFd(ends[1])};
}

Ends SocketPair(int type) {
    std::array<int, 2> ends{-1, -1};
    EXPECT_EQ(socketpair(AF_UNIX, type | SOCK_CLOEXEC, 0, ends.data()), 0) << std::strerror(errno);
    return {OwnedFd(ends[0]), OwnedFd(ends[1])};
}

OwnedFd MemoryFile(std::size_t size, int seals) {
    OwnedFd file(memfd_create("request", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    EXPECT_EQ(ftruncate(file.get(), static_cast<off_t>(size)), 0) << std::strerror(errno);
    EXPECT_EQ(fcntl(file.get(), F_ADD_SEALS, seals), 0) << std::strerror(errno);
    return file;
}

std::size_t OpenDescriptors(pid_t pid) {
    const std::filesystem::directory_iterator list("/proc/" + std::to_string(pid) + "/fd");
    return static_cast<std::size_t>(std::distance(begin(list), end(list)));
}

void WireTest::SetUpTestSuite() {
    phone::ResetMobileHome();
    daemon_ = std::make_unique<phone::Daemon>();
    resident_ = phone::Client::checkIn();
    ASSERT_EQ(resident_.code, kSuccess);
    WarmUp(resident_);
}

void WireTest::TearDownTestSuite() {
    resident_.die();
    daemon_ = nullptr;
}

void WireTest::SetUp() {
    descriptorsBefore_ = OpenDescriptors(daemon_->pid());
    client_ = phone::Client::checkIn();
    ASSERT_EQ(client_.code, kSuccess);
}

void WireTest::TearDown() {
    client_.die();
    EXPECT_TRUE(daemon_->isRunning());
    EXPECT_TRUE(phone::Eventually([this] {
        return OpenDescriptors(daemon_->pid()) == descriptorsBefore_;
    })) << OpenDescriptors(daemon_->pid())
        << " descriptors are open, not " << descriptorsBefore_;
}

}  // namespace wire
