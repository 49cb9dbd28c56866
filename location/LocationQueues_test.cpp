#include "location/LocationQueues.h"

#include "location/Location_test.h"
#include "platform/RunLoop.h"

using platform::LogLevel;

namespace {

class LocationQueues : public LocationTest {
protected:
    static constexpr std::string_view kDropped = "location request dropped: 4096 are under way";
};

TEST_F(LocationQueues, AreMadeOnce) {
    EXPECT_EQ(LocationLookupQueue().label(), "ORB callback queue");
    EXPECT_EQ(LocationLookupQueue().service(), platform::QualityOfService::kUtility);
    bool isSame = false;
    LocationLookupQueue().async([&] { isSame = LocationLookupQueue().isCurrent(); });
    sim::Settle();
    EXPECT_TRUE(isSame);
}

TEST_F(LocationQueues, GoOnWhileTheMainLoopIsBusy) {
    requestCivicAddress();
    platform::RunLoop::current().post(
        [] { sim::RunOthersUntil([] { return !sim::TelephonyReports().empty(); }); });
    sim::Settle();
    EXPECT_EQ(reports(), 1U);
}

TEST_F(LocationQueues, AHangingTelephonyDaemonHoldsUpNoOtherWork) {
    sim::SetTelephony({.delay = 100});
    requestCivicAddress(0, 0);
    double answeredAt = -1;
    sim::At(1, [&] { platform::RunLoop::current().post([&] { answeredAt = sim::Now(); }); });
    sim::RunFor(3);
    EXPECT_EQ(answeredAt, 1.0);
    EXPECT_EQ(logged(kNotice, "sendCivicInfoToHV failed civic info to Linefold due to error: 110"),
              1U);
}

TEST_F(LocationQueues, TakeAsManyRequestsAsTheyMay) {
    for (std::uint32_t i = 0; i < kLocationRequestsMax; ++i) {
        requestCivicAddress(0, 0);
    }
    EXPECT_EQ(logged(LogLevel::kError, kDropped), 0U);
    requestCivicAddress(0, 0);
    requestWanIp();
    EXPECT_EQ(logged(LogLevel::kError, kDropped), 2U);
    sim::Settle();
    EXPECT_EQ(reports(), kLocationRequestsMax);
}

TEST_F(LocationQueues, TakeRequestsAgainWhenTheTimeOutsHaveRun) {
    sim::AnswerReverseGeocode({.isNever = true});
    for (std::uint32_t i = 0; i < kLocationRequestsMax; ++i) {
        requestCivicAddress();
    }
    sim::RunFor(4.9);
    requestWanIp();
    EXPECT_EQ(logged(LogLevel::kError, kDropped), 1U);
    sim::RunFor(0.2);
    requestWanIp();
    EXPECT_EQ(logged(LogLevel::kError, kDropped), 1U);
}

}  // namespace
