#include "platform/MachCarriage.h"

#include <gtest/gtest.h>

#include <vector>

#include "platform/VirtualMemory.h"
#include "platform/sim/Ports.h"
#include "platform/sim/Sim.h"

using namespace platform;

namespace {

constexpr std::uint32_t kComplex = MACH_MSGH_BITS_COMPLEX;
constexpr std::byte kUnwritten{0xEE};
constexpr AuditToken kSender{501, 501, 300, 501, 300, 77, 0, 0};

class Carriage : public testing::Test {
protected:
    Carriage() { sim::Reset(); }

    ~Carriage() override { EXPECT_EQ(sim::AllocatedMemory(), 0U); }

    void put(const MachMsgHeader& header) { Store(std::span(buffer), 0, header); }

    template <typename T>
    void put(std::size_t offset, T value) {
        Store(std::span(buffer), offset, value);
    }

    template <typename T>
    [[nodiscard]] T get(std::size_t offset) const {
        return Load<T>(std::span<const std::byte>(buffer), offset);
    }

    /// A complex message of one out-of-line descriptor that announces so much data.
    void putDataMessage(std::uint32_t messageSize, std::uint32_t dataSize) {
        put({.bits = kComplex, .size = messageSize, .id = 5});
        put(24, std::uint32_t{1});
        put(28, std::uint64_t{0xAAAAAAAAAAAAAAAA});
        put(36, std::uint32_t{0x01000000});
        put(40, dataSize);
    }

    void putPortMessage(std::uint32_t messageSize) {
        put({.bits = kComplex, .size = messageSize, .id = 5});
        put(24, std::uint32_t{1});
        put(28, std::uint32_t{0x1234});
        put(36, std::uint32_t{0x00110000});
    }

    ReceivedMessage make(std::size_t arrived,
                         DescriptorArrival arrival = DescriptorArrival::kNone,
                         int descriptor = -1) {
        return MakeReceivedMessage(
            buffer,
            arrived,
            arrival,
            descriptor,
            {.localPort = 0x11, .replyRoute = 0x22, .sequenceNumber = 9, .sender = &kSender});
    }

    static int memoryFile(std::size_t size) {
        const std::vector<std::byte> bytes(size, std::byte{'m'});
        return sim::AddDescriptor(std::make_shared<sim::MemoryFile>(bytes, true));
    }

