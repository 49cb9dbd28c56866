#include "platform/hvu/Compression.h"

#include "platform/hvu/GzipDecoder.h"

bool hvu::Compression::Decompress(std::span<const std::byte> data, platform::OutputFile& file) {
    GzipDecoder decoder(kDecompressedMax, [&file](std::span<const std::byte> bytes) {
        return file.write(bytes) == 0;
    });
    return decoder.decode(data) == GzipDecoder::Result::kGoOn && decoder.isComplete();
}
