#include "platform/Utf8.h"

#include <gtest/gtest.h>

#include <string>

namespace {

using platform::IsUtf8;
using platform::Utf8SequenceLength;

/// The encoding of a number by the plain rule, also where the standard forbids it.
std::string Encode(std::uint32_t value, int length) {
    if (length == 1) {
        return std::string(1, static_cast<char>(value));
    }
    std::string text;
    for (int i = length - 1; i > 0; --i) {
        text.insert(text.begin(), static_cast<char>(0x80 | (value & 0x3F)));
        value >>= 6;
    }
    const std::uint32_t mark = length == 2 ? 0xC0 : length == 3 ? 0xE0 : 0xF0;
    text.insert(text.begin(), static_cast<char>(mark | value));
    return text;
}

std::size_t ShortestLength(std::uint32_t value) {
    return value < 0x80 ? 1 : value < 0x800 ? 2 : value < 0x10000 ? 3 : 4;
}

TEST(Utf8, TakesEveryCharacterInItsShortestFormOnly) {
    for (std::uint32_t value = 0; value < 0x110000; ++value) {
        const bool isSurrogate = value >= 0xD800 && value < 0xE000;
        for (std::size_t length = ShortestLength(value); length <= 4; ++length) {
            const bool isGood = !isSurrogate && length == ShortestLength(value);
            ASSERT_EQ(Utf8SequenceLength(Encode(value, static_cast<int>(length))),
                      isGood ? length : 0)
                << value;
        }
    }
}

TEST(Utf8, TakesNothingBeyondTheLastCharacter) {
    for (std::uint32_t value = 0x110000; value < 0x200000; value += 0x3FF) {
        EXPECT_EQ(Utf8SequenceLength(Encode(value, 4)), 0U);
    }
}

TEST(Utf8, TakesNoByteThatCannotBegin) {
    for (int lead = 0x80; lead < 0x100; ++lead) {
        EXPECT_EQ(Utf8SequenceLength(std::string(1, static_cast<char>(lead))), 0U) << lead;
    }
    EXPECT_EQ(Utf8SequenceLength("\xfd\x80\x80\x80\x80\x80"), 0U);
}

TEST(Utf8, TakesNoSequenceThatIsCutOrBroken) {
    for (const char* text : {"\xe2\x82",
                             "\xf0\x9f\x98",
                             "\xc3",
                             "\xe2\x28\xa1",
                             "\xf0\x9f\x28\x80",
                             "\xc3\xc3",
                             "\xe2\x82\xc3"}) {
        EXPECT_EQ(Utf8SequenceLength(text), 0U);
    }
}

TEST(Utf8, IsAskedOfAWholeText) {
    EXPECT_TRUE(IsUtf8(""));
    EXPECT_TRUE(IsUtf8("abc \u00e4\u20ac\U0001F600"));
    EXPECT_FALSE(IsUtf8("abc\x80"));
    EXPECT_FALSE(IsUtf8("\u20ac\xe2\x82"));
    EXPECT_TRUE(IsUtf8(std::string_view("a\0b", 3)));
}

}  // namespace
