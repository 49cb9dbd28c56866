// All 24 requests on a private port: right ones, and wrong ones in each way there is.
#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <climits>
#include <filesystem>

#include "tests/wire/WireTest.h"

namespace wire {
namespace {

using phone::Message;
using phone::PutText;

class RequestsTest : public WireTest {};

/// Routine 9 with a link path that its policy refuses: a handler's own answer, without effect.
Bytes RefusedLink() {
    auto request = Message(8683558, 3104);
    PutText(request, 1056, "/nowhere");
    return request;
}

}  // namespace

TEST_F(RequestsTest, OfEachWrongSizeAreRefused) {
    for (const RoutineLayout& layout : kRoutineLayouts) {
        for (std::uint32_t size = kHeaderSize; size <= layout.requestSize + 8; ++size) {
            auto request = WellFormedRequest(layout);
            request.resize(size);
            Put(request, 4, size);
            if (size != layout.requestSize) {
                ASSERT_EQ(codeOf(request), kBadArguments)
                    << layout.name << ", " << size << " bytes";
            }
        }
    }
}

TEST_F(RequestsTest, ShorterThanAHeaderCloseTheSocketInSilence) {
    for (std::size_t size = 0; size < kHeaderSize; ++size) {
        const auto client = phone::Client::checkIn();
        ASSERT_TRUE(client.privatePort.send(Bytes(size)));
        EXPECT_TRUE(client.privatePort.receive().isEnd()) << size << " bytes";
        // The client is one until its watch port hangs up.
        pollfd watch{.fd = client.watch.get(), .events = 0, .revents = 0};
        EXPECT_EQ(poll(&watch, 1, 0), 0) << size << " bytes";
    }
}

TEST_F(RequestsTest, OfUnknownRoutinesAreRefusedByTheirId) {
    std::vector<std::int32_t> ids{0, -1, INT_MIN, INT_MAX, 4792174};
    for (std::int32_t away = 1; away <= 500; ++away) {
        ids.insert(ids.end(), {8683549 - away, 8683572 + away});
    }
    for (const auto id : ids) {
        ASSERT_EQ(codeOf(Message(id, kHeaderSize)), kBadId) << id;
        ASSERT_EQ(codeOf(Message(id, 288, kComplex)), kBadId) << id;
    }
}

TEST_F(RequestsTest, WithAWrongComplexBitAreRefused) {
    for (const RoutineLayout& layout : kRoutineLayouts) {
        auto request = WellFormedRequest(layout);
        Put(request, 0, layout.bringsData() ? 0 : kComplex);
        EXPECT_EQ(codeOf(request), kBadArguments) << layout.name;
    }
}

TEST_F(RequestsTest, OfAWrongSizeAreRefusedWhateverTheirHeaderSays) {
    for (const RoutineLayout& layout : kRoutineLayouts) {
        const auto right = layout.requestSize;
        for (const std::uint32_t arrived : {right + 1, right + 24, right + 100, right + 65'536}) {
            for (const std::uint32_t claimed : {0U, 23U, 24U, right, arrived + 1, 0xFFFFFFFFU}) {
                auto request = WellFormedRequest(layout);
                request.resize(arrived);
                Put(request, 4, claimed);
                ASSERT_EQ(codeOf(request), kBadArguments) << layout.name << ", claimed " << claimed;
            }
        }
    }
}

TEST_F(RequestsTest, CutInTwoAreTwoWrongOnes) {
    for (const RoutineLayout& layout : kRoutineLayouts) {
        if (layout.requestSize < 2 * kHeaderSize) {
            continue;
        }
        const auto request = WellFormedRequest(layout);
        const std::span<const std::byte> whole(request);
        EXPECT_EQ(codeOf(whole.first(request.size() / 2)), kBadArguments) << layout.name;
        EXPECT_EQ(codeOf(whole.subspan(request.size() / 2)), kBadId) << layout.name;
    }
}

TEST_F(RequestsTest, OfTheRightSizeAreServedWhateverTheirHeaderSays) {
    for (const std::uint32_t claimed : {0U, 23U, 24U, 3103U, 3105U, 0xFFFFFFFFU}) {
        auto request = RefusedLink();
        Put(request, 4, claimed);
        EXPECT_EQ(codeOf(request), kNoAccess) << claimed;
    }
}

TEST_F(RequestsTest, WithADescriptorThatNobodyAskedForAreRefused) {
    const auto [kept, passed] = Pipe();
    for (const RoutineLayout& layout : kRoutineLayouts) {
        for (const std::size_t count : {1U, 2U, 3U, 100U}) {
            const std::vector<int> descriptors(count, passed.get());
            EXPECT_EQ(codeOf(WellFormedRequest(layout), descriptors), kBadArguments)
                << layout.name << ", " << count << " descriptors";
        }
    }
}

TEST_F(RequestsTest, OfUnknownRoutinesMayBringDescriptorsThatAreClosed) {
    auto [kept, passed] = Pipe();
    for (const std::size_t count : {1U, 2U, 100U}) {
        const std::vector<int> descriptors(count, passed.get());
        EXPECT_EQ(codeOf(Message(0, kHeaderSize), descriptors), kBadId) << count;
    }
    passed.reset();
    std::byte nothing{};
    EXPECT_EQ(read(kept.get(), &nothing, 1), 0);
}

TEST_F(RequestsTest, AreAnsweredWhateverPortsTheyName) {
    for (const std::uint32_t name : {0U, 1U, 0x00100001U, 0x7FFFFFFFU, 0xFFFFFFFFU}) {
        for (const std::size_t offset : {8U, 12U, 16U}) {
            auto request = RefusedLink();
            Put(request, offset, name);
            EXPECT_EQ(codeOf(request), kNoAccess) << name << " at " << offset;
        }
    }
}

TEST_F(RequestsTest, MayHaveAnyBitsBesideTheComplexOne) {
    for (std::uint32_t bit = 0; bit < 31; ++bit) {
        auto request = RefusedLink();
        Put(request, 0, 1U << bit);
        EXPECT_EQ(codeOf(request), kNoAccess) << "bit " << bit;
    }
}

TEST_F(RequestsTest, MayHaveAnythingInPlaceOfTheNdrRecord) {
    auto request = RefusedLink();
    Put(request, 24, 0xFFFFFFFFFFFFFFFF);
    EXPECT_EQ(codeOf(request), kNoAccess);
}

TEST_F(RequestsTest, OfGiantSizeAreRefusedAndDisturbNothing) {
    for (const std::uint32_t claimed : {288U, 200'000U, 0xFFFFFFFFU}) {
        auto request = Message(8683549, 200'000);
        Put(request, 4, claimed);
        EXPECT_EQ(codeOf(request), kBadArguments) << claimed;
        EXPECT_EQ(codeOf(Message(0, 200'000)), kBadId);
        EXPECT_EQ(codeOf(RefusedLink()), kNoAccess);
    }
}

TEST_F(RequestsTest, CanLinkACarrierBundle) {
    const std::string link = std::string(phone::kMobileLibrary) + "/Carrier Bundle.bundle";
    ASSERT_EQ(client_.callTexts(8683558, {"/bundles/new", link, ""}), kSuccess);
    EXPECT_EQ(std::filesystem::read_symlink(link), "/bundles/new");
}

TEST_F(RequestsTest, CanCreateASymlink) {
    ASSERT_EQ(client_.callTexts(8683559, {"there", "/tmp/link"}), kSuccess);
    EXPECT_EQ(std::filesystem::read_symlink("/tmp/link"), "there");
    EXPECT_EQ(client_.callTexts(8683559, {"there", "/missing/link"}), kFailure);
}

TEST_F(RequestsTest, CanRemoveAPreferenceDomain) {
    const std::string file =
        std::string(phone::kMobileLibrary) + "/Preferences/com.vendra.carrier.plist";
    const OwnedFd created(open(file.c_str(), O_CREAT | O_CLOEXEC, 0600));
    ASSERT_TRUE(created.isOpen());
    EXPECT_EQ(client_.callTexts(8683560, {file, "com.vendra.carrier"}), kSuccess);
    EXPECT_FALSE(std::filesystem::exists(file));
    EXPECT_EQ(client_.callTexts(8683560, {file, "com.vendra.carrier"}), kFailure);
    EXPECT_EQ(client_.callTexts(8683560, {"/nowhere", ""}), kNoAccess);
}

TEST_F(RequestsTest, HaveTheirTextsToTheFirstNul) {
    const std::string_view target("seen\0unseen", 11);
    ASSERT_EQ(client_.callTexts(8683559, {target, "/tmp/short"}), kSuccess);
    EXPECT_EQ(std::filesystem::read_symlink("/tmp/short"), "seen");
}

TEST_F(RequestsTest, WithATextThatFillsItsFieldLoseTheLastByte) {
    const std::string full(1024, 'a');
    ASSERT_EQ(client_.callTexts(8683559, {full, "/tmp/full"}), kSuccess);
    EXPECT_EQ(std::filesystem::read_symlink("/tmp/full"), full.substr(1));
}

namespace {

/// Handlers may start work that goes on behind the reply, so their daemon is theirs alone.
class HandlersTest : public testing::Test {
protected:
    phone::Daemon daemon_;
    phone::Client client_ = phone::Client::checkIn();
};

/// The codes that each routine's own work may give, in the order of their numbers.
// clang-format off
const std::array<std::vector<std::int32_t>, 24> kDocumentedCodes{{
    {0, 5}, {0, 5}, {0}, {0}, {0, 5}, {0},
    {0, 5}, {0, 3, 5, 6}, {0, 3, 5, 6}, {0, 5, 8}, {0, 5}, {0, 5, 8},
    {0}, {0}, {0}, {0}, {0}, {0},
    {0}, {0}, {0}, {0}, {0}, {0, 3, 6, 9},
}};

// clang-format on

bool IsDocumentedCode(const RoutineLayout& layout, std::int32_t code) {
    const auto& codes = kDocumentedCodes.at(static_cast<std::size_t>(layout.id - 8683549));
    return std::ranges::find(codes, code) != codes.end();
}

/// The bytes that must stand where they stand: all but the code or the descriptor's sizes, and the
/// out value.
void ExpectSuccess(const RoutineLayout& layout, const phone::Reply& reply) {
    const bool isData = layout.replySize == 56;
    ASSERT_GE(reply.bytes.size(), layout.replySize);
    EXPECT_EQ(reply.header().bits, isData ? kComplex : 0);
    EXPECT_EQ(reply.header().size, layout.replySize);
    EXPECT_EQ(reply.header().remotePort, 0U);
    EXPECT_EQ(reply.header().localPort, 0U);
    EXPECT_EQ(reply.header().voucherPort, 0U);
    EXPECT_EQ(reply.header().id, layout.id + 100);
    EXPECT_EQ(platform::Load<std::uint64_t>(reply.bytes, isData ? 44 : 24), 0x100000000U);
    const auto size = isData ? platform::Load<std::uint32_t>(reply.bytes, 40) : 0;
    EXPECT_EQ(reply.bytes.size(), layout.replySize + (reply.descriptor.isOpen() ? 0 : size));
}

}  // namespace

TEST_F(HandlersTest, AnswerEachWellFormedRequestWithADocumentedCode) {
    for (const RoutineLayout& layout : kRoutineLayouts) {
        SCOPED_TRACE(layout.name);
        const auto reply = client_.privatePort.call(WellFormedRequest(layout));
        ASSERT_GE(reply.bytes.size(), 36U);
        const bool isSimple = reply.header().bits == 0;
        if (isSimple && reply.code() != kSuccess) {
            EXPECT_TRUE(IsDocumentedCode(layout, reply.code())) << reply.code();
            EXPECT_EQ(reply.bytes, SimpleReply(layout.id, reply.code()));
        } else {
            ExpectSuccess(layout, reply);
        }
    }
}

}  // namespace wire
