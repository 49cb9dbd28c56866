// Binary property lists of version 1.0 on their way in.
#pragma once

#include <cstddef>
#include <optional>
#include <span>

#include "platform/PropertyList.h"
#include "platform/PropertyListLimits.h"

namespace platform {

/// Parses at most PropertyListLimits::bytes, under the rules of PropertyListCreateWithData. Null,
/// fill, UID and set objects are refused, and so are integers of 16 bytes beyond 64 bits.
[[nodiscard]] std::optional<PropertyList> ReadBinaryPropertyList(std::span<const std::byte> data);

}  // namespace platform
