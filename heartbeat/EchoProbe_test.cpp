#include "heartbeat/EchoProbe.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/sim/Sim.h"
#include "platform/sim/SimClient.h"
#include "platform/sim/SimEcho.h"

using platform::HostAddress;
using platform::TimeOfDay;

namespace {

using Bytes = std::vector<std::byte>;

constexpr const char* kHost = "192.0.2.1";

template <typename T>
T At(std::span<const std::byte> bytes, std::size_t offset) {
    T value{};
    std::memcpy(&value, &bytes[offset], sizeof value);
    return value;
}

std::uint16_t OurIdentifier() {
    return static_cast<std::uint16_t>(getpid());
}

/// The Internet checksum in its textbook form, with carries folded as they come.
std::uint16_t TextbookChecksum(std::span<const std::byte> bytes) {
    std::uint32_t sum = 0;
    for (std::size_t i = 0; i < bytes.size(); i += 2) {
        sum += std::to_integer<std::uint32_t>(bytes[i]) << 8 |
               std::to_integer<std::uint32_t>(bytes[i + 1]);
        sum = (sum & 0xFFFF) + (sum >> 16);
    }
    return static_cast<std::uint16_t>(~sum);
}

/// A request's reply with another identifier.
Bytes ForeignReplyTo(const sim::SentEcho& request) {
    Bytes reply = sim::EchoReplyTo(request);
    reply[24] ^= std::byte{0xFF};
    return reply;
}

class EchoProbe : public testing::Test {
protected:
    EchoProbe() { sim::Reset(); }

    ~EchoProbe() override { EXPECT_EQ(sim::OpenEchoSockets(), 0U); }

    static int probe(std::string_view host = kHost) {
        const std::error_code outcome = SendEchoProbe(host);
        EXPECT_EQ(outcome.category(), std::generic_category());
        return outcome.value();
    }

    static void answer(std::function<std::vector<sim::EchoAnswer>(const sim::SentEcho&)> gateway) {
        sim::SetEchoGateway(std::move(gateway));
    }

