// Decompression of gzip data into a file.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

#include "platform/OutputFile.h"

namespace hvu::Compression {

/// More than this is no database, whatever it decodes to.
inline constexpr std::uint64_t kDecompressedMax = 4ULL << 30;

/// Decodes all members of gzip data (RFC 1952) and writes them to the file one behind the other. At
/// the end there may be zero bytes, which tapes leave, and nothing else. False when the data is
/// damaged, cut or empty, when it decodes to more than the maximum, or when a write fails; a part
/// may be written then.
[[nodiscard]] bool Decompress(std::span<const std::byte> data, platform::OutputFile& file);

}  // namespace hvu::Compression
