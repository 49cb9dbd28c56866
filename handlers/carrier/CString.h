// A text as a NUL-terminated string, in the caller's buffer where it fits.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

/// Where a string that does not fit comes from; `allocate` returns null without memory.
struct CStringAllocator {
    void* (*allocate)(std::size_t size);
    void (*deallocate)(void* block);
};

extern const CStringAllocator kDefaultCStringAllocator;

enum class StringEncoding : std::uint32_t { kAscii = 0x0600, kUtf8 = 0x08000100 };

/// Returns the caller's buffer when the string fits in it, else a new block of the allocator, which
/// the caller gives back when it differs from the buffer. `*length` is the size of the buffer
/// before and the length of the string after; both may be null. What the encoding cannot express
/// ends the string of a new block. Without memory the buffer, if any, becomes an empty string.
[[nodiscard]] char* _CFStringGetOrCreateCString(const CStringAllocator& allocator,
                                                std::string_view string,
                                                char* buffer,
                                                std::size_t* length,
                                                StringEncoding encoding);
