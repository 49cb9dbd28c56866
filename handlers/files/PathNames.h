// Small questions about paths: what is there, and what its last step is called.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/PathAccess.h"

enum class ItemKind : std::uint8_t { kNone, kDirectory, kOther };

/// What a path leads to, links followed. One that leads nowhere, or elsewhere by the will of a
/// stranger, is nothing.
[[nodiscard]] ItemKind KindAt(const platform::PathAccess& path);

/// basename(3) and dirname(3) of the first 1023 bytes.
[[nodiscard]] std::string BaseName(std::string_view path);
[[nodiscard]] std::string DirName(std::string_view path);
