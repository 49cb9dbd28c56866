#include "lasd/DatabaseVersions.h"

#include "lasd/Updater_test.h"
#include "platform/Preferences.h"

using namespace updater_test;

namespace {

constexpr std::uint32_t kAllTypes = 31;
constexpr const char* kUrl = "https://example/gsm.gz";

PropertyList Versions(Dictionary entries) {
    return PropertyList(std::move(entries));
}

PropertyList WithVersion(PropertyList version) {
    return PropertyList(Dictionary{{"Version", std::move(version)}});
}

class DatabaseVersionsTest : public testing::Test {
protected:
    DatabaseVersionsTest() { sim::Reset(); }

    /// Reads all of a record that another process has written.
    void readInstalled(Dictionary record) {
        Record(std::move(record));
        (void)platform::PreferencesSynchronize(kDomain);
        versions.readInstalled(kDomain, kAllTypes);
        sim::ClearLogs();
    }

    /// Compares gsm, installed and offered, and gives the one line of it.
    sim::LogLine compare(PropertyList installed, PropertyList offered, bool isUpToDate) {
        readInstalled({{"gsm", std::move(installed)}});
        const PropertyList index = Versions({{"gsm", std::move(offered)}});
        EXPECT_EQ(versions.isUpToDate(&index, DatabaseType::kGsm), isUpToDate);
        EXPECT_EQ(sim::UnifiedLog().size(), 1U);
        return sim::UnifiedLog().at(0);
    }

