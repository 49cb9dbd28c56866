// The files of a twin, as the world around the daemon sees them.
#pragma once

#include <cstdint>
#include <map>
#include <string>

namespace twin {

inline constexpr std::uint32_t kFolder = 0040000;
inline constexpr std::uint32_t kFile = 0100000;
inline constexpr std::uint32_t kLink = 0120000;
inline constexpr std::uint32_t kFifo = 0010000;
inline constexpr std::uint32_t kTypeBits = 0170000;

struct Item {
    std::uint32_t mode = kFile | 0644;
    std::string contents{};  ///< or where a link leads
    std::map<std::string, std::string> attributes{};
    std::int64_t modified = 0;  ///< in nanoseconds; not set when 0
    std::uint32_t owner = 0;    ///< what it was found with
    std::uint32_t group = 0;
};

/// The path of an empty folder of the process's own.
[[nodiscard]] std::string FreshFolder();

/// Puts something where nothing is; it belongs to the process.
void Put(const std::string& path, const Item& item);

/// Gives a file a second name.
void PutName(const std::string& path, const std::string& secondPath);

[[nodiscard]] bool AreOneFile(const std::string& path, const std::string& other);

/// All that lies below a path, by subpath, and itself under the name "".
[[nodiscard]] std::map<std::string, Item> Tree(const std::string& path);

}  // namespace twin
