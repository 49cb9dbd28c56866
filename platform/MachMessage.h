// Messages: the layout that they share on the wire, and a received one on its way to its handler.
#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <span>
#include <type_traits>

#include "platform/MachPort.h"

namespace platform {

static_assert(std::endian::native == std::endian::little, "messages travel in our byte order");

class RunLoopSource;

inline constexpr std::uint32_t MACH_MSGH_BITS_COMPLEX = 0x80000000;

inline constexpr kern_return_t MIG_TYPE_ERROR = -300;
inline constexpr kern_return_t MIG_BAD_ID = -303;
inline constexpr kern_return_t MIG_BAD_ARGUMENTS = -304;
inline constexpr kern_return_t MIG_TRAILER_ERROR = -309;

/// Every message starts with these 24 bytes, little-endian.
struct MachMsgHeader {
    std::uint32_t bits = 0;
    std::uint32_t size = 0;
    mach_port_t remotePort = MACH_PORT_NULL;
    mach_port_t localPort = MACH_PORT_NULL;
    mach_port_t voucherPort = MACH_PORT_NULL;
    std::int32_t id = 0;
};

static_assert(sizeof(MachMsgHeader) == 24, "the header travels as it lies in memory");

// Offsets in bytes from the start of a message.
inline constexpr std::size_t kOffsetOfDescriptorCount = 24;
inline constexpr std::size_t kOffsetOfNdr = 24;
inline constexpr std::size_t kOffsetOfReturnCode = 32;
inline constexpr std::size_t kOffsetOfDescriptor = 28;
inline constexpr std::size_t kOffsetOfPortDisposition = 38;
inline constexpr std::size_t kOffsetOfDescriptorType = 39;
inline constexpr std::size_t kOffsetOfOutOfLineFlags = 36;
inline constexpr std::size_t kOffsetOfOutOfLineSize = 40;

inline constexpr std::uint32_t kPortDescriptorEnd = 40;
inline constexpr std::uint32_t kOutOfLineDescriptorEnd = 44;

enum class DescriptorType : std::uint8_t { kPort = 0, kOutOfLine = 1 };

inline constexpr std::array<std::uint8_t, 8> kNdrRecord{0, 0, 0, 0, 1, 0, 0, 0};
inline constexpr std::uint32_t kErrorReplySize = 36;
inline constexpr std::uint32_t kMaxReplySize = 292;

/// Out-of-line data rides behind its message up to here, and in a sealed memory file above.
inline constexpr std::uint32_t kMaxInlineData = 65'536;
inline constexpr std::uint32_t kMaxRequestData = 16u << 20;
inline constexpr std::uint32_t kMaxReplyData = 64u << 20;

/// Who sent a message, as the kernel tells it: auid, euid, egid, ruid, rgid, pid, asid, pid
/// version.
using AuditToken = std::array<std::uint32_t, 8>;

inline constexpr std::uint32_t kUnknownIdentity = 0xFFFFFFFF;
/// The token of a message whose sender nobody looked at: no process, no user.
inline constexpr AuditToken kUnknownSender{kUnknownIdentity,
                                           kUnknownIdentity,
                                           kUnknownIdentity,
                                           kUnknownIdentity,
                                           kUnknownIdentity,
                                           0,
                                           0,
                                           0};

struct AuditIdentity {
    std::uint32_t euid = kUnknownIdentity;
    std::uint32_t egid = kUnknownIdentity;
    std::int32_t pid = 0;

    bool operator==(const AuditIdentity&) const = default;
};

[[nodiscard]] constexpr AuditIdentity audit_token_to_identity(const AuditToken& token) {
    return {.euid = token[1], .egid = token[2], .pid = static_cast<std::int32_t>(token[5])};
}

/// Stands behind every received message, from the next offset that is a multiple of four.
struct MachMsgAuditTrailer {
    std::uint32_t type = 0;
    std::uint32_t size = 52;
    std::uint32_t sequenceNumber = 0;
    std::uint32_t senderUser = kUnknownIdentity;
    std::uint32_t senderGroup = kUnknownIdentity;
    AuditToken token = kUnknownSender;
};

static_assert(sizeof(MachMsgAuditTrailer) == 52, "a format-0 trailer with the audit elements");
inline constexpr std::size_t kOffsetOfTrailerToken = 20;

/// Reads a value at an offset that the caller has checked.
template <typename T>
requires std::is_trivially_copyable_v<T>

[[nodiscard]] T Load(std::span<const std::byte> bytes, std::size_t offset) {
    T value{};
    std::memcpy(&value, bytes.subspan(offset, sizeof value).data(), sizeof value);
    return value;
}

/// Writes a value at an offset that the caller has checked.
template <typename T>
requires std::is_trivially_copyable_v<T>

void Store(std::span<std::byte> bytes, std::size_t offset, const T& value) {
    std::memcpy(bytes.subspan(offset, sizeof value).data(), &value, sizeof value);
}

/// What came beside the bytes of a message.
enum class DescriptorArrival : std::uint8_t {
    kNone,
    kOne,
    kSurplus,    ///< more than the one that a message may bring
    kTableFull,  ///< one was sent, and this process had no room for it
};

/// One received message. The bytes live in the receiver's buffer until the callout returns.
struct ReceivedMessage {
    /// From the header through the trailer; `header.size` has been made true.
    std::span<std::byte> bytes;
    /// Out-of-line data that rode behind the message.
    std::span<const std::byte> inlineData;
    /// Out-of-line data that was copied into memory of ours (vm_allocate).
    std::span<std::byte> memory{};
    DescriptorArrival arrival = DescriptorArrival::kNone;
    /// The twin's handle of the descriptor that came, -1 for none. Taken over by a port name or
    /// by memory of ours when the message is accepted, closed by the receiver otherwise.
    int descriptor = -1;

    [[nodiscard]] MachMsgHeader header() const { return Load<MachMsgHeader>(bytes, 0); }
};

/// A reply under construction: a message of at most kMaxReplySize bytes, zeroed at birth.
struct ReplyMessage {
    alignas(8) std::array<std::byte, kMaxReplySize> bytes{};

    [[nodiscard]] MachMsgHeader header() const { return Load<MachMsgHeader>(bytes, 0); }

    void setHeader(const MachMsgHeader& header) { Store(bytes, 0, header); }
};

/// Makes what a message brought usable: a port descriptor gets a name of this process, an
/// out-of-line descriptor the address of memory of ours. A stub calls it when its own checks are
/// done. MIG_BAD_ARGUMENTS when something is missing, unsealed, short or surplus,
/// KERN_RESOURCE_SHORTAGE at a limit of ours.
[[nodiscard]] kern_return_t MachMessageAccept(ReceivedMessage& message);

/// Releases the rights and the memory that an accepted message carries and nobody took over.
void MachMessageDestroy(ReceivedMessage& message);

/// Releases the out-of-line memory of an accepted message; its port rights stay.
void MachMessageReleaseMemory(ReceivedMessage& message);

/// Answers one message: fills the reply, which the source sends when the callout returns.
using MachMessageCallout = void (*)(ReceivedMessage& request,
                                    ReplyMessage& reply,
                                    const void* context);

/// A source that receives messages on `port`, one callout each, and sends the replies in order.
/// `context` outlives the source. Null when resources are short or the name has no receive right.
[[nodiscard]] std::shared_ptr<RunLoopSource> MachPortCreateRunLoopSource(mach_port_t port,
                                                                         MachMessageCallout callout,
                                                                         const void* context);

}  // namespace platform
