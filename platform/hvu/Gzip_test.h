// Gzip data for tests.
#pragma once

#include <zlib.h>

#include <cstddef>
#include <span>
#include <string>
#include <string_view>

/// One member that decodes to the text.
inline std::string Gzip(std::string_view text) {
    constexpr int kGzipWindow = 15 + 16;
    z_stream stream{};
    (void)deflateInit2(&stream, Z_BEST_SPEED, Z_DEFLATED, kGzipWindow, 8, Z_DEFAULT_STRATEGY);
    std::string data(deflateBound(&stream, text.size()), '\0');
    stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(text.data()));
    stream.avail_in = static_cast<uInt>(text.size());
    stream.next_out = reinterpret_cast<Bytef*>(data.data());
    stream.avail_out = static_cast<uInt>(data.size());
    (void)deflate(&stream, Z_FINISH);
    data.resize(stream.total_out);
    (void)deflateEnd(&stream);
    return data;
}

inline std::span<const std::byte> AsBytes(std::string_view text) {
    return std::as_bytes(std::span(text));
}
