// What is written is read back as it was, in both forms.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <limits>
#include <random>

#include "platform/PropertyList.h"

namespace {

using platform::PropertyList;
using platform::PropertyListCreateBinaryData;
using platform::PropertyListCreateWithData;
using platform::PropertyListCreateXmlData;
using Dictionary = PropertyList::Dictionary;
using Array = PropertyList::Array;

constexpr std::int64_t kSmallest = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kLargest = std::numeric_limits<std::int64_t>::max();

std::string XmlOf(const PropertyList& value) {
    const auto data = PropertyListCreateXmlData(value);
    return data ? std::string(reinterpret_cast<const char*>(data->data()), data->size()) : "";
}

void ExpectRoundTrip(const PropertyList& value) {
    const auto xml = PropertyListCreateXmlData(value);
    const auto binary = PropertyListCreateBinaryData(value);
    ASSERT_TRUE(xml && binary);
    EXPECT_EQ(PropertyListCreateWithData(*xml), value) << XmlOf(value);
    EXPECT_EQ(PropertyListCreateWithData(*binary), value) << XmlOf(value);
}

void ExpectNotWritten(const PropertyList& value) {
    EXPECT_FALSE(PropertyListCreateXmlData(value));
    EXPECT_FALSE(PropertyListCreateBinaryData(value));
}

PropertyList Nested(std::size_t containers, PropertyList inside) {
    for (std::size_t i = 0; i < containers; ++i) {
        inside = i % 2 == 0 ? PropertyList(Array{inside}) : PropertyList(Dictionary{{"k", inside}});
    }
    return inside;
}

TEST(PropertyListRoundTrip, KeepsScalars) {
    for (const std::int64_t value : {kSmallest,
                                     kSmallest + 1,
                                     std::int64_t{-1},
                                     std::int64_t{0},
                                     std::int64_t{255},
                                     std::int64_t{256},
                                     std::int64_t{65'536},
                                     std::int64_t{1} << 32,
                                     kLargest}) {
        ExpectRoundTrip(PropertyList(value));
    }
    ExpectRoundTrip(PropertyList(true));
    ExpectRoundTrip(PropertyList(false));
}

TEST(PropertyListRoundTrip, KeepsRealsToTheLastBit) {
    std::mt19937_64 random(7);
    for (int i = 0; i < 20'000; ++i) {
        const std::uint64_t bits = random();
        double value = 0;
        std::memcpy(&value, &bits, sizeof value);
        if (!std::isnan(value)) {
            ExpectRoundTrip(PropertyList(value));
        }
    }
}

TEST(PropertyListRoundTrip, KeepsUnusualReals) {
    using Limits = std::numeric_limits<double>;
    for (const double value : {0.1,
                               1e21,
                               Limits::denorm_min(),
                               Limits::min(),
                               Limits::max(),
                               Limits::lowest(),
                               Limits::infinity(),
                               -Limits::infinity()}) {
        ExpectRoundTrip(PropertyList(value));
    }
    const auto zero = PropertyListCreateWithData(*PropertyListCreateXmlData(PropertyList(-0.0)));
    EXPECT_TRUE(std::signbit(*zero->as<double>()));
    for (const auto& data : {PropertyListCreateXmlData(PropertyList(Limits::quiet_NaN())),
                             PropertyListCreateBinaryData(PropertyList(Limits::quiet_NaN()))}) {
        EXPECT_TRUE(std::isnan(*PropertyListCreateWithData(*data)->as<double>()));
    }
}

TEST(PropertyListRoundTrip, KeepsDatesOfTheWholeCalendar) {
    for (const std::int64_t seconds : {std::int64_t{-63'113'904'000},
                                       std::int64_t{-1},
                                       std::int64_t{0},
                                       std::int64_t{86'399},
                                       std::int64_t{1} << 31,
                                       std::int64_t{252'423'993'599}}) {
        ExpectRoundTrip(PropertyList(PropertyList::Date{seconds}));
    }
    EXPECT_NE(XmlOf(PropertyList(PropertyList::Date{-63'113'904'000})).find("0001-01-01T00:00:00Z"),
              std::string::npos);
    EXPECT_NE(XmlOf(PropertyList(PropertyList::Date{252'423'993'599})).find("9999-12-31T23:59:59Z"),
              std::string::npos);
}

TEST(PropertyListRoundTrip, WritesNoDateOutsideTheCalendar) {
    ExpectNotWritten(PropertyList(PropertyList::Date{-63'113'904'001}));
    ExpectNotWritten(PropertyList(PropertyList::Date{252'423'993'600}));
}

TEST(PropertyListRoundTrip, KeepsTexts) {
    for (const char* text : {"",
                             " ",
                             " a ",
                             "<dict/>&amp;]]>\"'",
                             "line\nline\r\nline\rtab\t",
                             "Grüße",
                             "\xF0\x9F\x93\xB1",
                             "\xEF\xBF\xBD",
                             "\xED\x9F\xBF\xEE\x80\x80",
                             "0123456789abcdef"}) {
        ExpectRoundTrip(PropertyList(text));
        ExpectRoundTrip(PropertyList(Dictionary{{text, PropertyList(text)}}));
    }
}

TEST(PropertyListRoundTrip, WritesNoTextThatXmlCannotHold) {
    for (const std::string& text : {std::string("\0", 1),
                                    std::string("a\x01"),
                                    std::string("\x1F"),
                                    std::string("\xFF"),
                                    std::string("\xC0\x80"),
                                    std::string("\xED\xA0\x80"),
                                    std::string("\xEF\xBF\xBE"),
                                    std::string("\xEF\xBF\xBF")}) {
        ExpectNotWritten(PropertyList(text));
        ExpectNotWritten(PropertyList(Dictionary{{text, PropertyList(true)}}));
    }
}

TEST(PropertyListRoundTrip, KeepsDataOfEveryLength) {
    for (std::size_t size = 0; size < 300; ++size) {
        PropertyList::Data data(size);
        for (std::size_t i = 0; i < size; ++i) {
            data[i] = static_cast<std::byte>(i * 7 + size);
        }
        ExpectRoundTrip(PropertyList(data));
    }
}

TEST(PropertyListRoundTrip, KeepsContainersAndTheOrderOfKeys) {
    ExpectRoundTrip(PropertyList());
    ExpectRoundTrip(PropertyList(Array()));
    Dictionary entries;
    for (int i = 0; i < 300; ++i) {
        entries.emplace_back(std::to_string(i * 7919 % 300),
                             PropertyList(Array{PropertyList(), PropertyList(Array())}));
    }
    ExpectRoundTrip(PropertyList(entries));
}

TEST(PropertyListRoundTrip, KeepsSixtyFourContainersInsideOneAnother) {
    ExpectRoundTrip(Nested(64, PropertyList("leaf")));
    ExpectNotWritten(Nested(65, PropertyList("leaf")));
}

TEST(PropertyListRoundTrip, WritesAsManyObjectsAsAreRead) {
    ExpectRoundTrip(PropertyList(Array(199'999, PropertyList(true))));
    ExpectNotWritten(PropertyList(Array(200'000, PropertyList(true))));
}

TEST(PropertyListRoundTrip, WritesAsManyBytesAsAreRead) {
    const std::size_t room = 16U << 20;
    const std::size_t around = XmlOf(PropertyList("")).size();
    const auto text = [](std::size_t size) { return PropertyList(std::string(size, 'x')); };
    EXPECT_TRUE(PropertyListCreateXmlData(text(room - around)));
    EXPECT_FALSE(PropertyListCreateXmlData(text(room - around + 1)));
    ExpectRoundTrip(text(room - around));
    EXPECT_FALSE(PropertyListCreateBinaryData(text(room)));
}

TEST(PropertyListRoundTrip, WritesXmlThatPeopleCanRead) {
    const PropertyList list(
        Dictionary{{"A&B", PropertyList(Array{PropertyList(std::int64_t{-1}), PropertyList(0.5)})},
                   {"D", PropertyList(PropertyList::Data{std::byte{'a'}})}});
    EXPECT_EQ(XmlOf(list),
              "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>\n"
              "\t<key>A&amp;B</key>\n\t<array>\n\t\t<integer>-1</integer>\n\t\t<real>0.5</"
              "real>\n\t</array>\n"
              "\t<key>D</key>\n\t<data>YQ==</data>\n</dict>\n</plist>\n");
}

}  // namespace
