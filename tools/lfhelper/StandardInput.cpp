#include "tools/lfhelper/StandardInput.h"

#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>

namespace lfhelper {

Input ReadStandardInput(std::size_t sizeMax) {
    std::array<char, 65'536> chunk{};
    std::string content;
    for (;;) {
        const ssize_t size = read(STDIN_FILENO, chunk.data(), chunk.size());
        if (size < 0 && errno == EINTR) {
            continue;
        }
        if (size < 0) {
            return {.content = "",
                    .error = std::string("standard input cannot be read: ") + std::strerror(errno)};
        }
        if (size == 0) {
            return {.content = std::move(content)};
        }
        content.append(chunk.data(), static_cast<std::size_t>(size));
        if (content.size() > sizeMax) {
            return {.content = "",
                    .error = "standard input holds more than " + std::to_string(sizeMax) +
                             " bytes, which no value may"};
        }
    }
}

Input ReadOperand(const std::string& operand, std::size_t sizeMax, LastLineFeed lineFeed) {
    if (operand != "-") {
        return {.content = operand};
    }
    Input input = ReadStandardInput(sizeMax);
    if (lineFeed == LastLineFeed::kDropped && input.content.ends_with('\n')) {
        input.content.pop_back();
    }
    return input;
}

}  // namespace lfhelper
