// Out-of-line replies as they leave, from an example handler behind the daemon's own stub and
// carriage.
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <future>
#include <limits>
#include <stdexcept>
#include <string>
#include <thread>

#include "Helper/Shared/Server/RequestStub.h"
#include "platform/RunLoop.h"
#include "platform/VirtualMemory.h"
#include "platform/linux/PortSpace.h"
#include "tests/wire/WireTest.h"

namespace wire {
namespace {

using platform::kern_return_t;
using platform::mach_port_t;

constexpr std::int32_t kExampleId = 8683572;
constexpr std::uint32_t kMaxInline = 65'536;
constexpr std::uint32_t kMaxData = 67'108'864;

std::byte ByteAt(std::size_t index) {
    return static_cast<std::byte>('a' + index % 26);
}

/// Answers as many bytes as its text asks for.
kern_return_t ExampleHandler(mach_port_t /*port*/, String256& count, OutOfLineData& data) {
    const auto size = static_cast<std::uint32_t>(std::stoul(std::string(count.view())));
    void* memory = nullptr;
    if (const auto code = platform::vm_allocate(&memory, size); code != platform::KERN_SUCCESS) {
        return code;
    }
    for (std::size_t i = 0; i < size; ++i) {
        static_cast<std::byte*>(memory)[i] = ByteAt(i);
    }
    data = {.address = memory, .count = size};
    return platform::KERN_SUCCESS;
}

MigStub ExampleRoutine(const platform::MachMsgHeader& request) {
    return request.id == kExampleId ? kSimpleRequestStub<ExampleHandler> : nullptr;
}

constexpr MigSubsystem kExampleSubsystem{.server = ExampleRoutine,
                                         .firstId = kExampleId,
                                         .endId = kExampleId + 1,
                                         .declaredMaxRequestSize = 292};

/// One server for the suite: the loop of a thread outlives the thread, and is made once here.
class BulkReplyTest : public testing::Test {
protected:
    static void SetUpTestSuite() {
        std::promise<OwnedFd> clientEnd;
        server_ = std::thread([&clientEnd] { Serve(clientEnd); });
        client_ = phone::Connection(clientEnd.get_future().get());
    }

    static void TearDownTestSuite() {
        loop_->stop();
        server_.join();
    }

    [[nodiscard]] static phone::Reply bulkReply(std::uint32_t size) {
        auto request = phone::Message(kExampleId, 288);
        phone::PutText(request, 32, std::to_string(size));
        return client_.call(request);
    }

private:
    static void Serve(std::promise<OwnedFd>& clientEnd) {
        mach_port_t port = platform::MACH_PORT_NULL;
        if (mach_port_allocate(platform::MachPortRight::kReceive, &port) !=
            platform::KERN_SUCCESS) {
            throw std::runtime_error("no port");
        }
        const auto source = MigCreateRunLoopSource(kExampleSubsystem, port);
        loop_ = &platform::RunLoop::current();
        loop_->addSource(source);
        clientEnd.set_value(platform::PortSpace::shared().takePeer(port));
        loop_->run(std::numeric_limits<double>::max(), platform::AfterSource::kGoOn);
        source->invalidate();
        // Failing leaves nothing to release.
        (void)mach_port_mod_refs(port, platform::MachPortRight::kReceive, -1);
    }

    static inline platform::RunLoop* loop_ = nullptr;
    static inline std::thread server_;
    static inline phone::Connection client_;
};

/// The 56 bytes of a reply with this much data.
Bytes DataReply(std::uint32_t size) {
    Bytes reply(56);
    Put(reply, 0, kComplex);
    Put(reply, 4, std::uint32_t{56});
    Put(reply, 20, kExampleId + 100);
    Put(reply, 24, std::uint32_t{1});
    Put(reply, 36, std::uint32_t{0x01000101});
    Put(reply, 40, size);
    Put(reply, 48, std::uint8_t{1});
    Put(reply, 52, size);
    return reply;
}

Bytes Pattern(std::size_t size) {
    Bytes pattern(size);
    std::ranges::generate(pattern, [index = std::size_t{0}]() mutable { return ByteAt(index++); });
    return pattern;
}

Bytes ContentOf(const OwnedFd& file) {
    Bytes content(static_cast<std::size_t>(lseek(file.get(), 0, SEEK_END)));
    EXPECT_EQ(pread(file.get(), content.data(), content.size(), 0),
              static_cast<ssize_t>(content.size()));
    return content;
}

}  // namespace

TEST_F(BulkReplyTest, WithoutAValueIsAComplexReplyOfSizeZero) {
    const auto reply = bulkReply(0);
    EXPECT_EQ(reply.bytes, DataReply(0));
    EXPECT_FALSE(reply.descriptor.isOpen());
}

TEST_F(BulkReplyTest, HasItsDataBehindTheMessage) {
    for (const std::uint32_t size : {1U, 26U, 1000U, kMaxInline - 1, kMaxInline}) {
        const auto reply = bulkReply(size);
        auto expected = DataReply(size);
        const auto data = Pattern(size);
        expected.insert(expected.end(), data.begin(), data.end());
        EXPECT_TRUE(reply.bytes == expected) << size;
        EXPECT_FALSE(reply.descriptor.isOpen()) << size;
    }
}

TEST_F(BulkReplyTest, HasMoreDataInASealedMemoryFile) {
    for (const std::uint32_t size : {kMaxInline + 1, 1'000'000U, kMaxData}) {
        const auto reply = bulkReply(size);
        EXPECT_EQ(reply.bytes, DataReply(size));
        ASSERT_TRUE(reply.descriptor.isOpen());
        EXPECT_TRUE(ContentOf(reply.descriptor) == Pattern(size)) << size;
        EXPECT_EQ(fcntl(reply.descriptor.get(), F_GET_SEALS),
                  F_SEAL_WRITE | F_SEAL_GROW | F_SEAL_SHRINK | F_SEAL_SEAL);
    }
}

TEST_F(BulkReplyTest, DoesNotGoBeyondSixtyFourMebibytes) {
    EXPECT_EQ(bulkReply(kMaxData + 1).bytes, SimpleReply(kExampleId, 3));
}

}  // namespace wire
