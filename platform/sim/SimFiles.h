// The simulated file tree. The world's own view: every link is followed, whoever owns it.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace sim {

inline constexpr std::uint32_t kDirectory = 0040000;
inline constexpr std::uint32_t kFifo = 0010000;
inline constexpr std::uint32_t kRegular = 0100000;
inline constexpr std::uint32_t kLink = 0120000;
inline constexpr std::uint32_t kSocket = 0140000;
inline constexpr std::uint32_t kCharacterDevice = 0020000;
inline constexpr std::uint32_t kBlockDevice = 0060000;

struct FileNode {
    std::uint32_t mode = 0;
    std::uint32_t owner = 0;
    std::string contents{};                ///< of a file, or where a link leads
    std::optional<std::uint32_t> group{};  ///< none: the same as the owner
    std::map<std::string, std::string> attributes{};
    std::int64_t modified = 0;  ///< in nanoseconds

    [[nodiscard]] std::uint32_t groupId() const { return group.value_or(owner); }

    [[nodiscard]] bool is(std::uint32_t type) const { return (mode & 0170000) == type; }
};

/// Puts something at a path whose folder exists, in place of what is there.
void MakeFile(std::string_view path, FileNode node);
void MakeDirectory(std::string_view path, std::uint32_t owner = 0);
void MakeLink(std::string_view path, std::string_view target, std::uint32_t owner = 0);
void RemoveFile(std::string_view path);

/// Gives what stands at a path a second name.
void LinkFile(std::string_view path, std::string_view secondPath);

/// Whether two paths name one file.
[[nodiscard]] bool AreOneFile(std::string_view path, std::string_view otherPath);

/// Folders on another file system than what is not below one of them.
void MountAt(std::string_view path);

/// What stands at a path; a link in the last step is not followed.
[[nodiscard]] std::optional<FileNode> FileAt(std::string_view path);

}  // namespace sim
