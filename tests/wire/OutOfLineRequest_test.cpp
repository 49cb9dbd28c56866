// Routine 6, the one request that brings out-of-line data: inline behind the message, or in a
// sealed memory file beside it.
#include <fcntl.h>
#include <sys/socket.h>

#include "tests/wire/WireTest.h"

namespace wire {
namespace {

constexpr std::uint32_t kMaxInline = 65'536;
constexpr std::uint32_t kMaxData = 16'777'216;
constexpr int kAllSeals = F_SEAL_WRITE | F_SEAL_GROW | F_SEAL_SHRINK;

struct Data {
    std::uint32_t announced = 0;
    std::size_t behind = 0;  ///< bytes that follow the message
};

Bytes Request(const Data& data) {
    auto request = WellFormedRequest(kRoutineLayouts[6]);
    phone::PutText(request, 52, "com.vendra.wire");
    phone::PutText(request, 308, "key");
    Put(request, 40, data.announced);
    Put(request, 564, data.announced);
    request.resize(request.size() + data.behind, std::byte{'x'});
    return request;
}

class OutOfLineRequestTest : public WireTest {
protected:
    /// What the bytes are worth is the handler's affair; here it counts that it was asked.
    [[nodiscard]] bool isServed(const Bytes& request, std::span<const int> descriptors = {}) const {
        const auto code = codeOf(request, descriptors);
        return code == kSuccess || code == kFailure;
    }

