// Gzip data in pieces: what zlib decodes in one go, member by member, comes out, and nothing else
// is taken for whole. The first byte of an input says how large the pieces are.
#include <zlib.h>

#include <algorithm>
#include <optional>
#include <string>

#include "fuzz/Fuzz.h"
#include "platform/hvu/GzipDecoder.h"

using hvu::Compression::GzipDecoder;

namespace {

constexpr std::size_t kMost = 1U << 16;

/// One member from the front of the data, which it is taken from; none when it is not whole.
std::optional<std::string> Member(std::string& data, std::size_t most) {
    constexpr int kGzipWindow = 15 + 16;
    std::string text(most + 1, '\0');
    z_stream stream{};
    Require(inflateInit2(&stream, kGzipWindow) == Z_OK);
    stream.next_in = reinterpret_cast<Bytef*>(data.data());
    stream.avail_in = static_cast<uInt>(data.size());
    stream.next_out = reinterpret_cast<Bytef*>(text.data());
    stream.avail_out = static_cast<uInt>(text.size());
    const bool isWhole = inflate(&stream, Z_FINISH) == Z_STREAM_END && stream.total_out <= most;
    text.resize(stream.total_out);
    data.erase(0, stream.total_in);
    (void)inflateEnd(&stream);
    return isWhole ? std::optional(text) : std::nullopt;
}

std::optional<std::string> Oracle(std::string data) {
    std::string text;
    do {
        const auto member = Member(data, kMost - text.size());
        if (!member) {
            return std::nullopt;
        }
        text += *member;
    } while (!data.empty() && data.front() != '\0');
    return data.find_first_not_of('\0') == std::string::npos ? std::optional(text) : std::nullopt;
}

std::optional<std::string> Decode(std::string_view data, std::size_t pieceSize) {
    std::string text;
    GzipDecoder decoder(kMost, [&text](std::span<const std::byte> bytes) {
        Require(!bytes.empty());
        text.append(reinterpret_cast<const char*>(bytes.data()), bytes.size());
        return true;
    });
    for (; !data.empty(); data.remove_prefix(std::min(pieceSize, data.size()))) {
        (void)decoder.decode(std::as_bytes(std::span(data.substr(0, pieceSize))));
    }
    Require(text.size() <= kMost);
    return decoder.isComplete() ? std::optional(text) : std::nullopt;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (size == 0) {
        return 0;
    }
    const std::string rest(reinterpret_cast<const char*>(data) + 1, size - 1);
    const auto expected = Oracle(rest);
    Require(Decode(rest, data[0] == 0 ? SIZE_MAX : data[0]) == expected);
    Require(Decode(rest, SIZE_MAX) == expected);
    return 0;
}
