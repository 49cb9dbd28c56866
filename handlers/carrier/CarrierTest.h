// Fields of requests, for tests that call a handler.
#pragma once

#include <array>
#include <cstring>
#include <string_view>

#include "Helper/Shared/Server/RequestFields.h"

/// A field of 1024 bytes as it came in a message.
inline String1024 Field1024(std::string_view text) {
    std::array<std::byte, 1024> field{};
    if (!text.empty()) {
        std::memcpy(field.data(), text.data(), text.size());
    }
    return String1024(std::span<const std::byte, 1024>(field));
}
