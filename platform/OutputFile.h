// A file that is written from its start, below folders that may be a stranger's.
#pragma once

#include <cstddef>
#include <memory>
#include <span>
#include <string_view>

namespace platform {

/// All operations return 0 or an errno value.
class OutputFile {
public:
    OutputFile();
    OutputFile(OutputFile&&) noexcept;
    OutputFile& operator=(OutputFile&&) noexcept;
    OutputFile(const OutputFile&) = delete;
    OutputFile& operator=(const OutputFile&) = delete;
    ~OutputFile();

    /// As fopen(3) with "w": a regular file is emptied and keeps owner and mode, otherwise one is
    /// made with 0666 less the umask. The path is resolved as PathAccess does, and a link in the
    /// last step is never followed (ELOOP): the mobile user could lead us to any file there. For
    /// the same reason EMLINK for a file that has other names. A directory, or a slash at the end:
    /// EISDIR. What is no file: EINVAL. None of this waits. Whatever was open before is closed.
    [[nodiscard]] int open(std::string_view path);

    /// All of the bytes, or an error; then some of them may be written. EBADF while nothing is
    /// open.
    [[nodiscard]] int write(std::span<const std::byte> bytes);

    /// EBADF while nothing is open. Nothing is open afterwards, also after an error.
    [[nodiscard]] int close();

private:
    struct State;
    std::unique_ptr<State> state_;
};

}  // namespace platform
