#include "Helper/Shared/Server/RequestProtocol.h"

#include <gtest/gtest.h>

#include <utility>

#include "Helper/Shared/Server/HelperServerUtils.h"
#include "platform/MachCarriage.h"
#include "tests/support/RecordingHandlers.h"
#include "tests/support/TestClient.h"

using namespace platform;

namespace {

class Requests : public testing::Test {
protected:
    Requests() {
        sim::Reset();
        recording::Reset();
        TestClient::entitleGroup();
        server = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
        EXPECT_EQ(client.checkIn(), KERN_SUCCESS);
    }

    ~Requests() override {
        MobileHelperServerDestroy(server);
        EXPECT_EQ(sim::AllocatedMemory(), 0U);
        EXPECT_EQ(sim::OpenDescriptors(), 0U);
    }

    static std::size_t calls() { return recording::Calls().size(); }

    MobileHelperServer* server = nullptr;
    TestClient client;
};

struct RoutineRow {
    std::int32_t id;
    std::uint32_t requestSize;
    std::uint32_t replySize;
    std::vector<std::uint32_t> textOffsets;
};

/// The published table, written a second time by hand.
const std::array<RoutineRow, 24> kRows{{
    {8683549, 288, 36, {32}},        {8683550, 544, 36, {32, 288}},
    {8683551, 24, 36, {}},           {8683552, 24, 36, {}},
    {8683553, 288, 292, {32}},       {8683554, 24, 292, {}},
    {8683555, 568, 36, {52, 308}},   {8683556, 544, 56, {32, 288}},
    {8683557, 544, 56, {32, 288}},   {8683558, 3104, 36, {32, 1056, 2080}},
    {8683559, 2080, 36, {32, 1056}}, {8683560, 2080, 36, {32, 1056}},
    {8683561, 24, 40, {}},           {8683562, 36, 36, {}},
    {8683563, 36, 36, {}},           {8683564, 800, 40, {32, 288, 544}},
    {8683565, 288, 40, {32}},        {8683566, 800, 40, {32, 288, 544}},
    {8683567, 48, 36, {}},           {8683568, 24, 100, {}},
    {8683569, 24, 36, {}},           {8683570, 36, 36, {}},
    {8683571, 544, 40, {32, 288}},   {8683572, 288, 56, {32}},
}};

class EachRoutine : public Requests, public testing::WithParamInterface<std::size_t> {
protected:
    [[nodiscard]] static const RoutineRow& row() { return kRows.at(GetParam()); }

