#include "handlers/carrier/CString.h"

#include <gtest/gtest.h>

#include <array>
#include <cstdlib>
#include <string>

namespace {

int blocksOut = 0;

void* CountedAllocate(std::size_t size) {
    ++blocksOut;
    return std::malloc(size);
}

void CountedFree(void* block) {
    --blocksOut;
    std::free(block);
}

void* NoMemory(std::size_t /*size*/) {
    return nullptr;
}

constexpr CStringAllocator kCounted{.allocate = CountedAllocate, .deallocate = CountedFree};
constexpr CStringAllocator kEmpty{.allocate = NoMemory, .deallocate = CountedFree};

class CString : public testing::Test {
protected:
    CString() { blocksOut = 0; }

    ~CString() override {
        if (result != nullptr && result != buffer.data()) {
            kCounted.deallocate(result);
        }
        EXPECT_EQ(blocksOut, 0);
    }

    char* make(std::string_view text, StringEncoding encoding = StringEncoding::kUtf8) {
        result = _CFStringGetOrCreateCString(kCounted, text, buffer.data(), &length, encoding);
        return result;
    }

    std::array<char, 8> buffer{'?', '?', '?', '?', '?', '?', '?', '?'};
    std::size_t length = buffer.size();
    char* result = nullptr;
};

TEST_F(CString, UsesTheBufferOfTheCallerWhenTheTextFits) {
    EXPECT_EQ(make("mobile"), buffer.data());
    EXPECT_STREQ(result, "mobile");
    EXPECT_EQ(length, 6U);
    EXPECT_EQ(blocksOut, 0);
}

TEST_F(CString, FitsWithExactlyOneByteForTheNul) {
    EXPECT_EQ(make("1234567"), buffer.data());
    EXPECT_EQ(length, 7U);
}

TEST_F(CString, AllocatesWhenTheNulHasNoPlace) {
    EXPECT_NE(make("12345678"), buffer.data());
    EXPECT_STREQ(result, "12345678");
    EXPECT_EQ(length, 8U);
    EXPECT_EQ(blocksOut, 1);
}

TEST_F(CString, HasAnEmptyTextFitOneByte) {
    length = 1;
    EXPECT_EQ(make(""), buffer.data());
    EXPECT_EQ(buffer[0], '\0');
    EXPECT_EQ(buffer[1], '?');
    EXPECT_EQ(length, 0U);
}

TEST_F(CString, AllocatesForABufferOfNoSize) {
    length = 0;
    EXPECT_NE(make("a"), buffer.data());
    EXPECT_STREQ(result, "a");
    EXPECT_EQ(buffer[0], '?');
}

TEST_F(CString, NeedsNeitherBufferNorLength) {
    result = _CFStringGetOrCreateCString(
        kCounted, "/var/mobile", nullptr, nullptr, StringEncoding::kUtf8);
    EXPECT_STREQ(result, "/var/mobile");
    length = 99;
    char* const second =
        _CFStringGetOrCreateCString(kCounted, "/var", nullptr, &length, StringEncoding::kUtf8);
    EXPECT_STREQ(second, "/var");
    EXPECT_EQ(length, 4U);
    kCounted.deallocate(second);
}

TEST_F(CString, IgnoresABufferWithoutASize) {
    result =
        _CFStringGetOrCreateCString(kCounted, "a", buffer.data(), nullptr, StringEncoding::kUtf8);
    EXPECT_NE(result, buffer.data());
    EXPECT_STREQ(result, "a");
}

TEST_F(CString, CountsBytesAndNotCharacters) {
    EXPECT_EQ(make("\u00e4\u00f6\u00fc"), buffer.data());
    EXPECT_EQ(length, 6U);
    EXPECT_STREQ(result, "\u00e4\u00f6\u00fc");
}

TEST_F(CString, EndsWhereTheEncodingEnds) {
    EXPECT_NE(make("ab\u00e4c", StringEncoding::kAscii), buffer.data());
    EXPECT_STREQ(result, "ab");
    EXPECT_EQ(length, 2U);
}

TEST_F(CString, EndsWhereTheTextIsNotUtf8) {
    EXPECT_NE(make("ab\xff"
                   "c"),
              buffer.data());
    EXPECT_STREQ(result, "ab");
}

TEST_F(CString, EmptiesTheBufferWithoutMemory) {
    result = _CFStringGetOrCreateCString(
        kEmpty, "far too long", buffer.data(), &length, StringEncoding::kUtf8);
    EXPECT_EQ(result, buffer.data());
    EXPECT_STREQ(result, "");
    EXPECT_EQ(length, 0U);
}

TEST_F(CString, GivesNothingWithNeitherMemoryNorBuffer) {
    EXPECT_EQ(_CFStringGetOrCreateCString(kEmpty, "text", nullptr, &length, StringEncoding::kUtf8),
              nullptr);
    EXPECT_EQ(length, 0U);
}

TEST(DefaultCStringAllocator, GivesAndTakesMemory) {
    char* const text = _CFStringGetOrCreateCString(
        kDefaultCStringAllocator, "text", nullptr, nullptr, StringEncoding::kUtf8);
    ASSERT_NE(text, nullptr);
    EXPECT_STREQ(text, "text");
    kDefaultCStringAllocator.deallocate(text);
}

}  // namespace