    static std::vector<sim::EchoAnswer> nothing(const sim::SentEcho& /*request*/) { return {}; }
};

TEST(EchoRequest, IsWrittenToTheByte) {
    const auto request =
        MakeEchoRequest(0x1234, TimeOfDay{.seconds = 0x0102030405060708, .microseconds = 999'999});
    Bytes expected(48);
    expected[0] = std::byte{8};
    expected[4] = std::byte{0x12};
    expected[5] = std::byte{0x34};
    for (std::size_t i = 0; i < 8; ++i) {
        expected[32 + i] = static_cast<std::byte>(8 - i);
    }
    expected[40] = std::byte{0x3F};
    expected[41] = std::byte{0x42};
    expected[42] = std::byte{0x0F};
    const auto checksum = TextbookChecksum(expected);
    expected[2] = static_cast<std::byte>(checksum >> 8);
    expected[3] = static_cast<std::byte>(checksum & 0xFF);
    EXPECT_EQ(Bytes(request.begin(), request.end()), expected);
}

TEST(EchoRequest, HasTheChecksumOfTheTextbook) {
    EXPECT_EQ(InternetChecksum(Bytes(48)), 0xFFFF);
    EXPECT_EQ(InternetChecksum(Bytes(48, std::byte{0xFF})), 0);
    for (std::uint32_t seed = 1; seed < 2000; ++seed) {
        const auto request = MakeEchoRequest(static_cast<std::uint16_t>(seed * 40503),
                                             {.seconds = std::int64_t{seed} * 0x9E3779B97F4A,
                                              .microseconds = static_cast<int>(seed)});
        EXPECT_EQ(TextbookChecksum(request), 0) << seed;
        EXPECT_EQ(InternetChecksum(request), 0) << seed;
    }
}

TEST(EchoReply, IsToldByItsTypeIdentifierAndLength) {
    Bytes reply(20 + 48);
    reply[0] = std::byte{0x45};
    reply[24] = std::byte{0x12};
    reply[25] = std::byte{0x34};
    EXPECT_TRUE(IsEchoReply(reply, 0x1234));
    EXPECT_FALSE(IsEchoReply(reply, 0x3412));
    EXPECT_FALSE(IsEchoReply(std::span(reply).first(67), 0x1234));
    for (int type = 1; type < 256; ++type) {
        reply[20] = static_cast<std::byte>(type);
        EXPECT_FALSE(IsEchoReply(reply, 0x1234)) << type;
    }
}

TEST(EchoReply, StandsBehindAHeaderOfAnyLength) {
    for (std::size_t words = 0; words < 16; ++words) {
        Bytes reply(words * 4 + 48);
        reply[words * 4 + 4] = std::byte{0x12};
        reply[words * 4 + 5] = std::byte{0x34};
        reply[0] |= static_cast<std::byte>(words);
        const bool isItsOwnType = words == 0;  // a header of no length is the message's own start
        EXPECT_TRUE(IsEchoReply(reply, 0x1234) || isItsOwnType) << words;
        reply.pop_back();
        EXPECT_FALSE(IsEchoReply(reply, 0x1234)) << words;
    }
    EXPECT_FALSE(IsEchoReply({}, 0));
}

TEST(EchoReply, MayCarryAnySequenceChecksumAndPayload) {
    Bytes reply(20 + 48 + 100, std::byte{0xAB});
    reply[0] = std::byte{0x45};
    reply[20] = std::byte{0};
    EXPECT_TRUE(IsEchoReply(reply, 0xABAB));
}

TEST_F(EchoProbe, SendsOneRequestOverTheCellularInterface) {
    EXPECT_EQ(probe(), 0);
    ASSERT_EQ(sim::SentEchoes().size(), 1U);
    const auto& sent = sim::SentEchoes().front();
    EXPECT_EQ(sent.boundTo, "pdp_ip0");
    EXPECT_EQ(sent.destination.bytes[0], std::byte{192});
    EXPECT_EQ(sent.destination.bytes[3], std::byte{1});
    ASSERT_EQ(sent.bytes.size(), 48U);
    EXPECT_EQ(At<std::uint16_t>(sent.bytes, 4),
              OurIdentifier() >> 8 | (OurIdentifier() & 0xFF) << 8);
    EXPECT_EQ(At<std::uint16_t>(sent.bytes, 6), 0);
    EXPECT_EQ(At<std::int64_t>(sent.bytes, 32), 1'700'000'000);
    EXPECT_EQ(TextbookChecksum(sent.bytes), 0);
}

TEST_F(EchoProbe, MakesItsCallsInOrder) {
    EXPECT_EQ(probe(), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"CopyHostText 192.0.2.1",
                                        "ParseInternetAddress 192.0.2.1",
                                        "ProtocolByName icmp",
                                        "EchoSocket.open 1",
                                        "EchoSocket.takeIdentifier",
                                        "EchoSocket.setReceiveBufferSize 51200",
                                        "InterfaceIndexByName pdp_ip0",
                                        "EchoSocket.bindToInterface pdp_ip0",
                                        "EchoSocket.setReceiveTimeout 1 0",
                                        "GetTimeOfDay",
                                        "EchoSocket.send 48",
                                        "EchoSocket.receive 2048",
                                        "GetTimeOfDay",
                                        "GetTimeOfDay",
                                        "EchoSocket.close"}));
    EXPECT_EQ(sim::JournalCount("EchoSocket.close"), 1U);
    EXPECT_EQ(sim::JournalCount("ResolveHostName"), 0U);
}

TEST_F(EchoProbe, OfWhatIsNoTextIsInvalid) {
    EXPECT_EQ(probe("\xFF"), EINVAL);
    EXPECT_EQ(probe(std::string_view("a\0b", 3)), EINVAL);
    EXPECT_EQ(probe(std::string(256, 'a')), EINVAL);
    EXPECT_EQ(sim::JournalCount("ParseInternetAddress"), 0U);
    EXPECT_EQ(probe(std::string(255, 'a')), EHOSTUNREACH);
    sim::FailCall("CopyHostText", 1);
    EXPECT_EQ(probe(), EINVAL);
}

TEST_F(EchoProbe, ResolvesWhatIsNoAddress) {
    EXPECT_EQ(probe("heartbeat.vendra.example"), EHOSTUNREACH);
    EXPECT_EQ(sim::JournalCount("ProtocolByName"), 0U);
    HostAddress address;
    address.bytes[0] = std::byte{10};
    sim::SetHost("heartbeat.vendra.example", address);
    EXPECT_EQ(probe("heartbeat.vendra.example"), 0);
    EXPECT_EQ(sim::SentEchoes().at(0).destination, address);
    sim::FailCall("ResolveHostName", 1);
    EXPECT_EQ(probe("heartbeat.vendra.example"), EHOSTUNREACH);
}

TEST_F(EchoProbe, ToAnAddressOfAnotherFamilyIsTheSystemsError) {
    sim::SetHost("six.vendra.example", {.family = 10});
    EXPECT_EQ(probe("six.vendra.example"), EAFNOSUPPORT);
    EXPECT_EQ(sim::JournalCount("EchoSocket.close"), 1U);
}

TEST_F(EchoProbe, NeedsTheProtocol) {
    sim::FailCall("ProtocolByName", 1);
    EXPECT_EQ(probe(), EPFNOSUPPORT);
    EXPECT_EQ(sim::JournalCount("EchoSocket.open"), 0U);
}

TEST_F(EchoProbe, WithoutASocketIsOneWhateverTheSystemSaid) {
    sim::FailCall("EchoSocket.open", 1);
    sim::SetSystemError(EACCES);
    EXPECT_EQ(probe(), 1);
    sim::SetDescriptorLimit(sim::OpenDescriptors());
    EXPECT_EQ(probe(), 1);
    EXPECT_EQ(sim::JournalCount("EchoSocket.takeIdentifier"), 0U);
}

TEST_F(EchoProbe, TakesAnyReceiveBuffer) {
    sim::FailCall("EchoSocket.setReceiveBufferSize", 1);
    EXPECT_EQ(probe(), 0);
}

TEST_F(EchoProbe, GoesOutUnboundWithoutTheInterface) {
    sim::SetInterface("pdp_ip0", false);
    EXPECT_EQ(probe(), 0);
    EXPECT_EQ(sim::JournalCount("EchoSocket.bindToInterface"), 0U);
    sim::SetInterface("pdp_ip0", true);
    sim::FailCall("EchoSocket.bindToInterface", 1);
    EXPECT_EQ(probe(), 0);
    EXPECT_EQ(sim::SentEchoes().at(0).boundTo, "");
    EXPECT_EQ(sim::SentEchoes().at(1).boundTo, "");
}

TEST_F(EchoProbe, GoesByTheIdentifierThatTheSocketHas) {
    sim::HoldEchoIdentifier(OurIdentifier());
    EXPECT_EQ(probe(), 0);
    EXPECT_EQ(sim::SentEchoes().at(0).bytes[4], std::byte{0xC0}) << "of the system's choice";
    sim::FailCall("EchoSocket.takeIdentifier", 1);
    EXPECT_EQ(probe(), 0);
}

TEST_F(EchoProbe, ClosesTwiceWhenTheTimeoutFails) {
    sim::FailCall("EchoSocket.setReceiveTimeout", 1);
    EXPECT_EQ(probe(), EIO);
    EXPECT_EQ(sim::JournalCount("EchoSocket.close"), 2U);
    EXPECT_TRUE(sim::JournalHasInOrder({"EchoSocket.close", "EchoSocket.close again"}));
    EXPECT_TRUE(sim::SentEchoes().empty());
}

TEST_F(EchoProbe, GoesOnWithAClosedSocketWhenTheTimeoutFailsWithoutAReason) {
    sim::FailCall("EchoSocket.setReceiveTimeout", 1);
    sim::SetSystemError(0);
    EXPECT_EQ(probe(), EBADF);
    EXPECT_TRUE(sim::JournalHasInOrder(
        {"EchoSocket.close", "GetTimeOfDay", "EchoSocket.send 48", "EchoSocket.close again"}));
}

TEST_F(EchoProbe, WithoutATimeToSendIsTheSystemsError) {
    sim::FailCall("GetTimeOfDay", 1);
    EXPECT_EQ(probe(), EIO);
    sim::SetSystemError(0);
    sim::FailCall("GetTimeOfDay", 1);
    EXPECT_EQ(probe(), 1);
    EXPECT_EQ(sim::JournalCount("EchoSocket.send"), 0U);
    EXPECT_EQ(sim::JournalCount("EchoSocket.close"), 2U);
}

TEST_F(EchoProbe, ThatDoesNotGoOutIsTheSystemsError) {
    sim::SetSystemError(ENETUNREACH);
    sim::FailCall("EchoSocket.send", 1);
    EXPECT_EQ(probe(), ENETUNREACH);
    sim::SetSystemError(0);
    sim::FailCall("EchoSocket.send", 1);
    EXPECT_EQ(probe(), 1);
    EXPECT_EQ(sim::JournalCount("EchoSocket.receive"), 0U);
}

TEST_F(EchoProbe, ThatGoesOutCutIsAnError) {
    answer(nothing);
    sim::CutEchoesSent(47);
    EXPECT_EQ(probe(), 1);
    EXPECT_EQ(sim::JournalCount("EchoSocket.receive"), 0U);
    EXPECT_EQ(sim::JournalCount("EchoSocket.close"), 1U);
}

TEST_F(EchoProbe, WithoutAStartTimeIsTheSystemsErrorWhateverWasReceived) {
    for (const int error : {EIO, 0}) {
        sim::SetSystemError(error);
        sim::FailCall("GetTimeOfDay", 2);
        EXPECT_EQ(probe(), error == 0 ? 1 : error);
    }
    EXPECT_EQ(sim::JournalCount("EchoSocket.close"), 2U);
}

TEST_F(EchoProbe, WithoutATimeAfterAReceiveTimesOutUnlessAReplyCame) {
    sim::FailCall("GetTimeOfDay", 3);
    EXPECT_EQ(probe(), 0);
    answer([](const sim::SentEcho& request) {
        return std::vector{sim::EchoAnswer{.delay = 0.1, .datagram = ForeignReplyTo(request)}};
    });
    sim::FailCall("GetTimeOfDay", 3);
    EXPECT_EQ(probe(), ETIMEDOUT);
}

TEST_F(EchoProbe, EndsWithTheFirstReply) {
    answer([](const sim::SentEcho& request) {
        return std::vector{sim::EchoAnswer{.delay = 0.9, .datagram = sim::EchoReplyTo(request)}};
    });
    EXPECT_EQ(probe(), 0);
    EXPECT_DOUBLE_EQ(sim::Now(), 0.9);
}

TEST_F(EchoProbe, WaitsTwoSecondsForAMuteGateway) {
    answer(nothing);
    EXPECT_EQ(probe(), ETIMEDOUT);
    EXPECT_DOUBLE_EQ(sim::Now(), 2.0);
    EXPECT_EQ(sim::JournalCount("EchoSocket.receive"), 2U);
}

TEST_F(EchoProbe, TakesAReplyThatComesInTheSecondSecond) {
    answer([](const sim::SentEcho& request) {
        return std::vector{sim::EchoAnswer{.delay = 1.9, .datagram = sim::EchoReplyTo(request)}};
    });
    EXPECT_EQ(probe(), 0);
    EXPECT_DOUBLE_EQ(sim::Now(), 1.9);
}

TEST_F(EchoProbe, SkipsRepliesToOthers) {
    answer([](const sim::SentEcho& request) {
        return std::vector{sim::EchoAnswer{.delay = 0.1, .datagram = ForeignReplyTo(request)},
                           sim::EchoAnswer{.delay = 0.2, .datagram = ForeignReplyTo(request)},
                           sim::EchoAnswer{.delay = 0.3, .datagram = sim::EchoReplyTo(request)}};
    });
    EXPECT_EQ(probe(), 0);
    EXPECT_DOUBLE_EQ(sim::Now(), 0.3);
    EXPECT_EQ(sim::JournalCount("EchoSocket.receive"), 3U);
}

TEST_F(EchoProbe, GivesUpWhenAWholeSecondOfOthersRepliesPassed) {
    answer([](const sim::SentEcho& request) {
        std::vector<sim::EchoAnswer> answers;
        for (int i = 1; i < 100; ++i) {
            answers.push_back({.delay = 0.3 * i, .datagram = ForeignReplyTo(request)});
        }
        return answers;
    });
    EXPECT_EQ(probe(), ETIMEDOUT);
    EXPECT_DOUBLE_EQ(sim::Now(), 0.3 * 5) << "the first that is a second behind the first";
}

TEST_F(EchoProbe, DoesNotCountShortReplies) {
    answer([](const sim::SentEcho& request) {
        auto cut = sim::EchoReplyTo(request);
        cut.pop_back();
        return std::vector{sim::EchoAnswer{.delay = 0.1, .datagram = cut},
                           sim::EchoAnswer{.delay = 0.2, .datagram = {}},
                           sim::EchoAnswer{.delay = 0.4, .datagram = {std::byte{0x4F}}}};
    });
    EXPECT_EQ(probe(), ETIMEDOUT);
}

TEST_F(EchoProbe, TimesOutOnAnyOtherErrorOfTheReceiving) {
    for (const int error : {EINTR, ECONNREFUSED, ENETDOWN, ENOMEM}) {
        sim::SetSystemError(error);
        sim::FailCall("EchoSocket.receive", 1);
        EXPECT_EQ(probe(), ETIMEDOUT);
    }
    EXPECT_EQ(sim::JournalCount("GetTimeOfDay"), 8U) << "no third time is read";
    EXPECT_EQ(sim::JournalCount("EchoSocket.receive"), 4U);
}

TEST_F(EchoProbe, ReceivesOnWhenTheReceivingFailsWithoutAReason) {
    sim::SetSystemError(0);
    sim::FailCall("EchoSocket.receive", 1);
    EXPECT_EQ(probe(), 0);
    EXPECT_EQ(sim::JournalCount("EchoSocket.receive"), 2U);
}

TEST_F(EchoProbe, HasAnOutcomeWhicheverCallFails) {
    for (unsigned n = 1;; ++n) {
        sim::Reset();
        sim::FailCall(n);
        const int outcome = probe();
        EXPECT_EQ(sim::OpenEchoSockets(), 0U) << sim::FailedCall();
        EXPECT_TRUE(outcome == 0 || !sim::FailedCall().empty());
        if (sim::FailedCall().empty()) {
            EXPECT_EQ(n, 15U);
            break;
        }
    }
}

}  // namespace
