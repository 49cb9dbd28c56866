// A request under construction: the fields of a routine at the places that its layout gives them.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>

#include "Helper/Shared/Server/MessageLayouts.h"
#include "client/Descriptor.h"
#include "client/MessageSocket.h"

namespace linefold_client {

/// Data that travels beside a message.
using Data = std::span<const std::byte>;

/// Whether an argument of this type can be put into a field.
template <typename Argument>
[[nodiscard]] constexpr bool ArgumentFits(Field field) = delete;

template <>
constexpr bool ArgumentFits<const char*>(Field field) {
    return field == Field::kString64 || field == Field::kString256 || field == Field::kString1024;
}

template <>
constexpr bool ArgumentFits<std::int32_t>(Field field) {
    return field == Field::kInt32;
}

template <>
constexpr bool ArgumentFits<double>(Field field) {
    return field == Field::kDouble;
}

template <>
constexpr bool ArgumentFits<Data>(Field field) {
    return field == Field::kData;
}

class RequestMessage final {
public:
    explicit RequestMessage(const RoutineLayout& layout);

    // Each answers 0 or the error that the caller of the library gets: INVALID_ARGUMENT for a null
    // text or data, ARGUMENT_TOO_LONG.
    [[nodiscard]] std::int32_t put(std::size_t index, const char* text);
    [[nodiscard]] std::int32_t put(std::size_t index, std::int32_t number);
    [[nodiscard]] std::int32_t put(std::size_t index, double number);
    /// The bytes are lent until the request is sent.
    [[nodiscard]] std::int32_t put(std::size_t index, Data data);

    /// The finished request: 0, or NO_RESOURCES. It refers to this object.
    [[nodiscard]] std::int32_t finish(OutgoingMessage& outgoing);

private:
    static constexpr std::size_t kMaxSize = 3104;

    [[nodiscard]] std::span<std::byte> message() {
        return std::span(bytes_).first(layout_.requestSize);
    }

    const RoutineLayout& layout_;
    std::array<std::byte, kMaxSize> bytes_{};
    Data data_;
    Descriptor memoryFile_;
};

/// The check-in, which brings the watch port beside it.
using CheckInMessage = std::array<std::byte, kCheckInRequestSize>;
[[nodiscard]] CheckInMessage MakeCheckInMessage();

}  // namespace linefold_client
