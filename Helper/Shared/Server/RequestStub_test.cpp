#include "Helper/Shared/Server/RequestStub.h"

#include <gtest/gtest.h>

#include "platform/VirtualMemory.h"
#include "platform/sim/Sim.h"
#include "tests/support/Messages.h"

using namespace platform;

namespace {

// Handlers of a small interface: two texts, numbers, and each kind of out value.

struct Seen {
    mach_port_t port = MACH_PORT_NULL;
    std::string texts;
    std::vector<double> numbers;
    int calls = 0;
};

Seen seen;
kern_return_t nextCode = KERN_SUCCESS;
std::uint32_t nextDataSize = 0;

kern_return_t TwoTexts(mach_port_t port, String256& first, String256& second) {
    seen.port = port;
    seen.texts = std::string(first.view()) + "|" + std::string(second.view());
    ++seen.calls;
    return nextCode;
}

kern_return_t TwoDoubles(mach_port_t /*port*/, double first, double second) {
    seen.numbers = {first, second};
    return nextCode;
}

kern_return_t Number(mach_port_t /*port*/, std::int32_t number) {
    seen.numbers = {static_cast<double>(number)};
    return nextCode;
}

kern_return_t OutNumber(mach_port_t /*port*/, std::int32_t& number) {
    number = 0x11223344;
    return nextCode;
}

kern_return_t OutText(mach_port_t /*port*/, String256& /*key*/, OutString<64>& text) {
    text[0] = 'x';
    text[63] = 'y';
    return nextCode;
}

kern_return_t OutData(mach_port_t /*port*/, OutOfLineData& data) {
    data.count = nextDataSize;
    EXPECT_EQ(vm_allocate(&data.address, nextDataSize), KERN_SUCCESS);
    return nextCode;
}

template <auto kHandler, NdrRecord kNdr = NdrRecord::kWrittenAgain>
struct OneRoutine {
    static MigStub server(const MachMsgHeader& /*request*/) {
        return kSimpleRequestStub<kHandler, kNdr>;
    }

    static constexpr MigSubsystem kSubsystem{.server = server};
};

class RequestStub : public testing::Test {
protected:
    RequestStub() {
        sim::Reset();
        seen = {};
        nextCode = KERN_SUCCESS;
        nextDataSize = 0;
    }

    template <auto kHandler>
    messages::Bytes ask(messages::Bytes request) {
        ReceivedMessage message{.bytes = request, .inlineData = {}, .memory = {}};
        ReplyMessage reply;
        MigDispatch(OneRoutine<kHandler>::kSubsystem, message, reply);
        return {reply.bytes.begin(), reply.bytes.begin() + reply.header().size};
    }

