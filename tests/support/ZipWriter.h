// A writer of ZIP archives in which every field can lie.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace zip {

inline constexpr std::uint32_t kFile = 0100000;
inline constexpr std::uint32_t kFolder = 0040000;
inline constexpr std::uint32_t kLink = 0120000;

/// What the local header says, or the record of the central directory.
struct Fields {
    std::optional<std::string> name{};
    std::optional<std::uint32_t> crc{};
    std::optional<std::uint32_t> compressedSize{};
    std::optional<std::uint32_t> size{};
    std::optional<std::uint16_t> method{};
    std::optional<std::uint16_t> flags{};
    std::string extra{};
};

struct Entry {
    std::string name;
    std::string data{};  ///< as it stands in the archive
    std::uint32_t mode = kFile | 0644;
    std::uint16_t method = 0;
    std::uint16_t flags = 0x0800;         ///< the name is UTF-8
    std::uint8_t system = 3;              ///< Unix
    std::optional<std::uint32_t> size{};  ///< of the data, when it is not stored
    std::optional<std::uint32_t> crc{};
    Fields local{};
    Fields central{};
    std::optional<std::uint32_t> offset{};  ///< of the local header, as the directory tells it
    bool hasHeader = true;                  ///< otherwise the directory alone tells of it
};

struct Archive {
    std::vector<Entry> entries;
    std::string before{};  ///< in front of it all
    std::string comment{};
    std::optional<std::uint16_t> count{};
    std::optional<std::uint32_t> directoryOffset{};
    std::optional<std::uint32_t> directorySize{};
    std::string locator{};  ///< between the directory and its end, such as that of zip64
};

[[nodiscard]] Entry File(std::string name, std::string data, std::uint32_t mode = 0644);
[[nodiscard]] Entry Folder(std::string name, std::uint32_t mode = 0755);
[[nodiscard]] Entry Link(std::string name, std::string target);

/// A deflated file of that many zeros, without their checksum when there are more than 64 MiB.
[[nodiscard]] Entry Zeros(std::string name, std::uint32_t size);

/// An entry whose sizes and place stand in a zip64 extra field.
[[nodiscard]] Entry Zip64(Entry entry, std::uint64_t size, std::uint64_t compressedSize);

[[nodiscard]] std::string Write(const Archive& archive);
[[nodiscard]] std::string Write(std::vector<Entry> entries);

[[nodiscard]] std::uint32_t Crc32(std::string_view data);

/// Numbers in the archive's order of bytes.
[[nodiscard]] std::string Number(std::uint64_t value, std::size_t bytes);

}  // namespace zip