    DatabaseVersions versions;
};

TEST(DatabaseTypes, HaveOneBitAndOneNameEach) {
    const std::vector<std::pair<std::int32_t, std::string>> names{
        {1, "umts"}, {2, "cdma"}, {4, "lte"}, {8, "gsm"}, {16, "scdma"}};
    for (const auto& [value, name] : names) {
        EXPECT_EQ(DatabaseTypeName(DatabaseType{value}), name);
        EXPECT_TRUE(IsKnownDatabaseType(DatabaseType{value}));
    }
    for (const std::int32_t other : {0, 3, 5, 31, 32, 64, -1, INT32_MIN, INT32_MAX}) {
        EXPECT_EQ(DatabaseTypeName(DatabaseType{other}), std::string("unknown")) << other;
        EXPECT_FALSE(IsKnownDatabaseType(DatabaseType{other})) << other;
    }
}

TEST(DatabaseTypes, AreTakenInTheirOrderWithGsmFirst) {
    Words order;
    for (const DatabaseType type : kDatabaseTypes) {
        order.emplace_back(DatabaseTypeName(type));
    }
    EXPECT_EQ(order, (Words{"gsm", "umts", "cdma", "lte", "scdma"}));
}

TEST_F(DatabaseVersionsTest, ReadsWhatIsRecordedOfTheTypesInTheMask) {
    Record({{"gsm", Entry("1", kUrl)}, {"lte", Entry("2", kUrl)}, {"cdma", Entry("3", kUrl)}});
    versions.readInstalled(kDomain, 0x0D);
    EXPECT_EQ(*versions.find(DatabaseType::kGsm), Entry("1", kUrl));
    EXPECT_EQ(*versions.find(DatabaseType::kLte), Entry("2", kUrl));
    EXPECT_EQ(*versions.find(DatabaseType::kUmts), std::nullopt);
    EXPECT_EQ(versions.find(DatabaseType::kCdma), nullptr);
    EXPECT_EQ(sim::JournalCount("PreferencesCopyValue com.vendra.lasd"), 3U);
}

TEST_F(DatabaseVersionsTest, ReadsNothingForAMaskWithoutKnownBits) {
    Record({{"gsm", Entry("1", kUrl)}});
    versions.readInstalled(kDomain, 0xFFFFFFE0);
    EXPECT_EQ(sim::JournalCount("PreferencesCopyValue"), 0U);
    EXPECT_EQ(versions.find(DatabaseType::kGsm), nullptr);
    EXPECT_EQ(versions.takeNewer(Versions({{"gsm", Entry("2", kUrl)}}), 0xFFFFFFE0), 0U);
}

TEST_F(DatabaseVersionsTest, CountsARecordThatIsNoDictionaryAsNone) {
    readInstalled({{"gsm", Entry("1", kUrl)}});
    ASSERT_NE(*versions.find(DatabaseType::kGsm), std::nullopt);
    const PropertyList date(PropertyList::Date{});
    for (const auto& value : {PropertyList("1"),
                              PropertyList(PropertyList::Array{Entry("1", kUrl)}),
                              PropertyList(true),
                              PropertyList(std::int64_t{1}),
                              PropertyList(1.0),
                              PropertyList(PropertyList::Data()),
                              date}) {
        readInstalled({{"gsm", value}});
        EXPECT_EQ(*versions.find(DatabaseType::kGsm), std::nullopt);
    }
}

TEST_F(DatabaseVersionsTest, FindsNothingUpToDateWithoutAnIndex) {
    EXPECT_FALSE(versions.isUpToDate(nullptr, DatabaseType::kGsm));
    EXPECT_TRUE(sim::UnifiedLog().empty());
    EXPECT_EQ(versions.find(DatabaseType::kGsm), nullptr);
}

TEST_F(DatabaseVersionsTest, SaysOfATypeThatTheIndexLacksThatItIsNotPresentLocally) {
    readInstalled({{"lte", Entry("1", kUrl)}});
    for (const auto& index : {Versions({}),
                              Versions({{"gsm", Entry("2", kUrl)}, {"LTE", Entry("2", kUrl)}}),
                              Versions({{"lte", PropertyList("2")}}),
                              PropertyList("no dictionary")}) {
        sim::ClearLogs();
        EXPECT_FALSE(versions.isUpToDate(&index, DatabaseType::kLte));
        EXPECT_EQ(sim::UnifiedLog(),
                  std::vector{Info("lte db is not present locally, update required")});
    }
}

TEST_F(DatabaseVersionsTest, SaysThatNothingWasDownloadedBefore) {
    const PropertyList index = Versions({{"umts", Entry("7.0", kUrl)}});
    EXPECT_FALSE(versions.isUpToDate(&index, DatabaseType::kUmts));
    EXPECT_EQ(sim::UnifiedLog(),
              std::vector{Info("We have don't have a previously downloaded umts database, server "
                               "has 7.0, update required")});
    EXPECT_EQ(*versions.find(DatabaseType::kUmts), std::nullopt) << "an empty entry is made";
}

TEST_F(DatabaseVersionsTest, CountsARecordWithoutAVersionAsNotDownloaded) {
    const auto line = Info(
        "We have don't have a previously downloaded gsm database, server has 2, update required");
    EXPECT_EQ(compare(PropertyList(), Entry("2", kUrl), false), line);
    EXPECT_EQ(compare(WithVersion(PropertyList(std::int64_t{2})), Entry("2", kUrl), false), line);
    EXPECT_EQ(compare(WithVersion(PropertyList(true)), Entry("2", kUrl), false), line);
}

TEST_F(DatabaseVersionsTest, SaysNothingOfAServerVersionThatIsNone) {
    EXPECT_EQ(compare(PropertyList(), PropertyList(), false),
              Info("We have don't have a previously downloaded gsm database, server has , update "
                   "required"));
    EXPECT_EQ(compare(Entry("1", kUrl), PropertyList(), false),
              Info("We have gsm version 1, server has , update required"));
    EXPECT_EQ(compare(Entry("1", kUrl), WithVersion(PropertyList(1.0)), false),
              Info("We have gsm version 1, server has , update required"));
}

TEST_F(DatabaseVersionsTest, AreUpToDateWhenTheyReadTheSame) {
    EXPECT_EQ(compare(Entry("2", kUrl), Entry("2", kUrl), true),
              Info("gsm version 2 matches server version"));
    EXPECT_EQ(compare(Entry("1.0 beta", kUrl), Entry("1.00 BETA", kUrl), true),
              Info("gsm version 1.00 BETA matches server version"));
    EXPECT_EQ(compare(Entry("", kUrl), Entry("", kUrl), true),
              Info("gsm version  matches server version"));
}

TEST_F(DatabaseVersionsTest, AreOutOfDateWheneverTheyDiffer) {
    EXPECT_EQ(compare(Entry("1.10", kUrl), Entry("1.9", kUrl), false),
              Info("We have gsm version 1.10, server has 1.9, update required"));
    EXPECT_EQ(compare(Entry("2", kUrl), Entry("", kUrl), false),
              Info("We have gsm version 2, server has , update required"));
    EXPECT_EQ(compare(Entry("1.0", kUrl), Entry("1.0 ", kUrl), false),
              Info("We have gsm version 1.0, server has 1.0 , update required"));
}

TEST_F(DatabaseVersionsTest, CannotForgeALogLine) {
    EXPECT_EQ(compare(Entry("1", kUrl), Entry("2\n3", kUrl), false),
              Info("We have gsm version 1, server has 2\\x0a3, update required"));
}

TEST_F(DatabaseVersionsTest, TakesWholeEntriesOfWhatIsNewer) {
    readInstalled({{"gsm", Entry("1", kUrl)}, {"lte", Entry("1", kUrl)}});
    const PropertyList newer(
        Dictionary{{"Notes", PropertyList(PropertyList::Array{})}, {"Version", PropertyList("2")}});
    const auto index = Versions({{"lte", Entry("1", "other")}, {"gsm", newer}});
    EXPECT_EQ(versions.takeNewer(index, kAllTypes), 8U);
    EXPECT_EQ(*versions.find(DatabaseType::kGsm), newer);
    EXPECT_EQ(*versions.find(DatabaseType::kLte), Entry("1", kUrl)) << "as it was installed";
}

TEST_F(DatabaseVersionsTest, ComparesInAscendingOrderOfTheBits) {
    readInstalled({});
    EXPECT_EQ(versions.takeNewer(Versions({}), kAllTypes), 0U);
    const std::vector expected{Info("umts db is not present locally, update required"),
                               Info("cdma db is not present locally, update required"),
                               Info("lte db is not present locally, update required"),
                               Info("gsm db is not present locally, update required"),
                               Info("scdma db is not present locally, update required")};
    EXPECT_EQ(sim::UnifiedLog(), expected);
}

TEST_F(DatabaseVersionsTest, LeaveEntriesOfEarlierChecksOutOfThisOne) {
    readInstalled({});
    const auto index = Versions({{"gsm", Entry("2", kUrl)}, {"lte", Entry("2", kUrl)}});
    EXPECT_EQ(versions.takeNewer(index, 4), 4U);
    EXPECT_EQ(*versions.find(DatabaseType::kGsm), std::nullopt);
    EXPECT_EQ(sim::UnifiedLog().size(), 1U) << "only lte was looked at";
}

}  // namespace
