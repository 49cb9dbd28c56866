// What a request's fields become on the way to a handler, and what its out values are.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <string_view>

/// A text field of N bytes: the bytes to the first NUL, at most N, with a NUL of ours behind.
template <std::size_t N>
class InlineString {
public:
    explicit InlineString(std::span<const std::byte, N> field) {
        const void* end = std::memchr(field.data(), 0, N);
        length_ = end == nullptr
                      ? N
                      : static_cast<std::size_t>(static_cast<const std::byte*>(end) - field.data());
        std::memcpy(text_.data(), field.data(), length_);
        text_[length_] = '\0';
    }

    /// Makes the last byte of the field a NUL: a text that fills the field loses one byte.
    void forceTermination() {
        if (length_ == N) {
            text_[--length_] = '\0';
        }
    }

    [[nodiscard]] std::string_view view() const { return {text_.data(), length_}; }

    [[nodiscard]] const char* cString() const { return text_.data(); }

    [[nodiscard]] bool empty() const { return length_ == 0; }

private:
    std::array<char, N + 1> text_;
    std::size_t length_ = 0;
};

using String256 = InlineString<256>;
using String1024 = InlineString<1024>;

/// A text field of a reply, zeroed at birth and sent whole.
template <std::size_t N>
using OutString = std::array<char, N>;

/// Bulk data of a reply: memory from vm_allocate, which leaves with it. A null address and a count
/// of 0 stand for an absent value.
struct OutOfLineData {
    void* address = nullptr;
    std::uint32_t count = 0;
};
