#include "platform/Assertion.h"

#include <cstdlib>

#include "platform/Log.h"

namespace platform {

void AssertionFailure(const char* expression, const char* function, const char* file, int line) {
    Log(LogLevel::kError,
        "Assertion failed: (%s), function %s, file %s, line %d.",
        expression,
        function,
        file,
        line);
    std::abort();
}

}  // namespace platform
