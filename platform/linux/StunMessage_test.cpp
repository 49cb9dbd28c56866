#include "platform/linux/StunMessage.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <initializer_list>

using namespace platform;

namespace {

using Kind = StunResponse::Kind;
using Bytes = std::vector<std::byte>;

Bytes FromNumbers(std::initializer_list<unsigned> numbers) {
    Bytes bytes;
    for (const unsigned number : numbers) {
        bytes.push_back(static_cast<std::byte>(number));
    }
    return bytes;
}

// The samples of RFC 5769.
const Bytes kTransaction =
    FromNumbers({0xb7, 0xe7, 0xa7, 0x01, 0xbc, 0x34, 0xd6, 0x86, 0xfa, 0x87, 0xdf, 0xae});
const Bytes kSampleIPv4 =
    FromNumbers({0x01, 0x01, 0x00, 0x3c, 0x21, 0x12, 0xa4, 0x42, 0xb7, 0xe7, 0xa7, 0x01, 0xbc, 0x34,
                 0xd6, 0x86, 0xfa, 0x87, 0xdf, 0xae, 0x80, 0x22, 0x00, 0x0b, 0x74, 0x65, 0x73, 0x74,
                 0x20, 0x76, 0x65, 0x63, 0x74, 0x6f, 0x72, 0x20, 0x00, 0x20, 0x00, 0x08, 0x00, 0x01,
                 0xa1, 0x47, 0xe1, 0x12, 0xa6, 0x43, 0x00, 0x08, 0x00, 0x14, 0x2b, 0x91, 0xf5, 0x99,
                 0xfd, 0x9e, 0x90, 0xc3, 0x8c, 0x74, 0x89, 0xf9, 0x2a, 0xf9, 0xba, 0x53, 0xf0, 0x6b,
                 0xe7, 0xd7, 0x80, 0x28, 0x00, 0x04, 0xc0, 0x7d, 0x4c, 0x96});
const Bytes kSampleIPv6 = FromNumbers(
    {0x01, 0x01, 0x00, 0x48, 0x21, 0x12, 0xa4, 0x42, 0xb7, 0xe7, 0xa7, 0x01, 0xbc, 0x34, 0xd6, 0x86,
     0xfa, 0x87, 0xdf, 0xae, 0x80, 0x22, 0x00, 0x0b, 0x74, 0x65, 0x73, 0x74, 0x20, 0x76, 0x65, 0x63,
     0x74, 0x6f, 0x72, 0x20, 0x00, 0x20, 0x00, 0x14, 0x00, 0x02, 0xa1, 0x47, 0x01, 0x13, 0xa9, 0xfa,
     0xa5, 0xd3, 0xf1, 0x79, 0xbc, 0x25, 0xf4, 0xb5, 0xbe, 0xd2, 0xb9, 0xd9, 0x00, 0x08, 0x00, 0x14,
     0xa3, 0x82, 0x95, 0x4e, 0x4b, 0xe6, 0x7b, 0xf1, 0x17, 0x84, 0xc9, 0x7c, 0x82, 0x92, 0xc2, 0x75,
     0xbf, 0xe3, 0xed, 0x41, 0x80, 0x28, 0x00, 0x04, 0xc8, 0xfb, 0x0b, 0x4c});

StunTransaction Transaction() {
    StunTransaction transaction;
    std::ranges::copy(kTransaction, transaction.begin());
    return transaction;
}

StunResponse Read(const Bytes& datagram) {
    return ReadStunResponse(datagram, Transaction());
}

/// A response to the sample's transaction.
Bytes Response(const Bytes& attributes, unsigned type = 0x0101) {
    Bytes bytes = FromNumbers({type >> 8,
                               type & 0xff,
                               static_cast<unsigned>(attributes.size() >> 8),
                               static_cast<unsigned>(attributes.size() & 0xff),
                               0x21,
                               0x12,
                               0xa4,
                               0x42});
    bytes.insert(bytes.end(), kTransaction.begin(), kTransaction.end());
    bytes.insert(bytes.end(), attributes.begin(), attributes.end());
    return bytes;
}

const Bytes kMapped = FromNumbers({0x00, 0x01, 0x00, 0x08, 0x00, 0x01, 0x80, 0x55, 192, 0, 2, 9});
const Bytes kXorMapped =
    FromNumbers({0x00, 0x20, 0x00, 0x08, 0x00, 0x01, 0xa1, 0x47, 0xe1, 0x12, 0xa6, 0x43});

Bytes operator+(Bytes first, const Bytes& second) {
    first.insert(first.end(), second.begin(), second.end());
    return first;
}

TEST(StunMessage, RequestIsABindingRequestWithoutAttributes) {
    const auto request = StunBindingRequest(Transaction());
    const Bytes start = FromNumbers({0x00, 0x01, 0x00, 0x00, 0x21, 0x12, 0xa4, 0x42});
    EXPECT_TRUE(std::ranges::equal(request, start + kTransaction));
}

TEST(StunMessage, ReadsTheStandardsSamples) {
    EXPECT_EQ(Read(kSampleIPv4).kind, Kind::kAddress);
    EXPECT_EQ(Read(kSampleIPv4).text, "192.0.2.1");
    EXPECT_EQ(Read(kSampleIPv6).text, "2001:db8:1234:5678:11:2233:4455:6677");
}

TEST(StunMessage, PrefersTheAddressThatNobodyRewritesOnTheWay) {
    EXPECT_EQ(Read(Response(kMapped + kXorMapped)).text, "192.0.2.1");
    EXPECT_EQ(Read(Response(kXorMapped + kMapped)).text, "192.0.2.1");
    EXPECT_EQ(Read(Response(kMapped)).text, "192.0.2.9") << "which old servers do not tell";
}

TEST(StunMessage, TakesTheFirstOfTwoEqualAttributes) {
    auto other = kMapped;
    other.back() = std::byte{10};
    EXPECT_EQ(Read(Response(kMapped + other)).text, "192.0.2.9");
}

TEST(StunMessage, IsNoneOfOursWithAnyOtherBitInTheHeader) {
    for (std::size_t at = 0; at < kStunHeaderSize; ++at) {
        for (unsigned bit = 0; bit < 8; ++bit) {
            auto datagram = kSampleIPv4;
            datagram[at] ^= std::byte{static_cast<unsigned char>(1U << bit)};
            EXPECT_NE(Read(datagram).kind, Kind::kAddress) << at << " " << bit;
        }
    }
}

TEST(StunMessage, IsNoneWhenItIsCutOrHasMoreBehind) {
    for (std::size_t size = 0; size < kSampleIPv4.size(); ++size) {
        EXPECT_EQ(Read(Bytes(kSampleIPv4.begin(),
                             kSampleIPv4.begin() + static_cast<std::ptrdiff_t>(size)))
                      .kind,
                  Kind::kNone)
            << size;
    }
    EXPECT_EQ(Read(kSampleIPv4 + FromNumbers({0})).kind, Kind::kNone);
}

TEST(StunMessage, IsNoneWhenAnAttributeReachesBeyondIt) {
    for (const unsigned length : {5U, 8U, 9U, 0x7fffU, 0xffffU}) {
        const auto attribute =
            FromNumbers({0x80, 0x22, length >> 8, length & 0xff, 'a', 'b', 'c', 'd'});
        EXPECT_EQ(Read(Response(kXorMapped + attribute)).kind, Kind::kNone) << length;
    }
    EXPECT_EQ(Read(Response(kXorMapped + FromNumbers({0x80, 0x22}))).kind, Kind::kNone);
}

TEST(StunMessage, FailsWithoutAnAddressThatCanBeRead) {
    const auto withValue = [](std::initializer_list<unsigned> value) {
        auto attribute = FromNumbers({0x00, 0x20, 0x00, static_cast<unsigned>(value.size())});
        attribute = attribute + FromNumbers(value);
        attribute.resize((attribute.size() + 3) / 4 * 4);
        return Read(Response(attribute)).kind;
    };
    EXPECT_EQ(Read(Response({})).kind, Kind::kError);
    EXPECT_EQ(withValue({}), Kind::kError);
    EXPECT_EQ(withValue({0, 1, 0}), Kind::kError);
    EXPECT_EQ(withValue({0, 1, 0, 1}), Kind::kError);
    EXPECT_EQ(withValue({0, 1, 0, 1, 1, 2, 3}), Kind::kError);
    EXPECT_EQ(withValue({0, 2, 0, 1, 1, 2, 3, 4}), Kind::kError) << "too short for its family";
    EXPECT_EQ(withValue({0, 3, 0, 1, 1, 2, 3, 4}), Kind::kError) << "no family";
    EXPECT_EQ(withValue({9, 1, 0, 1, 1, 2, 3, 4}), Kind::kAddress) << "the first byte is ignored";
}

TEST(StunMessage, FailsWhenItHasPartsThatMustBeUnderstood) {
    const auto with = [](unsigned type) {
        return Read(Response(kXorMapped + FromNumbers({type >> 8, type & 0xff, 0, 0}))).kind;
    };
    EXPECT_EQ(with(0x7fff), Kind::kError);
    EXPECT_EQ(with(0x0021), Kind::kError);
    EXPECT_EQ(with(0x8000), Kind::kAddress);
    EXPECT_EQ(with(0xffff), Kind::kAddress);
    EXPECT_EQ(with(0x0005), Kind::kAddress) << "which servers of the older standard send";
}

TEST(StunMessage, TellsTheNumberOfAnError) {
    const auto code = FromNumbers({0x00, 0x09, 0x00, 0x05, 0, 0, 5, 0, '!', 0, 0, 0});
    EXPECT_EQ(Read(Response(code, 0x0111)).kind, Kind::kError);
    EXPECT_EQ(Read(Response(code, 0x0111)).text, "the STUN server refused with error 500");
    EXPECT_EQ(Read(Response({}, 0x0111)).text, "the STUN server refused");
    EXPECT_EQ(Read(Response(FromNumbers({0x00, 0x09, 0x00, 0x00}), 0x0111)).text,
              "the STUN server refused");
    EXPECT_EQ(Read(Response(kXorMapped, 0x0111)).kind, Kind::kError) << "an address or not";
}

TEST(StunMessage, OtherMessagesAreNone) {
    for (const unsigned type : {0x0001U, 0x0011U, 0x0102U, 0x0103U, 0x4101U, 0x8101U}) {
        EXPECT_EQ(Read(Response(kXorMapped, type)).kind, Kind::kNone) << type;
    }
}

}  // namespace
