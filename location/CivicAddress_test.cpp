#include "location/CivicAddress.h"

#include <cmath>
#include <limits>

#include "location/Location_test.h"

using platform::LogLevel;
using platform::ORBAddress;
using platform::ORBError;
using platform::ORBMapItem;
using platform::ORBMapItems;
using platform::ORBStructuredAddress;

namespace {

constexpr std::string_view kNoItems =
    "_RequestCivicInfoFromLatitudeLongitude didn't get any mapItems\n";
constexpr std::string_view kNullItem = "_RequestCivicInfoLatitudeLongitude NULL mapItem \n";
constexpr std::string_view kNoStructuredAddress =
    "_RequestCivicInfoLatitudeLongitude mapItem didn't get a structured address";

const ORBStructuredAddress kWestminster{.countryCode = "GB",
                                        .administrativeArea = "England",
                                        .locality = "London",
                                        .postCode = "SW1A 0AA"};

class CivicAddress : public LocationTest {
protected:
    /// Lets the services answer so after a delay, and asks.
    static void ask(ORBMapItems items, double delay = 0) {
        sim::AnswerReverseGeocode({.delay = delay, .items = std::move(items)});
        requestCivicAddress();
        sim::RunFor(delay);
    }
};

TEST_F(CivicAddress, IsReportedAsTheServicesTellIt) {
    ask(sim::MapItemsOf(kWestminster));
    EXPECT_EQ(report(), (Texts{"GB", "England", "London", "SW1A 0AA"}));
    EXPECT_EQ(sim::TelephonyReports()[0].time, 0.0);
    const std::string from = "_RequestCivicInfoFromLatitudeLongitude ";
    EXPECT_EQ(sim::SystemLogLines(),
              (std::vector<sim::SystemLogLine>{
                  {kError, "server_LFMobileHelperRequestCountryCodeFromLocation \n"},
                  {kNotice, from + "mapItems: (1)"},
                  {kNotice, from + "country code: GB"},
                  {kNotice, from + "state: England"},
                  {kNotice, from + "city: London"},
                  {kNotice, from + "postal code: SW1A 0AA"},
                  {kNotice, "sendCivicInfoToHV sent civic info to Linefold successfully"}}));
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

TEST_F(CivicAddress, IsLookedUpWithShiftedLocationsAndWithoutETA) {
    requestCivicAddress(51.5, -0.125);
    sim::Settle();
    EXPECT_EQ(sim::JournalCount("ORBMapService.ticketForReverseGeocodeCoordinate 51.5 -0.125 "
                                "shiftLocationsIfNeeded"),
              1U);
    EXPECT_EQ(sim::JournalCount("ORBReverseGeocodeTicket.submit ORB callback queue"), 1U);
}

TEST_F(CivicAddress, IsNotLookedUpOnTheRequestsThread) {
    requestCivicAddress();
    EXPECT_EQ(sim::JournalCount("ORBMapService"), 0U);
    EXPECT_EQ(sim::JournalCount("HVServerConnection"), 0U);
}

TEST_F(CivicAddress, ArmsItsTimeOutBeforeItSubmits) {
    requestCivicAddress();
    sim::Settle();
    EXPECT_TRUE(sim::JournalHasInOrder({"ORBMapService.ticket",
                                        "SerialQueue.after location time-outs",
                                        "ORBReverseGeocodeTicket"}));
}

TEST_F(CivicAddress, LacksWhatTheServicesDoNotTell) {
    ask(sim::MapItemsOf({.countryCode = "GB", .postCode = "SW1A 0AA"}));
    EXPECT_EQ(report(), (Texts{"GB", "", "", "SW1A 0AA"}));
    EXPECT_EQ(logged(kNotice, "_RequestCivicInfoFromLatitudeLongitude state: "), 0U);
}

TEST_F(CivicAddress, LogsAFieldThatIsThereAndEmpty) {
    ask(sim::MapItemsOf({.countryCode = "GB", .locality = ""}));
    EXPECT_EQ(logged(kNotice, "_RequestCivicInfoFromLatitudeLongitude city: "), 1U);
}

TEST_F(CivicAddress, FallsBackToTheConfiguredCountry) {
    ask(sim::MapItemsOf({.administrativeArea = "England"}));
    EXPECT_EQ(report(), (Texts{"US", "England", "", ""}));
}

TEST_F(CivicAddress, FallsBackWhenTheCountryIsThereAndEmpty) {
    ask(sim::MapItemsOf({.countryCode = "", .locality = "London"}));
    EXPECT_EQ(report(), (Texts{"US", "", "London", ""}));
}

TEST_F(CivicAddress, MayHaveNoCountryAtAll) {
    sim::SetCountryCode(std::nullopt);
    ask(sim::MapItemsOf({.locality = "London"}));
    EXPECT_EQ(report(), (Texts{"", "", "London", ""}));
    EXPECT_EQ(logged(kError, "Didn't get valid country code from OrbService.\n"), 1U);
}

TEST_F(CivicAddress, IsThatOfTheFirstItemAlone) {
    auto items = sim::MapItemsOf(kWestminster);
    items.push_back(ORBMapItem{
        .orbAddress = ORBAddress{.structuredAddress = ORBStructuredAddress{.countryCode = "FR"}}});
    ask(items);
    EXPECT_EQ(report(), (Texts{"GB", "England", "London", "SW1A 0AA"}));
    EXPECT_EQ(logged(kNotice, "_RequestCivicInfoFromLatitudeLongitude mapItems: (2)"), 1U);
}

TEST_F(CivicAddress, SecondItemDoesNotMakeUpForABadFirstOne) {
    auto items = sim::MapItemsOf(kWestminster);
    items.insert(items.begin(), ORBMapItem{.isValid = false});
    ask(items);
    EXPECT_EQ(report(), (Texts{"US", "", "", ""}));
    EXPECT_EQ(logged(kError, kNullItem), 1U);
    EXPECT_EQ(logged(kNotice, "_RequestCivicInfoFromLatitudeLongitude mapItems: (2)"), 1U);
}

TEST_F(CivicAddress, AnAbsentItemIsReportedWithTheConfiguredCountry) {
    ask({std::nullopt});
    EXPECT_EQ(report(), (Texts{"US", "", "", ""}));
    EXPECT_EQ(logged(kError, kNullItem), 1U);
}

TEST_F(CivicAddress, AnItemWithoutAnAddressIsReportedWithTheConfiguredCountry) {
    ask({ORBMapItem{}});
    EXPECT_EQ(report(), (Texts{"US", "", "", ""}));
    EXPECT_EQ(logged(kError, kNoStructuredAddress), 1U);
}

TEST_F(CivicAddress, AnAddressWithoutAStructureIsReportedWithTheConfiguredCountry) {
    ask({ORBMapItem{.orbAddress = ORBAddress{}}});
    EXPECT_EQ(report(), (Texts{"US", "", "", ""}));
    EXPECT_EQ(logged(kError, kNoStructuredAddress), 1U);
}

TEST_F(CivicAddress, NoItemsAreReportedWithTheConfiguredCountry) {
    ask({});
    EXPECT_EQ(report(), (Texts{"US", "", "", ""}));
    EXPECT_EQ(logged(kError, kNoItems), 1U);
    EXPECT_EQ(logged(kNotice, "_RequestCivicInfoFromLatitudeLongitude mapItems: (0)"), 0U);
}

TEST_F(CivicAddress, NeitherItemsNorAnErrorIsReportedWithTheConfiguredCountry) {
    sim::AnswerReverseGeocode({});
    requestCivicAddress();
    sim::Settle();
    EXPECT_EQ(report(), (Texts{"US", "", "", ""}));
    EXPECT_EQ(logged(kError, kNoItems), 1U);
}

TEST_F(CivicAddress, AnErrorIsReportedAndHasBothLines) {
    sim::AnswerReverseGeocode(
        {.items = sim::MapItemsOf(kWestminster), .error = ORBError{"no way"}});
    requestCivicAddress();
    sim::Settle();
    EXPECT_EQ(report(), (Texts{"US", "", "", ""})) << "items beside an error do not count";
    EXPECT_EQ(
        sim::SystemLogLines()[1],
        (sim::SystemLogLine{kError, "_RequestCivicInfoFromLatitudeLongitude error: (no way)"}));
    EXPECT_EQ(sim::SystemLogLines()[2], (sim::SystemLogLine{kError, std::string(kNoItems)}));
}

TEST_F(CivicAddress, OfZeroCoordinatesIsTheConfiguredCountryAtOnce) {
    for (const double latitude : {0.0, -0.0}) {
        requestCivicAddress(latitude, -latitude);
    }
    sim::Settle();
    ASSERT_EQ(reports(), 2U);
    EXPECT_EQ(sim::TelephonyReports()[0].texts, (Texts{"US", "", "", ""}));
    EXPECT_EQ(sim::TelephonyReports()[1].texts, (Texts{"US", "", "", ""}));
    EXPECT_EQ(sim::JournalCount("ORBMapService"), 0U);
    EXPECT_EQ(sim::JournalCount("SerialQueue.after"), 0U);
}

TEST_F(CivicAddress, OfZeroCoordinatesLeavesTheFlagAlone) {
    LocationWaitFlagSet();
    requestCivicAddress(0, 0);
    sim::RunFor(10);
    EXPECT_EQ(reports(), 1U);
    EXPECT_TRUE(LocationWaitFlagTake());
}

TEST_F(CivicAddress, OfZeroCoordinatesIsReportedFromTheQueueOfTheTimeOuts) {
    bool isOnTimeOutQueue = false;
    sim::SetTelephony({.onReport = [&] { isOnTimeOutQueue = LocationTimeOutQueue().isCurrent(); }});
    requestCivicAddress(0, 0);
    sim::Settle();
    EXPECT_TRUE(isOnTimeOutQueue);
}

TEST_F(CivicAddress, OfOneZeroOrANaNIsLookedUp) {
    requestCivicAddress(0, 10);
    requestCivicAddress(10, 0);
    requestCivicAddress(std::numeric_limits<double>::quiet_NaN(), 0);
    requestCivicAddress(0, std::numeric_limits<double>::quiet_NaN());
    sim::Settle();
    EXPECT_EQ(sim::JournalCount("ORBReverseGeocodeTicket.submit"), 4U);
}

TEST_F(CivicAddress, IsReportedFromTheQueueOfTheLookUps) {
    bool isOnLookupQueue = false;
    sim::SetTelephony({.onReport = [&] { isOnLookupQueue = LocationLookupQueue().isCurrent(); }});
    ask(sim::MapItemsOf(kWestminster));
    EXPECT_TRUE(isOnLookupQueue);
}

TEST_F(CivicAddress, AfterALittleLessThanFiveSecondsIsStillReported) {
    ask(sim::MapItemsOf(kWestminster), 4.99);
    EXPECT_EQ(report(), (Texts{"GB", "England", "London", "SW1A 0AA"}));
    sim::RunFor(10);
    EXPECT_EQ(reports(), 1U) << "the time-out finds the flag idle, and says nothing";
    EXPECT_EQ(logged(kError, kCivicWasNotWaiting), 0U);
}

TEST_F(CivicAddress, AfterALittleMoreThanFiveSecondsIsDropped) {
    ask(sim::MapItemsOf(kWestminster), 5.01);
    EXPECT_EQ(report(), (Texts{"US", "", "", ""})) << "the time-out has reported";
    EXPECT_EQ(sim::TelephonyReports()[0].time, 5.0);
    EXPECT_EQ(logged(kError, kCivicWasNotWaiting), 1U);
    EXPECT_EQ(logged(kNotice, "_RequestCivicInfoFromLatitudeLongitude mapItems: (1)"), 0U);
}

TEST_F(CivicAddress, TimeOutReportsFromItsOwnQueue) {
    bool isOnTimeOutQueue = false;
    sim::SetTelephony({.onReport = [&] { isOnTimeOutQueue = LocationTimeOutQueue().isCurrent(); }});
    sim::AnswerReverseGeocode({.isNever = true});
    requestCivicAddress();
    sim::RunFor(5);
    EXPECT_TRUE(isOnTimeOutQueue);
    EXPECT_EQ(report(), (Texts{"US", "", "", ""}));
}

TEST_F(CivicAddress, WithoutATicketIsReportedByTheTimeOut) {
    sim::FailCall("ORBMapService.ticketForReverseGeocodeCoordinate", 1);
    requestCivicAddress();
    sim::RunFor(4.99);
    EXPECT_EQ(reports(), 0U);
    sim::RunFor(0.02);
    EXPECT_EQ(report(), (Texts{"US", "", "", ""}));
    EXPECT_EQ(sim::JournalCount("ORBReverseGeocodeTicket.submit"), 0U);
}

TEST_F(CivicAddress, AnOldTimeOutCompletesANewerLookUpEarly) {
    sim::AnswerReverseGeocode({.delay = 1, .items = sim::MapItemsOf(kWestminster)});
    requestCivicAddress();
    sim::RunFor(3);
    EXPECT_EQ(reports(), 1U);
    sim::AnswerReverseGeocode({.delay = 4, .items = sim::MapItemsOf(kWestminster)});
    requestCivicAddress();
    sim::RunFor(20);
    ASSERT_EQ(reports(), 2U);
    EXPECT_EQ(sim::TelephonyReports()[1].time, 5.0) << "two seconds after the second request";
    EXPECT_EQ(sim::TelephonyReports()[1].texts, (Texts{"US", "", "", ""}));
    EXPECT_EQ(logged(kError, kCivicWasNotWaiting), 1U);
}

TEST_F(CivicAddress, OfTwoLookUpsAtOnceOneIsReported) {
    sim::AnswerReverseGeocode({.delay = 1, .items = sim::MapItemsOf(kWestminster)});
    requestCivicAddress();
    requestCivicAddress(48.9, 2.4);
    sim::RunFor(20);
    EXPECT_EQ(reports(), 1U);
    EXPECT_EQ(logged(kError, kCivicWasNotWaiting), 1U);
}

TEST_F(CivicAddress, EscapesWhatAServerPutsIntoTheLog) {
    ask(sim::MapItemsOf({.countryCode = "GB", .locality = "Lon\ndon"}));
    EXPECT_EQ(logged(kNotice, "_RequestCivicInfoFromLatitudeLongitude city: Lon\\x0adon"), 1U);
}

}  // namespace