    /// A valid request with a text of its own in each field.
    static messages::Bytes request() {
        auto message = GetParam() == 6 ? messages::SetPreference("", "", "data")
                                       : messages::Message(row().id, row().requestSize);
        for (std::size_t i = 0; i < row().textOffsets.size(); ++i) {
            messages::PutText(message, row().textOffsets[i], "text " + std::to_string(i));
        }
        return message;
    }
};

TEST_P(EachRoutine, ReachesItsHandlerWithItsTexts) {
    EXPECT_EQ(client.codeOf(request()), KERN_SUCCESS);
    ASSERT_EQ(calls(), 1U);
    EXPECT_EQ(recording::Calls()[0].number, GetParam());
    EXPECT_EQ(ServerForPort(recording::Calls()[0].port), server);
    ASSERT_EQ(recording::Calls()[0].texts.size(), row().textOffsets.size());
    for (std::size_t i = 0; i < row().textOffsets.size(); ++i) {
        EXPECT_EQ(recording::Calls()[0].texts[i], "text " + std::to_string(i));
    }
}

TEST_P(EachRoutine, RepliesWithItsSizeAndId) {
    const auto reply = client.call(request());
    ASSERT_TRUE(reply.has_value());
    EXPECT_EQ(messages::SizeOf(reply->bytes), row().replySize);
    EXPECT_EQ(reply->bytes.size(), row().replySize);
    EXPECT_EQ(messages::Get<std::int32_t>(reply->bytes, 20), row().id + 100);
    EXPECT_EQ(messages::Get<std::uint64_t>(reply->bytes, row().replySize == 56 ? 44 : 24),
              0x100000000U);
}

TEST_P(EachRoutine, RepliesAFailureWithTheCodeAlone) {
    recording::NextAnswer().code = 5;
    recording::NextAnswer().text = "secret";
    const auto reply = client.call(request());
    ASSERT_TRUE(reply.has_value());
    EXPECT_EQ(reply->bytes.size(), 36U);
    EXPECT_EQ(messages::CodeOf(reply->bytes), 5);
    EXPECT_FALSE(messages::IsComplex(reply->bytes));
}

TEST_P(EachRoutine, RefusesOneByteMoreAndOneLess) {
    auto message = request();
    messages::Put(message, 4, row().requestSize + 1);
    message.push_back({});
    EXPECT_EQ(client.codeOf(message), MIG_BAD_ARGUMENTS);
    message = request();
    messages::Put(message, 4, row().requestSize - 1);
    message.resize(row().requestSize - 1);
    EXPECT_EQ(row().requestSize == 24 ? MIG_BAD_ARGUMENTS : client.codeOf(message),
              MIG_BAD_ARGUMENTS);
    EXPECT_EQ(calls(), 0U);
}

TEST_P(EachRoutine, RefusesTheOtherKindOfMessage) {
    auto message = request();
    messages::Put(message, 0, messages::Get<std::uint32_t>(message, 0) ^ MACH_MSGH_BITS_COMPLEX);
    EXPECT_EQ(client.codeOf(message), MIG_BAD_ARGUMENTS);
    EXPECT_EQ(calls(), 0U);
}

TEST_P(EachRoutine, RefusesADescriptorThatNobodyAnnounced) {
    auto pair = sim::MakeWatchPair();
    EXPECT_EQ(client.codeOf(request(), {std::move(pair.passed)}), MIG_BAD_ARGUMENTS);
    EXPECT_EQ(calls(), 0U);
    EXPECT_TRUE(pair.kept.isHungUp());
}

INSTANTIATE_TEST_SUITE_P(Of24, EachRoutine, testing::Range(std::size_t{0}, std::size_t{24}));

TEST_F(Requests, OfUnknownIdsAreRefused) {
    for (const std::int32_t id : {8683548, 8683573, 0, -1, kCheckInId, 0x7FFFFFFF}) {
        EXPECT_EQ(client.codeOf(messages::Message(id, 24)), MIG_BAD_ID);
    }
    EXPECT_EQ(calls(), 0U);
}

TEST_F(Requests, CarryNumbers) {
    auto message = messages::Request(18);
    messages::Put(message, 32, 52.5);
    messages::Put(message, 40, 13.25);
    EXPECT_EQ(client.codeOf(message), KERN_SUCCESS);
    EXPECT_EQ(recording::Calls()[0].numbers, (std::vector<double>{52.5, 13.25}));
    message = messages::Request(14);
    messages::Put(message, 32, std::int32_t{31});
    EXPECT_EQ(client.codeOf(message), KERN_SUCCESS);
    EXPECT_EQ(recording::Calls()[1].numbers, std::vector<double>{31});
}

TEST_F(Requests, AreAnsweredWithTextsAndNumbers) {
    recording::NextAnswer().text = "DE";
    recording::NextAnswer().number = -5;
    const auto country = client.call(messages::Request(19));
    EXPECT_EQ(std::memcmp(country->bytes.data() + 36, "DE", 3), 0);
    const auto subscribed = client.call(messages::Request(12));
    EXPECT_EQ(messages::Get<std::int32_t>(subscribed->bytes, 36), -5);
}

class BulkReply : public Requests, public testing::WithParamInterface<std::size_t> {};

TEST_P(BulkReply, CarriesSmallDataBehindItself) {
    recording::NextAnswer().data = "<plist/>";
    const auto reply = client.call(messages::Request(GetParam()));
    messages::Bytes expected(56);
    const std::int32_t id = kFirstRoutineId + static_cast<std::int32_t>(GetParam()) + 100;
    messages::Put(expected, 0, MachMsgHeader{.bits = 0x80000000, .size = 56, .id = id});
    messages::Put(expected, 24, std::uint32_t{1});
    messages::Put(expected, 36, std::uint32_t{0x01000101});
    messages::Put(expected, 40, std::uint32_t{8});
    messages::Put(expected, 44, kNdrRecord);
    messages::Put(expected, 52, std::uint32_t{8});
    expected.resize(64);
    messages::PutText(expected, 56, "<plist/>");
    EXPECT_EQ(reply->bytes, expected);
    EXPECT_TRUE(reply->descriptors.empty());
}

TEST_P(BulkReply, CarriesLargeDataInAMemoryFile) {
    recording::NextAnswer().data = std::string(65537, 'x');
    const auto reply = client.call(messages::Request(GetParam()));
    EXPECT_EQ(reply->bytes.size(), 56U);
    ASSERT_EQ(reply->descriptors.size(), 1U);
    const auto file = std::dynamic_pointer_cast<sim::MemoryFile>(reply->descriptors[0]);
    ASSERT_NE(file, nullptr);
    EXPECT_EQ(file->bytes.size(), 65537U);
    EXPECT_TRUE(file->isSealed);
}

TEST_P(BulkReply, OfAnAbsentValueHasNothingBehind) {
    const auto reply = client.call(messages::Request(GetParam()));
    EXPECT_EQ(reply->bytes.size(), 56U);
    EXPECT_TRUE(messages::IsComplex(reply->bytes));
    EXPECT_EQ(messages::Get<std::uint32_t>(reply->bytes, 40), 0U);
    EXPECT_EQ(messages::Get<std::uint32_t>(reply->bytes, 52), 0U);
}

INSTANTIATE_TEST_SUITE_P(Of7And8And23, BulkReply, testing::Values(7, 8, 23));

using SetPreference = Requests;

TEST_F(SetPreference, TakesItsDataFromBehindTheMessage) {
    EXPECT_EQ(client.codeOf(messages::SetPreference("domain", "key", "value")), KERN_SUCCESS);
    ASSERT_EQ(calls(), 1U);
    EXPECT_EQ(recording::Calls()[0].texts, (std::vector<std::string>{"domain", "key"}));
    EXPECT_EQ(recording::Calls()[0].data, "value");
}

TEST_F(SetPreference, TakesNoDataAtAll) {
    EXPECT_EQ(client.codeOf(messages::SetPreference("domain", "key", "")), KERN_SUCCESS);
    ASSERT_EQ(calls(), 1U);
    EXPECT_EQ(recording::Calls()[0].data, "");
}

TEST_F(SetPreference, TakesTheMostThatRidesBehindAMessage) {
    const std::string data(kMaxInlineData, 'x');
    EXPECT_EQ(client.codeOf(messages::SetPreference("domain", "key", data)), KERN_SUCCESS);
    EXPECT_EQ(recording::Calls()[0].data, data);
    EXPECT_EQ(client.codeOf(messages::SetPreference("domain", "key", data + "x")),
              MIG_BAD_ARGUMENTS);
}

/// Routine 6 with its data in a descriptor.
messages::Bytes MessageForDescriptor(std::uint32_t size) {
    auto message = messages::SetPreference("domain", "key", "");
    messages::Put(message, 40, size);
    messages::Put(message, 564, size);
    return message;
}

sim::Descriptor MemoryOf(std::size_t size, bool isSealed) {
    const messages::Bytes bytes(size, std::byte{'m'});
    return std::make_shared<sim::MemoryFile>(bytes, isSealed);
}

TEST_F(SetPreference, TakesItsDataFromASealedMemoryFile) {
    EXPECT_EQ(client.codeOf(MessageForDescriptor(70000), {MemoryOf(70000, true)}), KERN_SUCCESS);
    ASSERT_EQ(calls(), 1U);
    EXPECT_EQ(recording::Calls()[0].data, std::string(70000, 'm'));
}

TEST_F(SetPreference, RefusesMemoryThatCouldChangeOrIsShort) {
    EXPECT_EQ(client.codeOf(MessageForDescriptor(9), {MemoryOf(9, false)}), MIG_BAD_ARGUMENTS);
    EXPECT_EQ(client.codeOf(MessageForDescriptor(9), {MemoryOf(8, true)}), MIG_BAD_ARGUMENTS);
    EXPECT_EQ(client.codeOf(MessageForDescriptor(0), {MemoryOf(0, true)}), MIG_BAD_ARGUMENTS);
    EXPECT_EQ(client.codeOf(MessageForDescriptor(9), {std::make_shared<sim::OtherFile>()}),
              MIG_BAD_ARGUMENTS);
    EXPECT_EQ(calls(), 0U);
}

TEST_F(SetPreference, RefusesDataAboveTheLimit) {
    EXPECT_EQ(client.codeOf(MessageForDescriptor(kMaxRequestData + 1), {MemoryOf(1, true)}),
              KERN_RESOURCE_SHORTAGE);
    EXPECT_EQ(client.codeOf(MessageForDescriptor(9), {MemoryOf(9, true), MemoryOf(9, true)}),
              MIG_BAD_ARGUMENTS);
    EXPECT_EQ(calls(), 0U);
}

TEST_F(SetPreference, RefusesAnnouncedDataThatDidNotCome) {
    EXPECT_EQ(client.codeOf(MessageForDescriptor(5)), MIG_BAD_ARGUMENTS);
    EXPECT_EQ(calls(), 0U);
}

TEST_F(SetPreference, RefusesAnyOtherCountOfDescriptors) {
    auto message = messages::SetPreference("domain", "key", "");
    messages::Put(message, 24, std::uint32_t{2});
    EXPECT_EQ(client.codeOf(message), MIG_BAD_ARGUMENTS);
    messages::Put(message, 24, std::uint32_t{0});
    EXPECT_EQ(client.codeOf(message), MIG_BAD_ARGUMENTS);
    EXPECT_EQ(calls(), 0U);
}

TEST_F(SetPreference, RefusesAnyOtherTypeOfDescriptor) {
    auto message = messages::SetPreference("domain", "key", "");
    messages::Put(message, 39, std::uint8_t{0});
    EXPECT_EQ(client.codeOf(message), MIG_TYPE_ERROR);
    messages::Put(message, 39, std::uint8_t{2});
    EXPECT_EQ(client.codeOf(message), MIG_TYPE_ERROR);
    EXPECT_EQ(calls(), 0U);
}

TEST_F(SetPreference, RefusesACountThatIsNotTheSize) {
    auto message = messages::SetPreference("domain", "key", "value");
    messages::Put(message, 564, std::uint32_t{4});
    EXPECT_EQ(client.codeOf(message), MIG_TYPE_ERROR);
    messages::Put(message, 564, std::uint32_t{6});
    EXPECT_EQ(client.codeOf(message), MIG_TYPE_ERROR);
    EXPECT_EQ(calls(), 0U);
}

TEST_F(SetPreference, ReleasesItsMemoryWithEveryAnswer) {
    recording::NextAnswer().code = 5;
    EXPECT_EQ(client.codeOf(MessageForDescriptor(70000), {MemoryOf(70000, true)}), 5);
    EXPECT_EQ(sim::AllocatedMemory(), 0U);
    sim::FailCall("vm_allocate", 1);
    EXPECT_EQ(client.codeOf(MessageForDescriptor(9), {MemoryOf(9, true)}), KERN_RESOURCE_SHORTAGE);
    EXPECT_EQ(calls(), 1U);
}

}  // namespace
