#include "lasd/VersionComparison.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>

namespace {

struct Pair {
    std::string a;
    std::string b;
    int order;  ///< below, at or above 0
};

int Sign(std::weak_ordering order) {
    return order < 0 ? -1 : order > 0 ? 1 : 0;
}

std::vector<Pair> Pairs() {
    const std::string nines(400, '9');
    return {
        // Texts.
        {"", "", 0},
        {"", "0", -1},
        {"", "a", -1},
        {"a", "a", 0},
        {"a", "b", -1},
        {"a", "ab", -1},
        {"beta", "alpha", 1},
        // Letters of either case.
        {"A", "a", 0},
        {"1.0 BETA", "1.0 beta", 0},
        {"aB", "Ac", -1},
        {"Z", "a", 1},
        {"v1.2RC3", "V1.2rc3", 0},
        {"[", "{", -1},
        {"@", "`", -1},
        {"_", "A", -1},
        // Only ASCII has cases.
        {"\xC3\x84", "\xC3\xA4", -1},
        {"\xC3\xA4", "\xC3\xA4", 0},
        {"\xE2\x84\xAA", "k", 1},
        {"\xC4\xB0", "i", 1},
        // Numbers.
        {"1.10", "1.9", 1},
        {"1.9", "1.10", -1},
        {"1.01", "1.1", 0},
        {"1.1", "1.10", -1},
        {"01", "1", 0},
        {"00", "0", 0},
        {"000", "", 1},
        {"0", "1", -1},
        {"10", "9", 1},
        {"2", "10", -1},
        {"1.0", "1", 1},
        {"1.0", "1.00", 0},
        {"1.0", "1..0", 1},
        {"1.0.0", "1.0", 1},
        {"2.0", "10.0", -1},
        {"1-2", "1.2", -1},
        {"1 2", "1  2", 1},
        {"-1", "1", -1},
        {"1e3", "1000", -1},
        // Beyond every machine's numbers.
        {"18446744073709551616", "18446744073709551615", 1},
        {"4294967297", "1", 1},
        {nines, nines, 0},
        {nines, "0" + nines, 0},
        {"1" + std::string(400, '0'), nines, 1},
        {std::string(5000, '0') + "1", "1", 0},
        // Numbers beside texts.
        {"a10", "a9", 1},
        {"a010b", "A10B", 0},
        {"1a", "1b", -1},
        {"a1", "ab", -1},
        {"a.1", "a1", -1},
        {"1", ":", -1},
        {"9", ":", -1},
        {"12", "1a", 1},
        {"1x2y3", "1x02y003", 0},
        {"1x2y3", "1x2y", 1},
        {"\xD9\xA1", "1", 1},
        {"\t1", "1", -1},
    };
}

TEST(VersionComparison, OrdersAsPeopleRead) {
    EXPECT_GE(Pairs().size(), 40U);
    for (const auto& [a, b, order] : Pairs()) {
        EXPECT_EQ(Sign(CompareVersions(a, b)), order) << a << " and " << b;
    }
}

TEST(VersionComparison, IsTheSameFromBothSides) {
    for (const auto& [a, b, order] : Pairs()) {
        EXPECT_EQ(Sign(CompareVersions(b, a)), -order) << b << " and " << a;
        EXPECT_EQ(Sign(CompareVersions(a, a)), 0) << a;
    }
}

TEST(VersionComparison, IsConsistentAcrossAllTexts) {
    std::vector<std::string> texts;
    for (const auto& pair : Pairs()) {
        texts.insert(texts.end(), {pair.a, pair.b});
    }
    std::ranges::stable_sort(
        texts, [](const auto& a, const auto& b) { return CompareVersions(a, b) < 0; });
    for (std::size_t low = 0; low < texts.size(); ++low) {
        for (std::size_t high = low + 1; high < texts.size(); ++high) {
            EXPECT_TRUE(CompareVersions(texts[low], texts[high]) <= 0)
                << texts[low] << " and " << texts[high];
        }
    }
}

}  // namespace