    std::vector<std::byte> buffer = std::vector<std::byte>(kReceiveBufferSize, kUnwritten);
};

TEST_F(Carriage, BelievesASizeThatIsWhatArrived) {
    put({.size = 288, .id = 5});
    const auto message = make(288);
    EXPECT_EQ(message.header().size, 288U);
    EXPECT_EQ(message.header().id, 5);
    EXPECT_EQ(message.bytes.size(), 288U + 52U);
    EXPECT_TRUE(message.inlineData.empty());
}

TEST_F(Carriage, ReplacesASizeThatIsNot) {
    for (const std::uint32_t claimed : {0U, 23U, 24U, 287U, 289U, 0xFFFFFFFFU}) {
        put({.size = claimed});
        EXPECT_EQ(make(288).header().size, 288U) << claimed;
    }
}

TEST_F(Carriage, OverwritesTheNamesThatTheSenderWrote) {
    put({.size = 24, .remotePort = 1, .localPort = 2, .voucherPort = 3, .id = 5});
    const auto header = make(24).header();
    EXPECT_EQ(header.remotePort, 0x22U);
    EXPECT_EQ(header.localPort, 0x11U);
    EXPECT_EQ(header.voucherPort, MACH_PORT_NULL);
}

TEST_F(Carriage, PutsTheTrailerBehindTheMessage) {
    put({.size = 40});
    (void)make(40);
    EXPECT_EQ(get<std::uint32_t>(40), 0U);
    EXPECT_EQ(get<std::uint32_t>(44), 52U);
    EXPECT_EQ(get<std::uint32_t>(48), 9U);
    EXPECT_EQ(get<std::uint32_t>(52), 501U);
    EXPECT_EQ(get<std::uint32_t>(56), 300U);
    EXPECT_EQ(get<AuditToken>(60), kSender);
}

TEST_F(Carriage, PutsTheTrailerAtAMultipleOfFour) {
    for (const std::uint32_t size : {37U, 38U, 39U, 40U}) {
        put({.size = size});
        EXPECT_EQ(make(size).bytes.size(), 92U);
        EXPECT_EQ(get<std::uint32_t>(44), 52U);
    }
}

TEST_F(Carriage, NamesNobodyWhenTheSenderIsUnknown) {
    put({.size = 24});
    (void)MakeReceivedMessage(buffer, 24, DescriptorArrival::kNone, -1, {});
    EXPECT_EQ(get<std::uint32_t>(36), kUnknownIdentity);
    EXPECT_EQ(audit_token_to_identity(get<AuditToken>(44)), AuditIdentity{});
}

TEST_F(Carriage, MovesDataFromBehindTheMessageBehindTheTrailer) {
    putDataMessage(568, 5);
    std::memcpy(buffer.data() + 568, "value", 5);
    const auto message = make(573);
    EXPECT_EQ(message.header().size, 568U);
    ASSERT_EQ(message.inlineData.size(), 5U);
    EXPECT_EQ(std::memcmp(message.inlineData.data(), "value", 5), 0);
    EXPECT_EQ(message.inlineData.data(), buffer.data() + 568 + 52);
    EXPECT_EQ(get<std::uint32_t>(572), 52U);
}

TEST_F(Carriage, HoldsTheLargestMessageWithTheMostData) {
    putDataMessage(kMaxRequestSize, kMaxInlineData);
    buffer[kReceiveCapacity - 1] = std::byte{'z'};
    auto message = make(kReceiveCapacity);
    EXPECT_EQ(message.header().size, kMaxRequestSize);
    ASSERT_EQ(message.inlineData.size(), kMaxInlineData);
    EXPECT_EQ(message.inlineData.back(), std::byte{'z'});
    EXPECT_EQ(MachMessageAccept(message), KERN_SUCCESS);
}

TEST_F(Carriage, CountsDataThatIsNotWhatWasAnnouncedAsMessage) {
    for (const std::uint32_t announced : {0U, 4U, 6U, 65537U, 0xFFFFFFFFU}) {
        putDataMessage(568, announced);
        const auto message = make(573);
        EXPECT_EQ(message.header().size, 573U) << announced;
        EXPECT_TRUE(message.inlineData.empty());
    }
}

TEST_F(Carriage, ExpectsNoDataBehindAMessageThatBroughtADescriptor) {
    putDataMessage(568, 5);
    EXPECT_EQ(make(573, DescriptorArrival::kOne, memoryFile(5)).header().size, 573U);
    putDataMessage(568, 5);
    EXPECT_EQ(make(568, DescriptorArrival::kOne, memoryFile(5)).header().size, 568U);
}

TEST_F(Carriage, KeepsTheTrueSizeOfADatagramThatWasCut) {
    put({.size = 288});
    const auto message = make(1'000'000);
    EXPECT_EQ(message.header().size, 1'000'000U);
    EXPECT_LE(message.bytes.size(), buffer.size());
    EXPECT_EQ(get<std::uint32_t>(kReceiveCapacity + 4), 52U);
}

TEST_F(Carriage, OverwritesNameAndAddressOfADescriptor) {
    putPortMessage(40);
    (void)make(40);
    EXPECT_EQ(get<std::uint32_t>(28), MACH_PORT_NULL);
    putDataMessage(568, 0);
    (void)make(568);
    EXPECT_EQ(get<std::uint64_t>(28), 0U);
}

TEST_F(Carriage, LooksAtADescriptorOnlyWhereItLiesWhollyInside) {
    putPortMessage(39);
    (void)make(39);
    EXPECT_EQ(get<std::uint32_t>(28), 0x1234U);
    putDataMessage(43, 5);
    const auto message = make(43);
    EXPECT_EQ(get<std::uint64_t>(28), 0xAAAAAAAAAAAAAAAAU);
    EXPECT_TRUE(message.inlineData.empty());
}

// Accepting.

TEST_F(Carriage, AcceptsAPlainMessageAsItIs) {
    put({.size = 24});
    auto message = make(24);
    EXPECT_EQ(MachMessageAccept(message), KERN_SUCCESS);
    MachMessageDestroy(message);
}

TEST_F(Carriage, GivesAPortThatCameAName) {
    auto pair = sim::MakeWatchPair();
    const int descriptor = sim::AddDescriptor(std::move(pair.passed));
    putPortMessage(40);
    auto message = make(40, DescriptorArrival::kOne, descriptor);
    EXPECT_EQ(MachMessageAccept(message), KERN_SUCCESS);
    EXPECT_EQ(message.descriptor, -1);
    EXPECT_NE(sim::FindPort(get<mach_port_t>(28)), nullptr);
    MachMessageDestroy(message);
    EXPECT_TRUE(pair.kept.isHungUp());
    EXPECT_EQ(get<mach_port_t>(28), MACH_PORT_NULL);
}

TEST_F(Carriage, LeavesADescriptorWithItsReceiverWhenNoNameIsLeft) {
    const int descriptor = memoryFile(1);
    sim::FailCall("AdoptPortDescriptor", 1);
    putPortMessage(40);
    auto message = make(40, DescriptorArrival::kOne, descriptor);
    EXPECT_EQ(MachMessageAccept(message), KERN_RESOURCE_SHORTAGE);
    EXPECT_EQ(message.descriptor, descriptor);
    EXPECT_EQ(get<mach_port_t>(28), MACH_PORT_NULL);
}

TEST_F(Carriage, CopiesDataOutOfAMemoryFile) {
    putDataMessage(568, 5);
    auto message = make(568, DescriptorArrival::kOne, memoryFile(5));
    ASSERT_EQ(MachMessageAccept(message), KERN_SUCCESS);
    EXPECT_EQ(message.memory.size(), 5U);
    EXPECT_EQ(get<std::uintptr_t>(28), reinterpret_cast<std::uintptr_t>(message.memory.data()));
    EXPECT_EQ(message.memory[4], std::byte{'m'});
    MachMessageReleaseMemory(message);
    MachMessageReleaseMemory(message);
    EXPECT_TRUE(message.memory.empty());
}

TEST_F(Carriage, PointsAtDataThatRodeBehind) {
    putDataMessage(568, 5);
    auto message = make(573);
    ASSERT_EQ(MachMessageAccept(message), KERN_SUCCESS);
    EXPECT_EQ(get<std::uintptr_t>(28), reinterpret_cast<std::uintptr_t>(message.inlineData.data()));
    EXPECT_TRUE(message.memory.empty());
}

struct Refusal {
    const char* name;
    DescriptorArrival arrival;
    bool isPort;
    std::uint32_t dataSize;
    std::size_t fileSize;
    kern_return_t code;
};

class CarriageRefusal : public Carriage, public testing::WithParamInterface<Refusal> {};

TEST_P(CarriageRefusal, HasItsCode) {
    const Refusal& row = GetParam();
    const bool came =
        row.arrival == DescriptorArrival::kOne || row.arrival == DescriptorArrival::kSurplus;
    row.isPort ? putPortMessage(40) : putDataMessage(568, row.dataSize);
    auto message = make(row.isPort ? 40 : 568, row.arrival, came ? memoryFile(row.fileSize) : -1);
    EXPECT_EQ(MachMessageAccept(message), row.code);
    EXPECT_TRUE(message.memory.empty());
}

INSTANTIATE_TEST_SUITE_P(
    EachRow,
    CarriageRefusal,
    testing::Values(
        Refusal{"portMissing", DescriptorArrival::kNone, true, 0, 0, MIG_BAD_ARGUMENTS},
        Refusal{"portSurplus", DescriptorArrival::kSurplus, true, 0, 1, MIG_BAD_ARGUMENTS},
        Refusal{"portTableFull", DescriptorArrival::kTableFull, true, 0, 0, KERN_RESOURCE_SHORTAGE},
        Refusal{"dataSurplus", DescriptorArrival::kSurplus, false, 5, 5, MIG_BAD_ARGUMENTS},
        Refusal{
            "dataTableFull", DescriptorArrival::kTableFull, false, 5, 0, KERN_RESOURCE_SHORTAGE},
        Refusal{"dataShort", DescriptorArrival::kOne, false, 5, 4, MIG_BAD_ARGUMENTS},
        Refusal{"dataEmpty", DescriptorArrival::kOne, false, 0, 0, MIG_BAD_ARGUMENTS},
        Refusal{"dataTooLarge",
                DescriptorArrival::kOne,
                false,
                kMaxRequestData + 1,
                5,
                KERN_RESOURCE_SHORTAGE}),
    [](const auto& test) { return test.param.name; });

TEST_F(Carriage, RefusesADescriptorBesideAMessageThatAnnouncesNone) {
    put({.size = 24});
    auto message = make(24, DescriptorArrival::kOne, memoryFile(1));
    EXPECT_EQ(MachMessageAccept(message), MIG_BAD_ARGUMENTS);
    put({.size = 24});
    message = make(24, DescriptorArrival::kSurplus, memoryFile(1));
    EXPECT_EQ(MachMessageAccept(message), MIG_BAD_ARGUMENTS);
}

TEST_F(Carriage, HasNoMemoryForData) {
    sim::FailCall("vm_allocate", 1);
    putDataMessage(568, 5);
    auto message = make(568, DescriptorArrival::kOne, memoryFile(5));
    EXPECT_EQ(MachMessageAccept(message), KERN_RESOURCE_SHORTAGE);
}

TEST_F(Carriage, DestroysAMessageThatWasCutWithoutLookingBeyondIt) {
    putPortMessage(0xFFFFFF);
    auto message = make(1'000'000);
    MachMessageDestroy(message);
    EXPECT_EQ(message.header().size, 1'000'000U);
}

}  // namespace
