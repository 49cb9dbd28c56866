// STUN responses: the first 12 bytes are the transaction, the rest is what came. The only way to an
// address is a message of the right shape.
#include <arpa/inet.h>

#include <algorithm>
#include <array>
#include <span>

#include "fuzz/Fuzz.h"
#include "platform/linux/StunMessage.h"

using platform::StunResponse;
using platform::StunTransaction;

namespace {

bool IsAddress(const std::string& text) {
    std::array<std::byte, 16> address{};
    return inet_pton(AF_INET, text.c_str(), address.data()) == 1 ||
           inet_pton(AF_INET6, text.c_str(), address.data()) == 1;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    StunTransaction transaction{};
    if (size < transaction.size()) {
        return 0;
    }
    const auto bytes = std::as_bytes(std::span(data, size));
    std::ranges::copy(bytes.first(transaction.size()), transaction.begin());
    const auto datagram = bytes.subspan(transaction.size());
    const StunResponse response = platform::ReadStunResponse(datagram, transaction);
    const bool isOurs = datagram.size() >= platform::kStunHeaderSize &&
                        std::ranges::equal(datagram.subspan(8, transaction.size()), transaction);
    switch (response.kind) {
        case StunResponse::Kind::kNone:
            Require(response.text.empty());
            break;
        case StunResponse::Kind::kAddress:
            Require(isOurs && IsAddress(response.text));
            break;
        case StunResponse::Kind::kError:
            Require(isOurs && !response.text.empty());
            break;
    }
    return 0;
}
