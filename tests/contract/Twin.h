// What the contract suite needs of a twin beyond the interfaces.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

namespace twin {

/// Before each test.
void Reset();

/// Keeps the calling thread busy for so long.
void Spend(double seconds);

/// A descriptor that can be adopted as a port, and what closes the other end of its pair.
struct Pair {
    int descriptor = -1;
    std::function<void()> closeOther;
};

[[nodiscard]] Pair MakePair();

/// A folder that is empty after Reset.
[[nodiscard]] std::string Folder();

/// Puts something there, where nothing is.
void PutFile(const std::string& path, const std::string& contents, std::uint32_t permissions);
void PutDirectory(const std::string& path);
void PutLink(const std::string& path, const std::string& target);
void PutFifo(const std::string& path);

void RemoveFile(const std::string& path);

struct File {
    std::string contents;
    std::uint32_t permissions = 0;
};

/// The regular file at a path, links not followed; none when there is none.
[[nodiscard]] std::optional<File> FileAt(const std::string& path);

}  // namespace twin
