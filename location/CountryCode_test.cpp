#include "location/CountryCode.h"

#include "location/Location_test.h"

namespace {

class CountryCode : public LocationTest {
protected:
    /// The whole field of routine 19, which held something else before.
    static std::string field() {
        OutString<64> countryCode;
        countryCode.fill('?');
        EXPECT_EQ(server_LFMobileHelperCopyCountryCode(7, countryCode), 0);
        return {countryCode.begin(), countryCode.end()};
    }
};

TEST_F(CountryCode, IsTheConfiguredOne) {
    sim::SetCountryCode("DE");
    EXPECT_EQ(CopyConfiguredCountryCode(), "DE");
    EXPECT_TRUE(sim::SystemLogLines().empty());
}

TEST_F(CountryCode, IsEmptyWithALineWhenNoneIsConfigured) {
    sim::SetCountryCode(std::nullopt);
    EXPECT_EQ(CopyConfiguredCountryCode(), "");
    EXPECT_EQ(sim::SystemLogLines(),
              (std::vector<sim::SystemLogLine>{
                  {kError, "Didn't get valid country code from OrbService.\n"}}));
}

TEST_F(CountryCode, AnEmptyOneIsPresentAndHasNoLine) {
    sim::SetCountryCode("");
    EXPECT_EQ(CopyConfiguredCountryCode(), "");
    EXPECT_TRUE(sim::SystemLogLines().empty());
}

TEST_F(CountryCode, FillsTheReplysFieldWithZerosBehindIt) {
    sim::SetCountryCode("US");
    EXPECT_EQ(field(), "US" + std::string(62, '\0'));
    EXPECT_TRUE(sim::SystemLogLines().empty()) << "the routine writes no line of its own";
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

TEST_F(CountryCode, IsSixtyFourZerosWhenThereIsNone) {
    sim::SetCountryCode(std::nullopt);
    EXPECT_EQ(field(), std::string(64, '\0'));
}

TEST_F(CountryCode, Of63BytesKeepsItsTerminator) {
    sim::SetCountryCode(std::string(63, 'x'));
    EXPECT_EQ(field(), std::string(63, 'x') + '\0');
}

TEST_F(CountryCode, Of64BytesAndMoreFillsTheFieldWithoutATerminator) {
    sim::SetCountryCode(std::string(64, 'x'));
    EXPECT_EQ(field(), std::string(64, 'x'));
    sim::SetCountryCode(std::string(64, 'x') + "more");
    EXPECT_EQ(field(), std::string(64, 'x'));
}

TEST_F(CountryCode, IsAnsweredWithoutAnyQueue) {
    (void)field();
    EXPECT_EQ(sim::JournalCount("SerialQueue"), 0U);
    EXPECT_EQ(reports(), 0U);
}

}  // namespace
