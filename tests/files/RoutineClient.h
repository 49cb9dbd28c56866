// A client of the routines for files, and the phone around them.
#pragma once

#include <fstream>
#include <string>
#include <string_view>
#include <vector>

#include "tests/support/PhoneRoot.h"

namespace files {

using Lines = std::vector<std::string>;

inline constexpr std::int32_t kCopyFile = kFirstRoutineId + 15;
inline constexpr std::int32_t kCopyLogDirectory = kFirstRoutineId + 16;
inline constexpr std::int32_t kMoveDirectory = kFirstRoutineId + 17;
inline constexpr std::int32_t kCopyArchive = kFirstRoutineId + 22;
inline constexpr std::int32_t kLoadPlistFile = kFirstRoutineId + 23;

[[nodiscard]] inline phone::Bytes Request(std::int32_t id,
                                          const std::vector<std::string_view>& texts) {
    const RoutineLayout& layout = *FindRoutineLayout(id);
    auto message = phone::Message(id, layout.requestSize);
    for (std::size_t i = 0; i < texts.size(); ++i) {
        phone::PutText(message, layout.offsetOfField(i), texts[i]);
    }
    return message;
}

/// The 40 bytes that say whether it was done.
[[nodiscard]] inline phone::Bytes FlagReply(std::int32_t id, bool isDone) {
    auto reply = phone::Message(id + 100, 40);
    reply[28] = std::byte{1};  // the NDR record
    reply[36] = std::byte{isDone};
    return reply;
}

[[nodiscard]] inline std::string Read(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

inline void Write(const std::string& path, std::string_view contents) {
    std::ofstream(path, std::ios::binary) << contents;
}

}  // namespace files
