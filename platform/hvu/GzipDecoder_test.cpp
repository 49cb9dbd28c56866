#include "platform/hvu/GzipDecoder.h"

#include <gtest/gtest.h>

#include "platform/hvu/Compression.h"
#include "platform/hvu/Gzip_test.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"

namespace {

using hvu::Compression::GzipDecoder;
using Result = GzipDecoder::Result;

constexpr std::uint64_t kMuch = 1ULL << 40;

struct Decoded {
    Result result = Result::kGoOn;
    bool isComplete = false;
    std::string text{};
};

Decoded Decode(std::string_view data,
               std::uint64_t most = kMuch,
               std::size_t pieceSize = SIZE_MAX) {
    Decoded decoded;
    GzipDecoder decoder(most, [&decoded](std::span<const std::byte> bytes) {
        decoded.text.append(reinterpret_cast<const char*>(bytes.data()), bytes.size());
        return true;
    });
    for (std::size_t at = 0; at < data.size(); at += std::min(pieceSize, data.size())) {
        decoded.result = decoder.decode(AsBytes(data.substr(at, pieceSize)));
    }
    decoded.isComplete = decoder.isComplete();
    return decoded;
}

bool IsWhole(const Decoded& decoded) {
    return decoded.result == Result::kGoOn && decoded.isComplete;
}

/// Two members with an empty one in between, more than the decoder's buffer in all.
std::string Members() {
    return Gzip(std::string(600'000, 'a') + "end") + Gzip("") + Gzip("second");
}

const std::string kMembersText = std::string(600'000, 'a') + "endsecond";

TEST(GzipDecoder, DecodesAllMembers) {
    const auto decoded = Decode(Members());
    EXPECT_TRUE(IsWhole(decoded));
    EXPECT_TRUE(decoded.text == kMembersText);
}

TEST(GzipDecoder, TakesItsDataInPiecesOfAnySize) {
    for (const std::size_t size : {1U, 2U, 7U, 100U}) {
        const auto decoded = Decode(Members() + std::string(20, '\0'), kMuch, size);
        EXPECT_TRUE(IsWhole(decoded)) << size;
        EXPECT_TRUE(decoded.text == kMembersText) << size;
    }
}

TEST(GzipDecoder, KnowsWhetherTheDataIsWhole) {
    const std::string data = Gzip("first") + Gzip("second");
    const std::size_t firstSize = Gzip("first").size();
    for (std::size_t size = 0; size <= data.size(); ++size) {
        const auto decoded = Decode(data.substr(0, size));
        EXPECT_EQ(decoded.result, Result::kGoOn) << size;
        EXPECT_EQ(decoded.isComplete, size == firstSize || size == data.size()) << size;
    }
}

TEST(GzipDecoder, FindsEveryDamagedByte) {
    const std::string text = "a text with some variety, 0123456789";
    const std::string data = Gzip(text);
    // The bytes 4 to 9 of a header (time, flags, system) say nothing about the contents.
    for (std::size_t at = 0; at < data.size(); at += at == 3 ? 7 : 1) {
        std::string damaged = data;
        damaged[at] = static_cast<char>(damaged[at] ^ 0x55);
        EXPECT_FALSE(IsWhole(Decode(damaged))) << at;
    }
}

TEST(GzipDecoder, AllowsZeroBytesAtTheEndAndNothingElse) {
    const std::string data = Gzip("text");
    EXPECT_TRUE(IsWhole(Decode(data + std::string(1000, '\0'))));
    for (const std::string& tail : {std::string("x"),
                                    std::string(10, '\0') + "x",
                                    std::string(10, '\0') + data,
                                    std::string("\x1f"),
                                    std::string("\x1f\x8b")}) {
        EXPECT_FALSE(IsWhole(Decode(data + tail)));
    }
    EXPECT_FALSE(IsWhole(Decode(std::string(10, '\0') + data)));
}

TEST(GzipDecoder, RefusesOtherFormats) {
    for (const std::string& data : {std::string("plain text"),
                                    std::string("\x78\x9c\x03\x00\x00\x00\x00\x01", 8),  // zlib
                                    std::string("PK\x03\x04"),
                                    std::string("\x1f\x9d\x90")}) {  // compress
        EXPECT_EQ(Decode(data).result, Result::kDamaged);
    }
}

TEST(GzipDecoder, HandsOverUpToItsMaximum) {
    const std::string data = Gzip("12345") + Gzip("67890");
    EXPECT_TRUE(IsWhole(Decode(data, 10)));
    for (const std::uint64_t most : {0U, 1U, 5U, 9U}) {
        const auto decoded = Decode(data, most);
        EXPECT_EQ(decoded.result, Result::kTooLarge);
        EXPECT_FALSE(decoded.isComplete);
        EXPECT_EQ(decoded.text, std::string("1234567890").substr(0, most));
    }
}

TEST(GzipDecoder, BoundsWhatABombDecodesTo) {
    const std::string member = Gzip(std::string(8UL << 20, '\0'));
    EXPECT_LT(member.size(), 100'000U);
    const auto decoded = Decode(member + member, 9UL << 20);
    EXPECT_EQ(decoded.result, Result::kTooLarge);
    EXPECT_EQ(decoded.text.size(), 9UL << 20);
}

TEST(GzipDecoder, StaysWithItsFirstFailure) {
    unsigned calls = 0;
    GzipDecoder decoder(kMuch, [&](std::span<const std::byte>) { return ++calls != 1; });
    EXPECT_EQ(decoder.decode(AsBytes(Gzip("text"))), Result::kSinkFailed);
    EXPECT_EQ(decoder.decode(AsBytes(Gzip("text"))), Result::kSinkFailed);
    EXPECT_EQ(calls, 1U);
    EXPECT_FALSE(decoder.isComplete());
}

class Decompress : public testing::Test {
protected:
    Decompress() {
        sim::Reset();
        EXPECT_EQ(file_.open("/tmp/file"), 0);
    }

    bool decompress(std::string_view data) {
        return hvu::Compression::Decompress(AsBytes(data), file_);
    }

    static std::string contents() { return sim::FileAt("/tmp/file")->contents; }

    platform::OutputFile file_;
};

TEST_F(Decompress, WritesAllMembers) {
    EXPECT_TRUE(decompress(Members()));
    EXPECT_TRUE(contents() == kMembersText);
}

TEST_F(Decompress, FailsForDataThatIsDamagedCutOrEmpty) {
    const std::string data = Gzip("text");
    EXPECT_FALSE(decompress(""));
    EXPECT_FALSE(decompress("text"));
    EXPECT_FALSE(decompress(data.substr(0, data.size() - 1)));
    EXPECT_FALSE(decompress(data + "x"));
}

TEST_F(Decompress, FailsWithTheFile) {
    sim::FailCall("OutputFile.write", 2);
    EXPECT_FALSE(decompress(Members()));
    EXPECT_LT(contents().size(), kMembersText.size());
    EXPECT_EQ(file_.close(), 0);
    EXPECT_FALSE(decompress(Members()));
}

TEST_F(Decompress, StopsAtFourGibibytes) {
    EXPECT_EQ(hvu::Compression::kDecompressedMax, 4'294'967'296U);
}

}  // namespace
