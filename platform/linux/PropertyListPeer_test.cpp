// Our property lists beside those of an independent library, which only the tests use.
#include <gtest/gtest.h>
#include <plist/plist.h>

#include <cstdint>
#include <cstdlib>
#include <limits>
#include <memory>
#include <string>
#include <vector>

#include "platform/PropertyList.h"

namespace platform {
namespace {

using namespace std::string_literals;
using namespace std::string_view_literals;

std::optional<PropertyList> Parse(std::string_view bytes) {
    return PropertyListCreateWithData(std::as_bytes(std::span(bytes)));
}

std::string Xml(std::string_view body) {
    return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
           "<!DOCTYPE plist PUBLIC \"-//Vendra//DTD PLIST 1.0//EN\" "
           "\"http://vendra.example/p.dtd\">\n"
           "<plist version=\"1.0\">" +
           std::string(body) + "</plist>\n";
}

/// Binary 1.0 by the peer; the node goes with it.
std::string BinaryOfNode(plist_t node) {
    char* bytes = nullptr;
    std::uint32_t length = 0;
    plist_to_bin(node, &bytes, &length);
    plist_free(node);
    const std::unique_ptr<char, decltype(&std::free)> holder(bytes, std::free);
    return {bytes, length};
}

/// The same as binary 1.0, by the peer.
std::string Binary(std::string_view body) {
    const std::string xml = Xml(body);
    plist_t node = nullptr;
    plist_from_xml(xml.data(), static_cast<std::uint32_t>(xml.size()), &node);
    return BinaryOfNode(node);
}

/// Binary 1.0 from objects as they stand, with offsets of 4 bytes.
std::string BinaryOf(const std::vector<std::string>& objects, char referenceSize = 1) {
    std::string bytes = "bplist00";
    std::string table;
    const auto append = [](std::string& to, std::uint64_t value, int size) {
        for (int shift = (size - 1) * 8; shift >= 0; shift -= 8) {
            to += static_cast<char>(value >> shift & 0xFF);
        }
    };
    for (const auto& object : objects) {
        append(table, bytes.size(), 4);
        bytes += object;
    }
    const auto tableOffset = bytes.size();
    bytes += table + std::string(6, '\0') + '\x04' + referenceSize;
    append(bytes, objects.size(), 8);
    append(bytes, 0, 8);
    append(bytes, tableOffset, 8);
    return bytes;
}

std::string Repeat(std::string_view text, std::size_t count) {
    std::string repeated;
    for (std::size_t i = 0; i < count; ++i) {
        repeated += text;
    }
    return repeated;
}

std::string Nested(std::size_t depth) {
    return Repeat("<array>", depth) + "<true/>" + Repeat("</array>", depth);
}

struct Kind {
    const char* name;
    std::string_view xml;
    PropertyList value;
};

std::vector<Kind> Kinds() {
    PropertyList::Data data{std::byte{0}, std::byte{0xFF}, std::byte{0x41}};
    PropertyList::Array array{PropertyList("a"), PropertyList(std::int64_t{2})};
    PropertyList::Dictionary dictionary{{"z", PropertyList(true)}, {"a", PropertyList(1.5)}};
    return {
        {"true", "<true/>", PropertyList(true)},
        {"false", "<false/>", PropertyList(false)},
        {"zero", "<integer>0</integer>", PropertyList(std::int64_t{0})},
        {"negative", "<integer>-5</integer>", PropertyList(std::int64_t{-5})},
        {"most",
         "<integer>9223372036854775807</integer>",
         PropertyList(std::numeric_limits<std::int64_t>::max())},
        {"least",
         "<integer>-9223372036854775808</integer>",
         PropertyList(std::numeric_limits<std::int64_t>::min())},
        {"real", "<real>1.5</real>", PropertyList(1.5)},
        {"date",
         "<date>2001-01-01T00:01:40Z</date>",
         PropertyList(PropertyList::Date{.seconds = 100})},
        {"text",
         "<string>a&lt;b \xc3\xa9 \xf0\x9f\x98\x80</string>",
         PropertyList("a<b \xc3\xa9 \xf0\x9f\x98\x80")},
        {"data", "<data>AP9B</data>", PropertyList(data)},
        {"array", "<array><string>a</string><integer>2</integer></array>", PropertyList(array)},
        {"dictionary",
         "<dict><key>z</key><true/><key>a</key><real>1.5</real></dict>",
         PropertyList(dictionary)},
        {"empty array", "<array/>", PropertyList(PropertyList::Array())},
        {"empty dictionary", "<dict/>", PropertyList()},
        {"empty data", "<data></data>", PropertyList(PropertyList::Data())},
    };
}

TEST(PropertyListPeer, ReadsEveryKindOfXml) {
    for (const auto& [name, xml, value] : Kinds()) {
        EXPECT_EQ(Parse(Xml(xml)), value) << name;
    }
}

TEST(PropertyListPeer, ReadsEveryKindOfBinary) {
    for (const auto& [name, xml, value] : Kinds()) {
        EXPECT_EQ(Parse(Binary(xml)), value) << name;
    }
}

TEST(PropertyListPeer, RefusesWhatIsNoPropertyList) {
    for (const auto bytes : {""sv,
                             "garbage"sv,
                             "<"sv,
                             "<plist>"sv,
                             "<html></html>"sv,
                             "bplist00"sv,
                             "bplist01"sv,
                             "\0\0\0\0\0\0\0\0"sv,
                             "\xff\xfe\x00"sv}) {
        EXPECT_EQ(Parse(bytes), std::nullopt) << bytes;
    }
    EXPECT_EQ(Parse(std::string(100'000, '\xff')), std::nullopt);
}

TEST(PropertyListPeer, ABinaryOneCutAnywhereIsNone) {
    const std::string whole =
        Binary("<dict><key>k</key><array><string>text</string><data>AAAA</data></array></dict>");
    ASSERT_NE(Parse(whole), std::nullopt);
    for (std::size_t length = 0; length < whole.size(); ++length) {
        EXPECT_EQ(Parse(whole.substr(0, length)), std::nullopt) << length;
    }
}

TEST(PropertyListPeer, AnXmlOneCutAnywhereIsNoneOrWhole) {
    const std::string whole =
        Xml("<dict><key>k</key><array><string>text</string><true/></array></dict>");
    const auto value = Parse(whole);
    ASSERT_NE(value, std::nullopt);
    for (std::size_t length = 0; length < whole.size(); ++length) {
        const auto cut = Parse(whole.substr(0, length));
        EXPECT_TRUE(cut == std::nullopt || cut == value) << length;
    }
}

TEST(PropertyListPeer, ABinaryOneWithAnyByteChangedDoesNoHarm) {
    const std::string whole =
        Binary("<dict><key>k</key><array><string>text</string><real>1</real></array></dict>");
    std::size_t refused = 0;
    for (std::size_t at = 0; at < whole.size(); ++at) {
        for (const int byte : {0x00, 0x0F, 0x7F, 0x80, 0xFF}) {
            std::string changed = whole;
            changed[at] = static_cast<char>(byte);
            refused += Parse(changed) == std::nullopt ? 1 : 0;
        }
    }
    EXPECT_GT(refused, whole.size());
}

TEST(PropertyListPeer, Takes64LevelsAndNot65) {
    for (const auto& write : {Xml, Binary}) {
        EXPECT_NE(Parse(write(Nested(64))), std::nullopt);
        EXPECT_EQ(Parse(write(Nested(65))), std::nullopt);
        EXPECT_EQ(Parse(write(Nested(300))), std::nullopt);
    }
}

TEST(PropertyListPeer, ADepthThatWouldExhaustTheStackIsRefused) {
    EXPECT_EQ(Parse(Xml(Nested(200'000))), std::nullopt);
    std::vector<std::string> chain;
    for (std::uint32_t next = 1; next <= 60'000; ++next) {
        chain.push_back("\xA1"s + static_cast<char>(next >> 8) + static_cast<char>(next));
    }
    chain.emplace_back("\x09");
    EXPECT_EQ(Parse(BinaryOf(chain, 2)), std::nullopt);
}

TEST(PropertyListPeer, Takes200000ObjectsAndNoMore) {
    const auto arrayOf = [](std::size_t count) {
        return "<array>" + Repeat("<true/>", count) + "</array>";
    };
    for (const auto& write : {Xml, Binary}) {
        EXPECT_NE(Parse(write(arrayOf(199'990))), std::nullopt);
        EXPECT_EQ(Parse(write(arrayOf(200'000))), std::nullopt);
    }
}

TEST(PropertyListPeer, SharedReferencesCountAtEachVisit) {
    std::vector<std::string> bomb;
    for (char next = 1; next <= 10; ++next) {
        bomb.push_back("\xAE"s + std::string(14, next));
    }
    bomb.emplace_back("\x09");
    ASSERT_LT(BinaryOf(bomb).size(), 300U);
    EXPECT_EQ(Parse(BinaryOf(bomb)), std::nullopt);
}

TEST(PropertyListPeer, ASharedLeafCountsAtEachVisit) {
    const std::string leaf = "\x4F\x12\x00\x10\x00\x00"s + std::string(1U << 20, 'x');
    const auto sharedBy = [&](char count) {
        return Parse(BinaryOf(
            {"\xAF\x10"s + count + std::string(static_cast<std::size_t>(count), '\1'), leaf}));
    };
    EXPECT_NE(sharedBy(60), std::nullopt);
    EXPECT_EQ(sharedBy(100), std::nullopt);
}

TEST(PropertyListPeer, AnObjectThatHoldsItselfIsRefused) {
    EXPECT_EQ(Parse(BinaryOf({"\xA1\x00"s})), std::nullopt);
    EXPECT_EQ(Parse(BinaryOf({"\xD1\x01\x00"s, "\x51k"s})), std::nullopt);
    EXPECT_EQ(Parse(BinaryOf({"\xA1\x01"s, "\xA1\x00"s})), std::nullopt);
}

TEST(PropertyListPeer, AReferenceToNowhereIsRefused) {
    EXPECT_EQ(Parse(BinaryOf({"\xA1\x05"s})), std::nullopt);
    EXPECT_EQ(Parse(BinaryOf({"\xA3\x01"s, "\x09"s})), std::nullopt);
    EXPECT_EQ(Parse(BinaryOf({"\x5F\x13\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFFx"s})), std::nullopt);
}

TEST(PropertyListPeer, AnIntegerOf128BitsIsRefusedUnlessItsUpperHalfIsEmpty) {
    EXPECT_EQ(Parse(BinaryOf({"\x14"s + std::string(7, '\0') + '\1' + std::string(8, '\0')})),
              std::nullopt);
    EXPECT_EQ(Parse(BinaryOf({"\x14"s + std::string(16, '\xff')})), std::nullopt);
    EXPECT_NE(Parse(BinaryOf({"\x14"s + std::string(15, '\0') + '\7'})), std::nullopt);
}

TEST(PropertyListPeer, AUidIsNoneOfOurKinds) {
    EXPECT_EQ(Parse(BinaryOf({"\x80\x01"s})), std::nullopt);
    EXPECT_EQ(Parse(BinaryOf({"\xA1\x01"s, "\x80\x01"s})), std::nullopt);
}

TEST(PropertyListPeer, AnInternalSubsetIsRefused) {
    const auto withSubset = [](std::string_view subset, std::string_view body) {
        return Parse("<!DOCTYPE plist [" + std::string(subset) + "]><plist>" + std::string(body) +
                     "</plist>");
    };
    EXPECT_EQ(withSubset("", "<true/>"), std::nullopt);
    EXPECT_EQ(withSubset("<!ENTITY a \"text\">", "<string>&a;</string>"), std::nullopt);
    EXPECT_EQ(withSubset("<!ENTITY a SYSTEM \"file:///etc/passwd\">", "<string>&a;</string>"),
              std::nullopt);
    EXPECT_EQ(withSubset("<!ENTITY a \"xxxx\"><!ENTITY b \"&a;&a;\"><!ENTITY c \"&b;&b;\">",
                         "<string>&c;</string>"),
              std::nullopt);
}

TEST(PropertyListPeer, AnEntityThatNobodyDeclaredIsRefused) {
    EXPECT_EQ(Parse(Xml("<string>&a;</string>")), std::nullopt);
    EXPECT_EQ(Parse(Xml("<string>&amp;&#65;&#x42;</string>")), PropertyList("&AB"));
}

TEST(PropertyListPeer, TextThatIsNotUtf8IsRefused) {
    for (const auto text :
         {"\xff"sv, "\xc3"sv, "\xc0\x80"sv, "\xed\xa0\x80"sv, "\xf5\x80\x80\x80"sv}) {
        EXPECT_EQ(Parse(Xml("<string>" + std::string(text) + "</string>")), std::nullopt);
        EXPECT_EQ(Parse(Xml("<dict><key>" + std::string(text) + "</key><true/></dict>")),
                  std::nullopt);
        EXPECT_EQ(Parse(BinaryOf({static_cast<char>(0x50 + text.size()) + std::string(text)})),
                  std::nullopt);
    }
}

TEST(PropertyListPeer, ReadsWhatWeWrite) {
    for (const auto& [name, xml, value] : Kinds()) {
        for (const auto& written :
             {PropertyListCreateXmlData(value), PropertyListCreateBinaryData(value)}) {
            ASSERT_TRUE(written.has_value()) << name;
            plist_t node = nullptr;
            plist_from_memory(reinterpret_cast<const char*>(written->data()),
                              static_cast<std::uint32_t>(written->size()),
                              &node);
            ASSERT_NE(node, nullptr) << name;
            EXPECT_EQ(Parse(BinaryOfNode(node)), value) << name;
        }
    }
}

}  // namespace
}  // namespace platform
