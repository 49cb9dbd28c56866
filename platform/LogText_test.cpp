#include "platform/LogText.h"

#include <gtest/gtest.h>

#include "platform/Log.h"
#include "platform/SystemLog.h"
#include "platform/sim/Sim.h"

namespace {

std::string Format(const char* format, ...) __attribute__((format(printf, 1, 2)));

std::string Format(const char* format, ...) {
    std::va_list arguments;
    va_start(arguments, format);
    auto text = platform::FormatLogText(format, arguments);
    va_end(arguments);
    return text;
}

TEST(LogText, LetsTheFormatItselfGoOutAsItStands) {
    EXPECT_EQ(Format("Removing domain: %s\n", "x"), "Removing domain: x\n");
    EXPECT_EQ(Format("100%%\t"), "100%\t");
}

TEST(LogText, PrintsNumbersOfEachSize) {
    EXPECT_EQ(Format("%d %i %u %x", -1, 2, 3U, 255U), "-1 2 3 ff");
    EXPECT_EQ(Format("%ld %lu %llx", -1L, 5000000000UL, 0x123456789ABCULL),
              "-1 5000000000 123456789abc");
    EXPECT_EQ(Format("%zu", std::size_t{7}), "7");
}

TEST(LogText, PrintsALetterThatFollowsAConversion) {
    EXPECT_EQ(Format("VM_ALLOCATE %ul (mhs1)\n", 310U), "VM_ALLOCATE 310l (mhs1)\n");
}

TEST(LogText, PrintsPointersCharactersAndWidths) {
    EXPECT_EQ(Format("%p", reinterpret_cast<void*>(std::uintptr_t{0x10})), "0x10");
    EXPECT_EQ(Format("%c", 'x'), "x");
    EXPECT_EQ(Format("[%5d] [%-4d] [%04x]", 42, 7, 0xABU), "[   42] [7   ] [00ab]");
}

TEST(LogText, EscapesWhatCouldForgeALine) {
    EXPECT_EQ(Format("%s", "a\nb\rc\td"), "a\\x0ab\\x0dc\\x09d");
    EXPECT_EQ(Format("%s", "\x1b[31m\x7f"), "\\x1b[31m\\x7f");
    EXPECT_EQ(Format("%c", '\n'), "\\x0a");
}

TEST(LogText, EscapesEveryControlByteAndNoOther) {
    for (int byte = 1; byte < 0x80; ++byte) {
        const std::string text(1, static_cast<char>(byte));
        const bool isControl = byte < 0x20 || byte == 0x7F;
        EXPECT_EQ(platform::EscapeLogArgument(text).size(), isControl ? 4U : 1U) << byte;
    }
    EXPECT_EQ(platform::EscapeLogArgument(std::string_view("\0", 1)), "\\x00");
}

TEST(LogText, KeepsUtf8AndEscapesWhatIsNone) {
    EXPECT_EQ(Format("%s", "\u00e4\u20ac\U0001F600"), "\u00e4\u20ac\U0001F600");
    EXPECT_EQ(Format("%s",
                     "a\xff"
                     "b\xc3"),
              "a\\xffb\\xc3");
    EXPECT_EQ(Format("%s", "\xc0\xaf\xed\xa0\x80"), "\\xc0\\xaf\\xed\\xa0\\x80");
}

TEST(LogText, HasAnArgumentCarryPercentSignsUnharmed) {
    EXPECT_EQ(Format("%s|%d", "%s%n%d", 5), "%s%n%d|5");
}

TEST(LogText, NamesAMissingText) {
    const char* volatile nothing = nullptr;
    EXPECT_EQ(Format("%s", nothing), "(null)");
}

TEST(LogText, IsWhatBothLogsWrite) {
    sim::Reset();
    platform::Log(platform::LogLevel::kInfo, "a %s %d", "b\n", 3);
    platform::SystemLog(platform::SystemLogPriority::kError, "c %s\n", "\x01");
    const std::vector<sim::LogLine> unified{{platform::LogLevel::kInfo, "a b\\x0a 3"}};
    const std::vector<sim::SystemLogLine> system{
        {platform::SystemLogPriority::kError, "c \\x01\n"}};
    EXPECT_EQ(sim::UnifiedLog(), unified);
    EXPECT_EQ(sim::SystemLogLines(), system);
}

}  // namespace
