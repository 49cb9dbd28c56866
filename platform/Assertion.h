// Assertions for our own mistakes; they hold in release builds.
#pragma once

namespace platform {

/// Names the expression, the function and the place at error level and aborts.
[[noreturn]] void AssertionFailure(const char* expression,
                                   const char* function,
                                   const char* file,
                                   int line);

}  // namespace platform

#define PLATFORM_ASSERT(expression) \
    ((expression) ? (void)0         \
                  : ::platform::AssertionFailure(#expression, __func__, __FILE__, __LINE__))