    [[nodiscard]] std::int32_t codeWithFile(std::uint32_t announced, const OwnedFd& file) const {
        return codeOf(Request({.announced = announced}), std::array{file.get()});
    }
};

}  // namespace

TEST_F(OutOfLineRequestTest, TakesDataBehindTheMessage) {
    for (const std::uint32_t size : {0U, 1U, 2U, 3U, 4U, 100U, kMaxInline - 1, kMaxInline}) {
        EXPECT_TRUE(isServed(Request({.announced = size, .behind = size}))) << size;
    }
}

TEST_F(OutOfLineRequestTest, RefusesDataBehindTheMessageThatIsShortOrLong) {
    for (const std::uint32_t size : {1U, 2U, 100U, kMaxInline}) {
        EXPECT_EQ(codeOf(Request({.announced = size, .behind = size - 1})), kBadArguments) << size;
        EXPECT_EQ(codeOf(Request({.announced = size, .behind = size + 1})), kBadArguments) << size;
        EXPECT_EQ(codeOf(Request({.announced = size})), kBadArguments) << size;
    }
    EXPECT_EQ(codeOf(Request({.announced = 0, .behind = 1})), kBadArguments);
}

TEST_F(OutOfLineRequestTest, RefusesDataBehindTheMessageAboveItsLimit) {
    EXPECT_EQ(codeOf(Request({.announced = kMaxInline + 1, .behind = kMaxInline + 1})),
              kBadArguments);
    EXPECT_EQ(codeOf(Request({.announced = 150'000, .behind = 150'000})), kBadArguments);
}

TEST_F(OutOfLineRequestTest, RefusesAHeaderThatCountsTheDataIn) {
    auto request = Request({.announced = 100, .behind = 100});
    Put(request, 4, std::uint32_t{668});
    EXPECT_EQ(codeOf(request), kBadArguments);
    Put(request, 4, std::uint32_t{0});
    EXPECT_EQ(codeOf(request), kBadArguments);
}

TEST_F(OutOfLineRequestTest, TakesDataInASealedMemoryFile) {
    for (const std::uint32_t size : {1U, 100U, kMaxInline, kMaxInline + 1, kMaxData}) {
        const auto file = MemoryFile(size, kAllSeals);
        EXPECT_TRUE(isServed(Request({.announced = size}), std::array{file.get()})) << size;
    }
}

TEST_F(OutOfLineRequestTest, TakesAMemoryFileThatIsLongerThanAnnouncedOrSealedForEver) {
    const auto file = MemoryFile(5000, kAllSeals | F_SEAL_SEAL);
    EXPECT_TRUE(isServed(Request({.announced = 100}), std::array{file.get()}));
}

TEST_F(OutOfLineRequestTest, RefusesAMemoryFileWithoutOneOfItsSeals) {
    for (const int missing : {F_SEAL_WRITE, F_SEAL_GROW, F_SEAL_SHRINK, kAllSeals}) {
        const auto file = MemoryFile(100, kAllSeals & ~missing);
        EXPECT_EQ(codeWithFile(100, file), kBadArguments) << missing;
    }
}

TEST_F(OutOfLineRequestTest, RefusesAMemoryFileThatIsTooShort) {
    for (const std::uint32_t size : {1U, 100U, kMaxInline + 1, kMaxData}) {
        const auto file = MemoryFile(size - 1, kAllSeals);
        EXPECT_EQ(codeWithFile(size, file), kBadArguments) << size;
    }
}

TEST_F(OutOfLineRequestTest, RefusesADescriptorBesideASizeOfZero) {
    EXPECT_EQ(codeWithFile(0, MemoryFile(0, kAllSeals)), kBadArguments);
    EXPECT_EQ(codeWithFile(0, MemoryFile(100, kAllSeals)), kBadArguments);
}

TEST_F(OutOfLineRequestTest, RefusesMoreThanSixteenMebibytes) {
    for (const std::uint32_t size : {kMaxData + 1, 0x7FFFFFFFU, 0xFFFFFFFFU}) {
        EXPECT_EQ(codeWithFile(size, MemoryFile(size, kAllSeals)), kResourceShortage) << size;
        EXPECT_EQ(codeOf(Request({.announced = size})), kResourceShortage) << size;
    }
}

TEST_F(OutOfLineRequestTest, RefusesDataThatCameBothWays) {
    const auto file = MemoryFile(100, kAllSeals);
    const auto request = Request({.announced = 100, .behind = 100});
    EXPECT_EQ(codeOf(request, std::array{file.get()}), kBadArguments);
}

TEST_F(OutOfLineRequestTest, RefusesTwoDescriptors) {
    const auto file = MemoryFile(100, kAllSeals);
    const std::array descriptors{file.get(), file.get()};
    EXPECT_EQ(codeOf(Request({.announced = 100}), descriptors), kBadArguments);
}

TEST_F(OutOfLineRequestTest, RefusesWhatIsNotAMemoryFile) {
    const auto pipe = Pipe();
    const auto pair = SocketPair(SOCK_STREAM);
    const OwnedFd file(open("/etc/hosts", O_RDONLY | O_CLOEXEC));
    const OwnedFd device(open("/dev/zero", O_RDONLY | O_CLOEXEC));
    for (const OwnedFd* descriptor : {&pipe.first, &pair.first, &file, &device}) {
        EXPECT_EQ(codeWithFile(1, *descriptor), kBadArguments) << descriptor->get();
    }
}

TEST_F(OutOfLineRequestTest, RefusesAnotherDescriptorCount) {
    for (const std::uint32_t count : {0U, 2U, 0xFFFFFFFFU}) {
        auto request = Request({});
        Put(request, 24, count);
        EXPECT_EQ(codeOf(request), kBadArguments) << count;
    }
}

TEST_F(OutOfLineRequestTest, RefusesAnotherDescriptorType) {
    const auto file = MemoryFile(100, kAllSeals);
    for (const int type : {0, 2, 3, 255}) {
        auto request = Request({.announced = 100});
        Put(request, 39, static_cast<std::uint8_t>(type));
        EXPECT_EQ(codeOf(request), kTypeError) << type;
        EXPECT_EQ(codeOf(request, std::array{file.get()}), kTypeError) << type;
    }
}

TEST_F(OutOfLineRequestTest, RefusesACountThatIsNotTheSize) {
    for (const std::uint32_t count : {0U, 99U, 101U, 0xFFFFFFFFU}) {
        auto request = Request({.announced = 100, .behind = 100});
        Put(request, 564, count);
        EXPECT_EQ(codeOf(request), kTypeError) << count;
    }
}

TEST_F(OutOfLineRequestTest, LooksAtTheShapeFirstThenAtTheTypeThenAtTheData) {
    const auto unsealed = MemoryFile(100, 0);
    auto request = Request({.announced = 100});
    Put(request, 39, std::uint8_t{0});
    EXPECT_EQ(codeOf(request, std::array{unsealed.get()}), kTypeError);
    Put(request, 0, std::uint32_t{0});
    EXPECT_EQ(codeOf(request, std::array{unsealed.get()}), kBadArguments);
    EXPECT_EQ(codeWithFile(100, unsealed), kBadArguments);
}

TEST_F(OutOfLineRequestTest, BelievesNeitherTheAddressNorTheFlagsOfItsDescriptor) {
    auto request = Request({.announced = 100, .behind = 100});
    Put(request, 28, 0xDEADBEEFDEADBEEF);
    Put(request, 36, std::uint16_t{0xFFFF});
    Put(request, 38, std::uint8_t{0xFF});
    EXPECT_TRUE(isServed(request));
}

}  // namespace wire
