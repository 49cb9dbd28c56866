// Datagrams that arrive at the heartbeat's socket: none is read beyond its end, and the ones taken
// are those that a plain reading of the header takes.
#include "fuzz/Fuzz.h"
#include "heartbeat/EchoProbe.h"

namespace {

constexpr std::uint16_t kIdentifier = 0x1234;

/// Field by field, with the header put aside first.
bool IsReplyAsWritten(std::span<const std::byte> datagram) {
    if (datagram.empty()) {
        return false;
    }
    const std::size_t header = std::to_integer<std::size_t>(datagram[0]) % 16 * 4;
    if (datagram.size() < header) {
        return false;
    }
    const auto message = datagram.subspan(header);
    return message.size() >= 48 && message[0] == std::byte{0} && message[4] == std::byte{0x12} &&
           message[5] == std::byte{0x34};
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto datagram = std::as_bytes(std::span(data, size));
    Require(IsEchoReply(datagram, kIdentifier) == IsReplyAsWritten(datagram));
    // One that was taken is no longer taken when its identifier is another.
    Require(!IsEchoReply(datagram, kIdentifier) || !IsEchoReply(datagram, kIdentifier + 1));
    return 0;
}
