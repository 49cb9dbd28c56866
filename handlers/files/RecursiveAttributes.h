// Attributes set on an item and on all that lies below it.
#pragma once

#include <string_view>

#include "platform/FileManager.h"

/// 5 when nothing is at the path; else what became of the item itself, or, when that went well, the
/// last failure below it, or 0.
[[nodiscard]] int SetAttributesRecursively(std::string_view path,
                                           const platform::FileAttributes& attributes);
