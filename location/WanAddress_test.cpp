#include "location/WanAddress.h"

#include "location/Location_test.h"

using platform::LogLevel;
using platform::ORBError;
using platform::OrbIpLookupResult;

namespace {

class WanAddress : public LocationTest {
protected:
    static void ask(sim::IpAnswer answer) {
        sim::AnswerIpLookup(answer);
        requestWanIp();
        sim::RunFor(answer.delay);
    }

    static sim::IpAnswer address(double delay = 0) {
        return {.delay = delay, .result = OrbIpLookupResult{.ipAddress = "203.0.113.7"}};
    }
};

TEST_F(WanAddress, IsReportedAsTheServicesTellIt) {
    ask(address());
    EXPECT_EQ(report(), (Texts{"203.0.113.7"}));
    EXPECT_EQ(sim::UnifiedLog(),
              (std::vector<sim::LogLine>{
                  {LogLevel::kDebug, "server_LFMobileHelperRequestWanIPFromLocation"},
                  {LogLevel::kDefault, "_RequestWanIPFromLocation WAN IP: 203.0.113.7"},
                  {LogLevel::kDefault, "sendWanIPToHV sent WAN IP to Linefold successfully"}}));
    EXPECT_TRUE(sim::SystemLogLines().empty());
}

TEST_F(WanAddress, IsThisDevicesOwnAndLookedUpOnTheQueue) {
    requestWanIp();
    EXPECT_EQ(sim::JournalCount("ORBMapService"), 0U) << "not on the request's thread";
    sim::Settle();
    EXPECT_TRUE(sim::JournalHasInOrder({"ORBMapService.ticketForOrbIpLookupForIpAddr (own)",
                                        "SerialQueue.after location time-outs",
                                        "OrbIpLookupTicket.submit ORB callback queue"}));
}

TEST_F(WanAddress, IsReportedFromTheQueueOfTheLookUps) {
    bool isOnLookupQueue = false;
    sim::SetTelephony({.onReport = [&] { isOnLookupQueue = LocationLookupQueue().isCurrent(); }});
    ask(address());
    EXPECT_TRUE(isOnLookupQueue);
}

TEST_F(WanAddress, IsEmptyAfterAnErrorAlsoWhenItWasKnownBefore) {
    ask(address());
    ask({.error = ORBError{"unreachable"}});
    ASSERT_EQ(reports(), 2U);
    EXPECT_EQ(sim::TelephonyReports()[1].texts, (Texts{""}));
    EXPECT_EQ(logged(LogLevel::kError, "_RequestWanIPFromLocation error: (unreachable)"), 1U);
}

TEST_F(WanAddress, IsEmptyWithNeitherAResultNorAnError) {
    ask({});
    EXPECT_EQ(report(), (Texts{""}));
    EXPECT_EQ(logged(LogLevel::kDefault, "_RequestWanIPFromLocation WAN IP: "), 1U);
}

TEST_F(WanAddress, IsEmptyWithAResultThatHasNone) {
    ask({.result = OrbIpLookupResult{}});
    EXPECT_EQ(report(), (Texts{""}));
}

TEST_F(WanAddress, AfterALittleLessThanFiveSecondsIsStillReported) {
    ask(address(4.99));
    EXPECT_EQ(report(), (Texts{"203.0.113.7"}));
    sim::RunFor(10);
    EXPECT_EQ(reports(), 1U);
}

TEST_F(WanAddress, AfterALittleMoreThanFiveSecondsIsDropped) {
    ask(address(5.01));
    EXPECT_EQ(report(), (Texts{""})) << "the time-out has reported";
    EXPECT_EQ(sim::TelephonyReports()[0].time, 5.0);
    EXPECT_EQ(logged(LogLevel::kDefault, kWanIpWasNotWaiting), 1U);
}

TEST_F(WanAddress, WithoutATicketIsReportedByTheTimeOut) {
    bool isOnTimeOutQueue = false;
    sim::SetTelephony({.onReport = [&] { isOnTimeOutQueue = LocationTimeOutQueue().isCurrent(); }});
    sim::FailCall("ORBMapService.ticketForOrbIpLookupForIpAddr", 1);
    requestWanIp();
    sim::RunFor(5);
    EXPECT_EQ(report(), (Texts{""}));
    EXPECT_TRUE(isOnTimeOutQueue);
}

TEST_F(WanAddress, IsNotReportedWhenACivicAnswerCameFirst) {
    sim::AnswerReverseGeocode({.delay = 1, .error = ORBError{"no way"}});
    requestCivicAddress();
    ask(address(2));
    sim::RunFor(10);
    EXPECT_EQ(sim::TelephonyReports().size(), 1U);
    EXPECT_EQ(sim::TelephonyReports()[0].call, "civic");
    EXPECT_EQ(logged(LogLevel::kDefault, kWanIpWasNotWaiting), 1U);
}

TEST_F(WanAddress, EndsTheWaitForACivicAnswerThatComesLater) {
    sim::AnswerReverseGeocode({.delay = 2, .items = sim::MapItemsOf({.countryCode = "GB"})});
    requestCivicAddress();
    ask(address(1));
    sim::RunFor(10);
    EXPECT_EQ(sim::TelephonyReports().size(), 1U);
    EXPECT_EQ(sim::TelephonyReports()[0].call, "address");
    EXPECT_EQ(logged(kError, kCivicWasNotWaiting), 1U);
}

TEST_F(WanAddress, IsNotReportedWhenTheTimeOutOfACivicLookUpWasFirst) {
    sim::AnswerReverseGeocode({.isNever = true});
    requestCivicAddress();
    sim::RunFor(1);
    ask(address(4.5));
    sim::RunFor(10);
    EXPECT_EQ(sim::TelephonyReports().size(), 1U);
    EXPECT_EQ(sim::TelephonyReports()[0].call, "civic");
    EXPECT_EQ(sim::TelephonyReports()[0].time, 5.0);
    EXPECT_EQ(logged(LogLevel::kDefault, kWanIpWasNotWaiting), 1U);
}

TEST_F(WanAddress, BothTimeOutsTogetherReportOnce) {
    sim::AnswerReverseGeocode({.isNever = true});
    requestCivicAddress();
    ask({.isNever = true});
    sim::RunFor(10);
    EXPECT_EQ(reports(), 1U);
}

}  // namespace