    static messages::Bytes plainReply(std::int32_t id, kern_return_t code) {
        messages::Bytes expected(36);
        messages::Put(expected, 4, std::uint32_t{36});
        messages::Put(expected, 20, id + 100);
        messages::Put(expected, 24, kNdrRecord);
        messages::Put(expected, 32, code);
        return expected;
    }
};

TEST_F(RequestStub, HandsTheFieldsOver) {
    auto request = messages::Message(1, 544);
    messages::PutText(request, 32, "first");
    messages::PutText(request, 288, "second");
    EXPECT_EQ(ask<TwoTexts>(request), plainReply(1, KERN_SUCCESS));
    EXPECT_EQ(seen.texts, "first|second");
    EXPECT_EQ(seen.port, 0xBEEFU);
}

TEST_F(RequestStub, EndsATextAtItsFieldThoughItBringsNoNul) {
    auto request = messages::Message(1, 544);
    messages::PutText(request, 32, std::string(256, 'a'));
    messages::PutText(request, 288, std::string("b\0c", 3));
    (void)ask<TwoTexts>(request);
    EXPECT_EQ(seen.texts, std::string(256, 'a') + "|b");
}

TEST_F(RequestStub, HandsNumbersOver) {
    auto request = messages::Message(1, 48);
    messages::Put(request, 32, 52.5);
    messages::Put(request, 40, -13.25);
    EXPECT_EQ(ask<TwoDoubles>(request), plainReply(1, KERN_SUCCESS));
    EXPECT_EQ(seen.numbers, (std::vector<double>{52.5, -13.25}));
    request = messages::Message(1, 36);
    messages::Put(request, 32, std::int32_t{-7});
    (void)ask<Number>(request);
    EXPECT_EQ(seen.numbers, std::vector<double>{-7});
}

TEST_F(RequestStub, RefusesAnyOtherSizeAndCallsNobody) {
    for (const std::uint32_t size : {24U, 543U, 545U, 800U}) {
        EXPECT_EQ(ask<TwoTexts>(messages::Message(1, size)), plainReply(1, MIG_BAD_ARGUMENTS));
    }
    EXPECT_EQ(seen.calls, 0);
}

TEST_F(RequestStub, RefusesAComplexRequest) {
    EXPECT_EQ(ask<TwoTexts>(messages::Message(1, 544, MACH_MSGH_BITS_COMPLEX)),
              plainReply(1, MIG_BAD_ARGUMENTS));
    EXPECT_EQ(seen.calls, 0);
}

TEST_F(RequestStub, LooksAtTheComplexBitAlone) {
    EXPECT_EQ(ask<TwoTexts>(messages::Message(1, 544, 0x7FFFFFFF)), plainReply(1, KERN_SUCCESS));
}

TEST_F(RequestStub, ReportsTheHandlersCode) {
    nextCode = 8;
    EXPECT_EQ(ask<TwoTexts>(messages::Message(1, 544)), plainReply(1, 8));
}

TEST_F(RequestStub, SendsAnOutNumberBehindTheCode) {
    auto expected = plainReply(1, KERN_SUCCESS);
    expected.resize(40);
    messages::Put(expected, 4, std::uint32_t{40});
    messages::Put(expected, 36, std::uint32_t{0x11223344});
    EXPECT_EQ(ask<OutNumber>(messages::Message(1, 24)), expected);
}

TEST_F(RequestStub, SendsAnOutTextWhole) {
    auto expected = plainReply(1, KERN_SUCCESS);
    expected.resize(100);
    messages::Put(expected, 4, std::uint32_t{100});
    messages::PutText(expected, 36, "x");
    messages::PutText(expected, 99, "y");
    EXPECT_EQ(ask<OutText>(messages::Message(1, 288)), expected);
}

TEST_F(RequestStub, SendsNoOutValueOfAFailure) {
    nextCode = 9;
    EXPECT_EQ(ask<OutNumber>(messages::Message(1, 24)), plainReply(1, 9));
    EXPECT_EQ(ask<OutText>(messages::Message(1, 288)), plainReply(1, 9));
    EXPECT_EQ(ask<OutData>(messages::Message(1, 24)), plainReply(1, 9));
}

TEST_F(RequestStub, SendsBulkDataByADescriptor) {
    nextDataSize = 10;
    const auto reply = ask<OutData>(messages::Message(1, 24));
    messages::Bytes expected(56);
    messages::Put(expected, 0, MachMsgHeader{.bits = 0x80000000, .size = 56, .id = 101});
    messages::Put(expected, 24, std::uint32_t{1});
    messages::Put(expected, 28, messages::Get<std::uint64_t>(reply, 28));
    messages::Put(expected, 36, std::uint32_t{0x01000101});
    messages::Put(expected, 40, std::uint32_t{10});
    messages::Put(expected, 44, kNdrRecord);
    messages::Put(expected, 52, std::uint32_t{10});
    EXPECT_EQ(reply, expected);
    EXPECT_NE(messages::Get<std::uint64_t>(reply, 28), 0U);
}

TEST_F(RequestStub, SendsAbsentDataWithoutAnAddress) {
    const auto reply = ask<OutData>(messages::Message(1, 24));
    EXPECT_EQ(reply.size(), 56U);
    EXPECT_TRUE(messages::IsComplex(reply));
    EXPECT_EQ(messages::Get<std::uint64_t>(reply, 28), 0U);
    EXPECT_EQ(messages::Get<std::uint32_t>(reply, 40), 0U);
    EXPECT_EQ(messages::Get<std::uint32_t>(reply, 52), 0U);
}

/// A reply whose preset NDR record was replaced, to see who writes it again.
template <NdrRecord kNdr>
std::uint64_t NdrAfter(kern_return_t code, std::uint32_t size) {
    messages::Bytes request = messages::Message(1, size);
    ReceivedMessage message{.bytes = request, .inlineData = {}, .memory = {}};
    ReplyMessage reply;
    Store(reply.bytes, kOffsetOfNdr, std::uint64_t{0x5555});
    nextCode = code;
    kSimpleRequestStub<Number, kNdr>(message, reply);
    return Load<std::uint64_t>(reply.bytes, kOffsetOfNdr);
}

TEST_F(RequestStub, WritesTheNdrRecordAgain) {
    EXPECT_EQ(NdrAfter<NdrRecord::kWrittenAgain>(KERN_SUCCESS, 36), 0x100000000U);
    EXPECT_EQ(NdrAfter<NdrRecord::kWrittenAgain>(KERN_FAILURE, 36), 0x100000000U);
    EXPECT_EQ(NdrAfter<NdrRecord::kWrittenAgain>(KERN_SUCCESS, 35), 0x100000000U);
}

TEST_F(RequestStub, LeavesThePresetNdrRecordOfSuccessWhereTheRoutineSaysSo) {
    EXPECT_EQ(NdrAfter<NdrRecord::kLeftAsPreset>(KERN_SUCCESS, 36), 0x5555U);
    EXPECT_EQ(NdrAfter<NdrRecord::kLeftAsPreset>(KERN_SUCCESS, 35), 0x100000000U);
}

TEST_F(RequestStub, TellsWhetherAHandlerFitsItsLayout) {
    static_assert(HandlerMatches<TwoTexts>(kRoutineLayouts[1]));
    static_assert(HandlerMatches<TwoDoubles>(kRoutineLayouts[18]));
    EXPECT_FALSE(HandlerMatches<TwoTexts>(kRoutineLayouts[0]));
    EXPECT_FALSE(HandlerMatches<TwoTexts>(kRoutineLayouts[22]));
    EXPECT_FALSE(HandlerMatches<Number>(kRoutineLayouts[12]));
    EXPECT_FALSE(HandlerMatches<OutNumber>(kRoutineLayouts[2]));
}

TEST(RequestFields, ForcedTerminationCostsAFullFieldItsLastByte) {
    std::array<std::byte, 1024> field{};
    field.fill(std::byte{'a'});
    String1024 text{std::span<const std::byte, 1024>(field)};
    EXPECT_EQ(text.view().size(), 1024U);
    text.forceTermination();
    EXPECT_EQ(text.view(), std::string(1023, 'a'));
    text.forceTermination();
    EXPECT_EQ(std::strlen(text.cString()), 1023U);
}

TEST(RequestFields, ForcedTerminationLeavesAShorterTextAlone) {
    std::array<std::byte, 1024> field{};
    std::fill_n(field.begin(), 1023, std::byte{'b'});
    String1024 text{std::span<const std::byte, 1024>(field)};
    text.forceTermination();
    EXPECT_EQ(text.view().size(), 1023U);
    EXPECT_FALSE(text.empty());
}

}  // namespace
