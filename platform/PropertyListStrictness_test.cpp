// What is no property list, however much it looks like one.
#include <gtest/gtest.h>

#include <bit>
#include <limits>
#include <string>

#include "platform/PropertyList.h"

namespace {

using platform::PropertyList;

std::optional<PropertyList> Parse(std::string_view text) {
    return platform::PropertyListCreateWithData(std::as_bytes(std::span(text)));
}

std::optional<PropertyList> ParseInside(const std::string& element) {
    return Parse("<plist version=\"1.0\">" + element + "</plist>");
}

/// A binary property list from its objects; the first one is the root.
std::string Binary(const std::vector<std::string>& objects) {
    std::string text = "bplist00";
    std::string offsets;
    for (const auto& object : objects) {
        offsets += {static_cast<char>(text.size() >> 8), static_cast<char>(text.size())};
        text += object;
    }
    const auto number = [](std::size_t value) {
        std::string bytes(8, '\0');
        for (std::size_t i = 0; i < 8; ++i) {
            bytes[7 - i] = static_cast<char>(value >> (8 * i));
        }
        return bytes;
    };
    return text + offsets + std::string(6, '\0') + "\x02\x01" + number(objects.size()) + number(0) +
           number(text.size());
}

std::string Bytes(std::initializer_list<int> values) {
    std::string bytes;
    for (const int value : values) {
        bytes += static_cast<char>(value);
    }
    return bytes;
}

void ExpectRefused(const std::vector<std::string>& elements) {
    for (const auto& element : elements) {
        EXPECT_FALSE(ParseInside(element)) << element;
    }
}

TEST(XmlPropertyList, TakesNumbersAsWholes) {
    ExpectRefused({"<integer>12abc</integer>",
                   "<integer></integer>",
                   "<integer/>",
                   "<integer> </integer>",
                   "<integer>1 2</integer>",
                   "<integer>1.0</integer>",
                   "<integer>-</integer>",
                   "<integer>--1</integer>",
                   "<integer>0x</integer>",
                   "<integer>0xg</integer>",
                   "<integer>9223372036854775808</integer>",
                   "<integer>-9223372036854775809</integer>",
                   "<integer>18446744073709551616</integer>",
                   "<integer>1e3</integer>"});
    ExpectRefused({"<real>abc</real>",
                   "<real>1,5</real>",
                   "<real></real>",
                   "<real/>",
                   "<real>1.5x</real>",
                   "<real>0x1p3</real>",
                   "<real>1e999</real>",
                   "<real>nan(1)</real>",
                   "<real>-</real>",
                   "<real>" + std::string(2000, '1') + "</real>"});
}

TEST(XmlPropertyList, TakesNumbersInTheirUsualForms) {
    EXPECT_EQ(ParseInside("<integer> +012 </integer>"), PropertyList(std::int64_t{12}));
    EXPECT_EQ(ParseInside("<integer>0x1F</integer>"), PropertyList(std::int64_t{31}));
    EXPECT_EQ(ParseInside("<integer>-9223372036854775808</integer>"),
              PropertyList(std::numeric_limits<std::int64_t>::min()));
    EXPECT_EQ(ParseInside("<real>.5</real>"), PropertyList(0.5));
    EXPECT_EQ(ParseInside("<real>-1E2</real>"), PropertyList(-100.0));
    EXPECT_EQ(ParseInside("<real>-Infinity</real>"),
              PropertyList(-std::numeric_limits<double>::infinity()));
}

TEST(XmlPropertyList, TakesOnlyDatesOfTheCalendar) {
    ExpectRefused({"<date>yesterday</date>",
                   "<date>2001-13-01T00:00:00Z</date>",
                   "<date></date>",
                   "<date>2001-02-29T00:00:00Z</date>",
                   "<date>2001-00-01T00:00:00Z</date>",
                   "<date>2001-01-00T00:00:00Z</date>",
                   "<date>2001-01-01T24:00:00Z</date>",
                   "<date>2001-01-01T00:60:00Z</date>",
                   "<date>2001-01-01T00:00:60Z</date>",
                   "<date>2001-01-01T00:00:00</date>",
                   "<date>2001-01-01 00:00:00Z</date>",
                   "<date>0000-01-01T00:00:00Z</date>",
                   "<date>2001-1-1T00:00:00Z</date>",
                   "<date>+001-01-01T00:00:00Z</date>"});
    EXPECT_EQ(ParseInside("<date>2000-02-29T23:59:59Z</date>"),
              PropertyList(PropertyList::Date{-26'438'401}));
    EXPECT_EQ(ParseInside("<date>4001-01-01T00:00:00Z</date>"),
              PropertyList(PropertyList::Date{63'113'904'000}));
}

TEST(XmlPropertyList, TakesOnlyWholeBase64) {
    ExpectRefused({"<data>Y</data>",
                   "<data>YQ</data>",
                   "<data>YQ=</data>",
                   "<data>YQ===</data>",
                   "<data>=</data>",
                   "<data>====</data>",
                   "<data>YR==</data>",
                   "<data>YWJ=YWJj</data>",
                   "<data>Y*==</data>",
                   "<data>YQ==YQ==</data>"});
    EXPECT_EQ(ParseInside("<data>\n\tY Q\n= =\n</data>"),
              PropertyList(PropertyList::Data{std::byte{'a'}}));
}

TEST(XmlPropertyList, TakesNoDictionaryWithHolesInIt) {
    ExpectRefused({"<dict><key>a</key></dict>",
                   "<dict><true/></dict>",
                   "<dict><key>a</key><key>b</key></dict>",
                   "<dict><key>a</key><true/><false/></dict>",
                   "<dict>text</dict>",
                   "<array>text</array>",
                   "<dict><key>a</key>text<true/></dict>",
                   "<array><key>a</key></array>"});
}

TEST(XmlPropertyList, HasOneRootInsideOnePlist) {
    for (const char* text : {"",
                             " ",
                             "<plist/>",
                             "<plist></plist>",
                             "<dict/>",
                             "<true/>",
                             "text",
                             "<plist><true/><true/></plist>",
                             "<plist><true/>text</plist>",
                             "<plist>text</plist>",
                             "<plist><true/></plist>text",
                             "<plist><true/></plist><plist><true/></plist>",
                             "text<plist><true/></plist>",
                             "<plist><true/>",
                             "<plist><true/></plist",
                             "<html/>"}) {
        EXPECT_FALSE(Parse(text)) << text;
    }
    EXPECT_EQ(Parse("\xEF\xBB\xBF<?xml version=\"1.0\"?>\n<!-- a --><!DOCTYPE plist PUBLIC "
                    "\"-//X\" \">\">\n"
                    "<plist version='1.0'><!-- b --><true></true><?pi?></plist>\n<!-- c -->\n"),
              PropertyList(true));
}

TEST(XmlPropertyList, KnowsItsElementsAndNoOthers) {
    ExpectRefused({"<null/>",
                   "<Dict/>",
                   "<uid>1</uid>",
                   "<true a=\"b\"/>",
                   "<true>x</true>",
                   "< true/>",
                   "<string>a</integer>",
                   "<string>a",
                   "<string>a<true/></string>",
                   "</true>",
                   "<string><",
                   "<set/>",
                   "<>",
                   "</>",
                   "<true",
                   "<true/ >",
                   "<string>a</string a=\"b\">"});
}

TEST(XmlPropertyList, HasNoInternalSubsetAndNoForeignEntities) {
    for (const char* text :
         {"<!DOCTYPE plist [<!ENTITY a \"b\">]><plist><string>&a;</string></plist>",
          "<!DOCTYPE plist []><plist><true/></plist>",
          "<!DOCTYPE a><!DOCTYPE b><plist><true/></plist>",
          "<plist><!DOCTYPE a><true/></plist>"}) {
        EXPECT_FALSE(Parse(text)) << text;
    }
    ExpectRefused({"<string>&unknown;</string>",
                   "<string>&amp</string>",
                   "<string>&#;</string>",
                   "<string>&#x;</string>",
                   "<string>&#0;</string>",
                   "<string>&#x110000;</string>",
                   "<string>&#xD800;</string>",
                   "<string>&#1;</string>",
                   "<string>&#12a;</string>",
                   "<string>&#xFFFF;</string>",
                   "<string>&#99999999999999999999;</string>"});
}

TEST(XmlPropertyList, UnderstandsTheWaysToSpellAText) {
    EXPECT_EQ(
        ParseInside(
            "<string>a&lt;&gt;&amp;&quot;&apos;&#65;&#x1F4F1;<![CDATA[<&>]]><!-- no -->z</string>"),
        PropertyList("a<>&\"'A\xF0\x9F\x93\xB1<&>z"));
    EXPECT_EQ(ParseInside("<string/>"), PropertyList(""));
    EXPECT_EQ(ParseInside("<string\n></string >"), PropertyList(""));
}

TEST(XmlPropertyList, IsUtf8AndSaysSo) {
    ExpectRefused({std::string("<string>a\0b</string>", 20),
                   "<string>\x01</string>",
                   "<string>\xFF</string>",
                   "<string>\xED\xA0\x80</string>",
                   "<!-- \x01 --><true/>"});
    EXPECT_FALSE(Parse(std::string("\0", 1) + "<plist><true/></plist>"));
    EXPECT_FALSE(Parse(std::string("<plist><true/></plist>\0", 23)));
    EXPECT_FALSE(Parse("<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?><plist><true/></plist>"));
    EXPECT_FALSE(Parse("\xFE\xFF<plist><true/></plist>"));
    EXPECT_TRUE(Parse("<?xml version='1.0' encoding='utf-8'?><plist><true/></plist>"));
}

TEST(XmlPropertyList, HasTheLastOfEqualKeysCount) {
    const auto list =
        ParseInside("<dict><key>a</key><true/><key>b</key><true/><key>a</key><false/></dict>");
    EXPECT_EQ(list,
              PropertyList(
                  PropertyList::Dictionary{{"a", PropertyList(false)}, {"b", PropertyList(true)}}));
}

TEST(BinaryPropertyList, HasTheLastOfEqualKeysCount) {
    const auto list = Parse(Binary({Bytes({0xD2, 1, 2, 3, 4}),
                                    "\x51"
                                    "a",
                                    "\x51"
                                    "a",
                                    "\x08",
                                    "\x09"}));
    EXPECT_EQ(list, PropertyList(PropertyList::Dictionary{{"a", PropertyList(true)}}));
}

TEST(BinaryPropertyList, TellsObjectsApartThatOverlap) {
    // The last byte of the data's count is also the marker of a text of one character, so that both
    // have their contents at one place.
    const auto list = Parse(
        Binary({Bytes({0xA2, 1, 2}), Bytes({0x4F, 0x11, 0x04}), "\x51" + std::string(0x451, 'x')}));
    const PropertyList::Data data(0x451, std::byte{'x'});
    ASSERT_TRUE(list.has_value());
    EXPECT_EQ(*list, PropertyList(PropertyList::Array{PropertyList(data), PropertyList("x")}));
}

TEST(BinaryPropertyList, TakesIntegersOfSixtyFourBits) {
    const std::string zeros(8, '\0');
    const std::string largest = Bytes({0x7F, 255, 255, 255, 255, 255, 255, 255});
    const std::string tooLarge = Bytes({0x80, 0, 0, 0, 0, 0, 0, 0});
    EXPECT_EQ(Parse(Binary({"\x14" + zeros + largest})),
              PropertyList(std::numeric_limits<std::int64_t>::max()));
    EXPECT_FALSE(Parse(Binary({"\x14" + zeros + tooLarge})));
    EXPECT_FALSE(Parse(Binary({"\x14" + Bytes({0, 0, 0, 0, 0, 0, 0, 1}) + zeros})));
    EXPECT_EQ(Parse(Binary({"\x13" + tooLarge})),
              PropertyList(std::numeric_limits<std::int64_t>::min()));
    EXPECT_FALSE(Parse(Binary({"\x15" + std::string(32, '\0')})));
}

TEST(BinaryPropertyList, KnowsItsObjectsAndNoOthers) {
    for (const std::string& object : {Bytes({0x00}),
                                      Bytes({0x0F}),
                                      Bytes({0x80, 1}),
                                      Bytes({0xC0}),
                                      Bytes({0xB0}),
                                      Bytes({0x70}),
                                      Bytes({0xE0}),
                                      Bytes({0xF0}),
                                      Bytes({0x21, 0, 0}),
                                      Bytes({0x32, 0, 0, 0, 0})}) {
        EXPECT_FALSE(Parse(Binary({object})))
            << static_cast<int>(static_cast<unsigned char>(object[0]));
    }
    EXPECT_EQ(Parse(Binary({Bytes({0x22, 0x3F, 0x80, 0, 0})})), PropertyList(1.0));
}

TEST(BinaryPropertyList, TakesOnlyDatesOfTheCalendar) {
    const auto date = [](double seconds) {
        std::string bytes = "\x33";
        const auto bits = std::bit_cast<std::uint64_t>(seconds);
        for (int shift = 56; shift >= 0; shift -= 8) {
            bytes += static_cast<char>(bits >> shift);
        }
        return Parse(Binary({bytes}));
    };
    EXPECT_EQ(date(-0.5), PropertyList(PropertyList::Date{-1}));
    EXPECT_FALSE(date(std::numeric_limits<double>::quiet_NaN()));
    EXPECT_FALSE(date(std::numeric_limits<double>::infinity()));
    EXPECT_FALSE(date(252'423'993'600.0));
    EXPECT_FALSE(date(-63'113'904'001.0));
}

TEST(BinaryPropertyList, HoldsOnlyTextsThatXmlCanHold) {
    EXPECT_EQ(Parse(Binary({Bytes({0x62, 0xD8, 0x3D, 0xDC, 0xF1})})),
              PropertyList("\xF0\x9F\x93\xB1"));
    for (const std::string& object : {Bytes({0x51, 0}),
                                      Bytes({0x51, 1}),
                                      Bytes({0x51, 0xFF}),
                                      Bytes({0x61, 0xD8, 0x3D}),
                                      Bytes({0x61, 0, 0}),
                                      Bytes({0x61, 0xDC, 0xF1}),
                                      Bytes({0x61, 0xFF, 0xFF}),
                                      Bytes({0x62, 0xD8, 0x3D, 0, 0x41})}) {
        EXPECT_FALSE(Parse(Binary({object})));
    }
}

TEST(BinaryPropertyList, StaysInsideItsBytes) {
    EXPECT_FALSE(Parse("bplist00"));
    EXPECT_FALSE(Parse("bplist01" + Binary({"\x09"}).substr(8)));
    EXPECT_FALSE(Parse(Binary({})));
    EXPECT_FALSE(Parse(Binary({Bytes({0x4F})})));
    EXPECT_FALSE(Parse(Binary({Bytes({0x4F, 0x13, 255, 255, 255, 255, 255, 255, 255, 255})})));
    EXPECT_FALSE(Parse(Binary({Bytes({0x6F, 0x13, 128, 0, 0, 0, 0, 0, 0, 1})})));
    EXPECT_FALSE(Parse(Binary({Bytes({0xDF, 0x13, 128, 0, 0, 0, 0, 0, 0, 0})})));
    EXPECT_FALSE(Parse(Binary({Bytes({0xA1, 0})}))) << "an array inside itself";
    EXPECT_FALSE(Parse(Binary({Bytes({0xA1, 1})}))) << "no such object";
    EXPECT_FALSE(Parse(Binary({Bytes({0xD1, 1, 1}), Bytes({0x09})}))) << "a key that is no text";
    EXPECT_TRUE(Parse(Binary({Bytes({0x09})})));
}

TEST(BinaryPropertyList, GrowsOnlySoFarBySharing) {
    std::string leaf = Bytes({0x4F, 0x12, 0, 0x10, 0, 0}) + std::string(1U << 20, 'x');
    std::string references(64, '\x01');
    // The leaf lies last, so that offsets of two bytes reach it.
    EXPECT_TRUE(Parse(Binary({Bytes({0xAF, 0x10, 64}) + references, leaf})));
    EXPECT_FALSE(Parse(Binary({Bytes({0xAF, 0x10, 65}) + references + "\x01", leaf})));
    std::vector<std::string> laughs;
    for (int level = 0; level < 30; ++level) {
        laughs.push_back(Bytes({0xA2, level + 1, level + 1}));
    }
    laughs.push_back("\x09");
    EXPECT_FALSE(Parse(Binary(laughs)));
}

}  // namespace
