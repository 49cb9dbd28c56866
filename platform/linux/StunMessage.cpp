#include "platform/linux/StunMessage.h"

#include <arpa/inet.h>

#include <algorithm>
#include <functional>

namespace platform {
namespace {

// Types of messages and attributes, and the cookie that all messages carry.
constexpr std::uint16_t kBindingRequest = 0x0001;
constexpr std::uint16_t kBindingSuccess = 0x0101;
constexpr std::uint16_t kBindingError = 0x0111;
constexpr std::uint16_t kMappedAddress = 0x0001;
constexpr std::uint16_t kErrorCode = 0x0009;
constexpr std::uint16_t kXorMappedAddress = 0x0020;
constexpr std::array<std::byte, 4> kCookie{
    std::byte{0x21}, std::byte{0x12}, std::byte{0xA4}, std::byte{0x42}};

constexpr std::size_t kOffsetOfLength = 2;
constexpr std::size_t kOffsetOfCookie = 4;
constexpr std::size_t kOffsetOfTransaction = 8;
constexpr std::size_t kAttributeHeaderSize = 4;

using Bytes = std::span<const std::byte>;

/// Network byte order.
std::uint16_t Number16(Bytes bytes, std::size_t offset) {
    return static_cast<std::uint16_t>(std::to_integer<unsigned>(bytes[offset]) << 8 |
                                      std::to_integer<unsigned>(bytes[offset + 1]));
}

/// What a client must understand or give the response up: below 0x8000, beyond what the standard
/// and the older one define.
bool IsUnknownAndRequired(std::uint16_t type) {
    constexpr std::array<std::uint16_t, 17> kKnown{
        // RFC 8489
        0x0001,
        0x0006,
        0x0008,
        0x0009,
        0x000A,
        0x0014,
        0x0015,
        0x001C,
        0x001D,
        0x001E,
        0x0020,
        // RFC 3489, which servers still send to everybody
        0x0002,
        0x0003,
        0x0004,
        0x0005,
        0x0007,
        0x000B};
    return type < 0x8000 && std::ranges::find(kKnown, type) == kKnown.end();
}

/// The values of the attributes that matter; of equal ones the first counts.
struct Attributes {
    std::optional<Bytes> mapped{};
    std::optional<Bytes> xorMapped{};
    std::optional<Bytes> errorCode{};
    bool hasUnknown = false;

    void take(std::uint16_t type, Bytes value) {
        const auto keep = [value](std::optional<Bytes>& place) { place = place.value_or(value); };
        if (type == kMappedAddress) {
            keep(mapped);
        } else if (type == kXorMappedAddress) {
            keep(xorMapped);
        } else if (type == kErrorCode) {
            keep(errorCode);
        } else {
            hasUnknown = hasUnknown || IsUnknownAndRequired(type);
        }
    }
};

/// None when an attribute does not end where the message does, or before.
std::optional<Attributes> ReadAttributes(Bytes rest) {
    Attributes attributes;
    while (!rest.empty()) {
        if (rest.size() < kAttributeHeaderSize) {
            return std::nullopt;
        }
        const std::size_t size = Number16(rest, 2);
        const std::size_t padded = (size + 3) / 4 * 4;
        if (padded > rest.size() - kAttributeHeaderSize) {
            return std::nullopt;
        }
        attributes.take(Number16(rest, 0), rest.subspan(kAttributeHeaderSize, size));
        rest = rest.subspan(kAttributeHeaderSize + padded);
    }
    return attributes;
}

/// An address in text form: a zero byte, the family, the port, 4 or 16 bytes. The mask, of 16
/// bytes, is laid over it.
std::optional<std::string> AddressText(Bytes value, Bytes mask) {
    constexpr std::size_t kOffsetOfAddress = 4;
    constexpr unsigned kFamilyIPv4 = 1;
    constexpr unsigned kFamilyIPv6 = 2;
    if (value.size() < kOffsetOfAddress) {
        return std::nullopt;
    }
    const unsigned family = std::to_integer<unsigned>(value[1]);
    const std::size_t size = value.size() - kOffsetOfAddress;
    const bool isIPv4 = family == kFamilyIPv4 && size == 4;
    if (!isIPv4 && !(family == kFamilyIPv6 && size == 16)) {
        return std::nullopt;
    }
    std::array<std::byte, 16> address{};
    std::ranges::transform(
        value.subspan(kOffsetOfAddress), mask, address.begin(), std::bit_xor<std::byte>());
    std::array<char, INET6_ADDRSTRLEN> text{};
    return inet_ntop(isIPv4 ? AF_INET : AF_INET6, address.data(), text.data(), text.size())
               ? std::optional<std::string>(text.data())
               : std::nullopt;
}

StunResponse Failure(std::string why) {
    return {.kind = StunResponse::Kind::kError, .text = std::move(why)};
}

StunResponse ReadSuccess(const Attributes& attributes, Bytes cookieAndTransaction) {
    constexpr std::array<std::byte, 16> kNoMask{};
    if (attributes.hasUnknown) {
        return Failure("the STUN server's response has parts that must be understood and are not");
    }
    std::optional<std::string> address;
    if (attributes.xorMapped) {
        address = AddressText(*attributes.xorMapped, cookieAndTransaction);
    } else if (attributes.mapped) {
        address = AddressText(*attributes.mapped, kNoMask);
    }
    return address ? StunResponse{.kind = StunResponse::Kind::kAddress, .text = *address}
                   : Failure("the STUN server's response tells no address");
}

StunResponse ReadError(const Attributes& attributes) {
    constexpr std::size_t kNumberSize = 4;
    if (!attributes.errorCode || attributes.errorCode->size() < kNumberSize) {
        return Failure("the STUN server refused");
    }
    const Bytes value = *attributes.errorCode;
    const unsigned number =
        (std::to_integer<unsigned>(value[2]) & 7) * 100 + std::to_integer<unsigned>(value[3]) % 100;
    return Failure("the STUN server refused with error " + std::to_string(number));
}

}  // namespace

StunRequest StunBindingRequest(const StunTransaction& transaction) {
    StunRequest request{};
    request[1] = std::byte{kBindingRequest};
    std::ranges::copy(kCookie, request.begin() + kOffsetOfCookie);
    std::ranges::copy(transaction, request.begin() + kOffsetOfTransaction);
    return request;
}

StunResponse ReadStunResponse(Bytes datagram, const StunTransaction& transaction) {
    if (datagram.size() < kStunHeaderSize ||
        Number16(datagram, kOffsetOfLength) != datagram.size() - kStunHeaderSize ||
        !std::ranges::equal(datagram.subspan(kOffsetOfCookie, kCookie.size()), kCookie) ||
        !std::ranges::equal(datagram.subspan(kOffsetOfTransaction, transaction.size()),
                            transaction)) {
        return {};
    }
    const std::uint16_t type = Number16(datagram, 0);
    const auto attributes = ReadAttributes(datagram.subspan(kStunHeaderSize));
    if (!attributes || (type != kBindingSuccess && type != kBindingError)) {
        return {};
    }
    return type == kBindingSuccess ? ReadSuccess(*attributes, datagram.subspan(kOffsetOfCookie, 16))
                                   : ReadError(*attributes);
}

}  // namespace platform
