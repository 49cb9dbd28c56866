#include "platform/linux/MailboxRecords.h"

#include <gtest/gtest.h>

namespace {

using platform::MailboxRecords;
using platform::MailboxRecordsOf;
using platform::PropertyList;
using platform::PropertyListOf;

std::optional<MailboxRecords> Parse(std::string_view dictionary) {
    const std::string text = "<plist>" + std::string(dictionary) + "</plist>";
    const auto list = platform::PropertyListCreateWithData(std::as_bytes(std::span(text)));
    return MailboxRecordsOf(list.value());
}

TEST(MailboxRecords, ComeBackFromTheirFormAsAFile) {
    const std::string control = "\x01\x7F\xEF\xBF\xBE control";
    const MailboxRecords records{
        .token = "<&> \r\n\t ü",
        .records = {{"", ""}, {"key", control}, {control, "token"}, {std::string(256, '&'), "x"}}};
    const auto file = platform::PropertyListCreateXmlData(PropertyListOf(records));
    ASSERT_TRUE(file.has_value());
    const auto list = platform::PropertyListCreateWithData(*file);
    ASSERT_TRUE(list.has_value());
    EXPECT_EQ(MailboxRecordsOf(*list), records);
}

TEST(MailboxRecords, AreAnEmptyDictionaryWhenThereAreNone) {
    EXPECT_EQ(PropertyListOf({}), PropertyList());
    EXPECT_EQ(MailboxRecordsOf(PropertyList()), MailboxRecords());
}

TEST(MailboxRecords, AreReadableWhereTheyCanBe) {
    EXPECT_EQ(PropertyListOf({.token = "t", .records = {{"k", "\x01"}}}),
              PropertyList(PropertyList::Dictionary{
                  {"Token", PropertyList("t")},
                  {"Records",
                   PropertyList(PropertyList::Array{PropertyList(PropertyList::Dictionary{
                       {"Key", PropertyList("k")},
                       {"Token", PropertyList(PropertyList::Data{std::byte{1}})}})})}}));
}

TEST(MailboxRecords, AreFoundByTheirKey) {
    MailboxRecords records{.records = {{"a", "one"}, {"", "empty"}, {"a", "later"}}};
    EXPECT_EQ(*records.find("a"), "one");
    EXPECT_EQ(*records.find(""), "empty");
    EXPECT_EQ(records.find("b"), nullptr);
    *records.find("a") = "changed";
    EXPECT_EQ(records.records.front().token, "changed");
}

TEST(MailboxRecords, AreOnlyWhatWeWrite) {
    for (const char* other : {
             "<string>token</string>",
             "<array/>",
             "<dict><key>Token</key><true/></dict>",
             "<dict><key>Token</key><dict/></dict>",
             "<dict><key>Records</key><dict/></dict>",
             "<dict><key>Records</key><array><string>x</string></array></dict>",
             "<dict><key>Records</key><array><dict/></array></dict>",
             "<dict><key>Records</key><array><dict><key>Key</key><string>k</string></dict>"
             "</array></dict>",
             "<dict><key>Records</key><array><dict><key>Key</key><integer>1</integer>"
             "<key>Token</key><string>t</string></dict></array></dict>",
         }) {
        EXPECT_EQ(Parse(other), std::nullopt) << other;
    }
    EXPECT_EQ(Parse("<dict><key>Other</key><true/></dict>"), MailboxRecords());
}

}  // namespace
