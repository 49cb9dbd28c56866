#include "platform/PropertyList.h"

#include <gtest/gtest.h>

#include <type_traits>

namespace {

using platform::PropertyList;

TEST(PropertyList, IsAnEmptyDictionaryAtFirst) {
    const PropertyList list;
    ASSERT_NE(list.as<PropertyList::Dictionary>(), nullptr);
    EXPECT_TRUE(list.as<PropertyList::Dictionary>()->empty());
}

TEST(PropertyList, IsOneKindAndNoOther) {
    EXPECT_NE(PropertyList(true).as<bool>(), nullptr);
    EXPECT_EQ(PropertyList(true).as<std::int64_t>(), nullptr);
    EXPECT_EQ(PropertyList(std::int64_t{1}).as<bool>(), nullptr);
    EXPECT_EQ(PropertyList("true").as<bool>(), nullptr);
    EXPECT_EQ(PropertyList(1.0).as<std::int64_t>(), nullptr);
    EXPECT_EQ(PropertyList(PropertyList::Date{5}).as<std::int64_t>(), nullptr);
}

TEST(PropertyList, HoldsEveryKind) {
    EXPECT_EQ(*PropertyList("text").as<std::string>(), "text");
    EXPECT_EQ(*PropertyList(std::int64_t{-5}).as<std::int64_t>(), -5);
    EXPECT_EQ(*PropertyList(0.5).as<double>(), 0.5);
    EXPECT_EQ(PropertyList(PropertyList::Date{7}).as<PropertyList::Date>()->seconds, 7);
    EXPECT_EQ(PropertyList(PropertyList::Data(3)).as<PropertyList::Data>()->size(), 3U);
    EXPECT_EQ(PropertyList(PropertyList::Array(2)).as<PropertyList::Array>()->size(), 2U);
}

TEST(PropertyList, TakesNoValueOfAKindByConversion) {
    static_assert(!std::is_convertible_v<bool, PropertyList>);
    static_assert(!std::is_convertible_v<const char*, PropertyList>);
    EXPECT_NE(PropertyList("x").as<std::string>(), nullptr);
    const char* const text = "x";
    EXPECT_EQ(PropertyList(text).as<bool>(), nullptr);
}

TEST(PropertyList, FindsTheValueOfAKey) {
    const PropertyList list(
        PropertyList::Dictionary{{"a", PropertyList("1")}, {"b", PropertyList("2")}});
    ASSERT_NE(list.find("b"), nullptr);
    EXPECT_EQ(*list.find("b"), PropertyList("2"));
    EXPECT_EQ(list.find("c"), nullptr);
    EXPECT_EQ(list.find(""), nullptr);
}

TEST(PropertyList, HasTheLastOfEqualKeysCount) {
    const PropertyList list(
        PropertyList::Dictionary{{"a", PropertyList("1")}, {"a", PropertyList("2")}});
    EXPECT_EQ(*list.find("a"), PropertyList("2"));
}

TEST(PropertyList, FindsNothingInWhatIsNoDictionary) {
    EXPECT_EQ(PropertyList("a").find("a"), nullptr);
    EXPECT_EQ(PropertyList(PropertyList::Array{PropertyList("a")}).find("a"), nullptr);
}

TEST(PropertyList, IsEqualByKindOrderAndValue) {
    const PropertyList one(
        PropertyList::Dictionary{{"a", PropertyList("1")}, {"b", PropertyList("2")}});
    const PropertyList other(
        PropertyList::Dictionary{{"b", PropertyList("2")}, {"a", PropertyList("1")}});
    EXPECT_EQ(one, PropertyList(one));
    EXPECT_NE(one, other);
    EXPECT_NE(PropertyList(true), PropertyList(std::int64_t{1}));
}

}  // namespace
