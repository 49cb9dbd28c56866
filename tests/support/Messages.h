// Messages as a client writes and reads them.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <string_view>
#include <vector>

#include "Helper/Shared/Server/MessageLayouts.h"

namespace messages {

using Bytes = std::vector<std::byte>;

template <typename T>
void Put(Bytes& message, std::size_t offset, const T& value) {
    platform::Store(std::span(message), offset, value);
}

template <typename T>
[[nodiscard]] T Get(const Bytes& message, std::size_t offset) {
    return platform::Load<T>(std::span<const std::byte>(message), offset);
}

inline void PutText(Bytes& message, std::size_t offset, std::string_view text) {
    if (!text.empty()) {
        std::memcpy(message.data() + offset, text.data(), text.size());
    }
}

/// A message of that many bytes, zeroed but for its header, whose port names are nonsense.
[[nodiscard]] inline Bytes Message(std::int32_t id, std::uint32_t size, std::uint32_t bits = 0) {
    Bytes message(size);
    Put(message,
        0,
        platform::MachMsgHeader{.bits = bits,
                                .size = size,
                                .remotePort = 0xDEAD,
                                .localPort = 0xBEEF,
                                .voucherPort = 0xF00D,
                                .id = id});
    return message;
}

/// The check-in, whose watch port travels beside it.
[[nodiscard]] inline Bytes CheckIn() {
    Bytes message = Message(kCheckInId, kCheckInRequestSize, platform::MACH_MSGH_BITS_COMPLEX);
    Put(message, 24, std::uint32_t{1});
    Put(message, 28, std::uint32_t{0x1234});
    Put(message, 32, std::uint32_t{0xFFFFFFFF});  // padding is anybody's
    Put(message, 36, std::uint16_t{0xFFFF});
    Put(message, 38, std::uint8_t{17});
    return message;
}

/// A request of a routine by its number, with its text fields in order.
[[nodiscard]] inline Bytes Request(std::size_t number,
                                   std::initializer_list<std::string_view> texts = {}) {
    const RoutineLayout& layout = kRoutineLayouts.at(number);
    Bytes message = Message(layout.id, layout.requestSize);
    std::size_t field = 0;
    for (const std::string_view text : texts) {
        PutText(message, layout.offsetOfField(field++), text);
    }
    return message;
}

/// Routine 6 with its data behind the message.
[[nodiscard]] inline Bytes SetPreference(std::string_view domain,
                                         std::string_view key,
                                         std::string_view data) {
    Bytes message = Message(8683555, 568, platform::MACH_MSGH_BITS_COMPLEX);
    const auto size = static_cast<std::uint32_t>(data.size());
    Put(message, 24, std::uint32_t{1});
    Put(message, 39, std::uint8_t{1});
    Put(message, 40, size);
    PutText(message, 52, domain);
    PutText(message, 308, key);
    Put(message, 564, size);
    message.resize(568 + data.size());
    PutText(message, 568, data);
    return message;
}

[[nodiscard]] inline bool IsComplex(const Bytes& reply) {
    return (Get<std::uint32_t>(reply, 0) & platform::MACH_MSGH_BITS_COMPLEX) != 0;
}

/// The return code of a reply; a complex one has none and means success.
[[nodiscard]] inline platform::kern_return_t CodeOf(const Bytes& reply) {
    return IsComplex(reply) ? platform::KERN_SUCCESS : Get<platform::kern_return_t>(reply, 32);
}

[[nodiscard]] inline std::uint32_t SizeOf(const Bytes& reply) {
    return Get<std::uint32_t>(reply, 4);
}

}  // namespace messages
