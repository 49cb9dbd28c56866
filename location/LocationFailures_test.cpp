// Each platform call of a request fails once: whatever fails, a report is made or its loss is told.
#include "location/Location_test.h"

using platform::LogLevel;

namespace {

class LocationFailures : public LocationTest {
protected:
    /// Runs the request with its n-th call failing, for each n, and looks at what became of it.
    template <typename Request, typename Expect>
    static void sweep(const Request& request, const Expect& expect) {
        unsigned failures = 0;
        for (unsigned n = 1; !HasFailure(); ++n) {
            sim::Reset();
            (void)LocationWaitFlagTake();
            sim::AnswerReverseGeocode({.items = sim::MapItemsOf({.locality = "London"})});
            sim::AnswerIpLookup({.result = platform::OrbIpLookupResult{.ipAddress = "192.0.2.7"}});
            sim::FailCall(n);
            request();
            sim::RunFor(20);
            if (sim::FailedCall().empty()) {
                break;
            }
            ++failures;
            expect(sim::FailedCall());
            EXPECT_FALSE(LocationWaitFlagTake()) << sim::FailedCall();
            EXPECT_EQ(sim::TelephonyConnections(), 0U) << sim::FailedCall();
        }
        EXPECT_GE(failures, 3U);
    }
};

TEST_F(LocationFailures, CivicAddress) {
    sweep([] { requestCivicAddress(); },
          [](const std::string& failed) {
              if (failed == "HVServerConnection.create") {
                  EXPECT_EQ(logged(kError,
                                   "sendCivicInfoToHV to Linefold failed, could not open "
                                   "HVServerConnection"),
                            1U);
              } else if (failed == "HVServerConnection.setCivicInfo") {
                  EXPECT_EQ(logged(kNotice,
                                   "sendCivicInfoToHV failed civic info to Linefold due to error: "
                                   "104"),
                            1U);
              } else if (failed == "ORBCountryConfiguration.countryCode") {
                  EXPECT_EQ(report(), (Texts{"", "", "London", ""}));
              } else {
                  EXPECT_EQ(report(), (Texts{"US", "", "", ""})) << failed;
              }
          });
}

TEST_F(LocationFailures, WanIp) {
    sweep([] { requestWanIp(); },
          [](const std::string& failed) {
              if (failed == "HVServerConnection.create") {
                  EXPECT_EQ(
                      logged(LogLevel::kError,
                             "sendWanIPToHV to Linefold failed, could not open HVServerConnection"),
                      1U);
              } else if (failed == "HVServerConnection.setLocalRoutableAddress") {
                  EXPECT_EQ(logged(LogLevel::kError,
                                   "sendWanIPToHV failed WAN IP to Linefold due to error: 104"),
                            1U);
              } else {
                  EXPECT_EQ(report(), (Texts{""})) << failed;
              }
          });
}

}  // namespace
