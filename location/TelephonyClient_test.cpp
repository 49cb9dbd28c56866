#include "location/TelephonyClient.h"

#include <cerrno>

#include "location/Location_test.h"

using platform::LogLevel;

namespace {

class TelephonyClientTest : public LocationTest {
protected:
    using SystemLines = std::vector<sim::SystemLogLine>;
    using Lines = std::vector<sim::LogLine>;

    static void sendCivicInfo() {
        TelephonyClient::sendCivicInfoToHV(
            {.countryCode = "GB", .state = "England", .city = "London", .postalCode = "SW1A 0AA"});
    }
};

TEST_F(TelephonyClientTest, HandsTheFourTextsOverInOrder) {
    sendCivicInfo();
    EXPECT_EQ(report(), (Texts{"GB", "England", "London", "SW1A 0AA"}));
    EXPECT_EQ(sim::TelephonyReports()[0].call, "civic");
    EXPECT_EQ(
        sim::SystemLogLines(),
        (SystemLines{{kNotice, "sendCivicInfoToHV sent civic info to Linefold successfully"}}));
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

TEST_F(TelephonyClientTest, PassesEmptyTextsAndNotAbsentOnes) {
    TelephonyClient::sendCivicInfoToHV({.countryCode = "GB"});
    EXPECT_EQ(report(), (Texts{"GB", "", "", ""}));
}

TEST_F(TelephonyClientTest, PassesWhatIsNotUtf8AsAbsentAndCallsAllTheSame) {
    TelephonyClient::sendCivicInfoToHV(
        {.countryCode = "\xff", .state = "England", .city = "\xc3", .postalCode = ""});
    EXPECT_EQ(report(), (Texts{std::nullopt, "England", std::nullopt, ""}));
    EXPECT_EQ(logged(kNotice, "sendCivicInfoToHV sent civic info to Linefold successfully"), 1U);
}

TEST_F(TelephonyClientTest, SaysThatCivicInfoCouldNotBeSentAndGivesUp) {
    sim::SetTelephony({.isReachable = false});
    sendCivicInfo();
    EXPECT_EQ(reports(), 0U);
    EXPECT_EQ(sim::SystemLogLines(),
              (SystemLines{{kError,
                            "sendCivicInfoToHV to Linefold failed, could not open "
                            "HVServerConnection"}}));
    EXPECT_EQ(sim::JournalCount("HVServerConnection.set"), 0U);
}

TEST_F(TelephonyClientTest, LogsTheErrorOfCivicInfoAtNoticePriorityWithoutItsDomain) {
    sim::SetTelephony({.status = {.domain = 3, .error = -17}});
    sendCivicInfo();
    EXPECT_EQ(sim::SystemLogLines(),
              (SystemLines{
                  {kNotice, "sendCivicInfoToHV failed civic info to Linefold due to error: -17"}}));
}

TEST_F(TelephonyClientTest, ADomainWithoutAnErrorIsASuccess) {
    sim::SetTelephony({.status = {.domain = 3, .error = 0}});
    sendCivicInfo();
    EXPECT_EQ(logged(kNotice, "sendCivicInfoToHV sent civic info to Linefold successfully"), 1U);
}

TEST_F(TelephonyClientTest, HandsTheAddressOver) {
    TelephonyClient::sendWanIPToHV("203.0.113.7");
    EXPECT_EQ(report(), (Texts{"203.0.113.7"}));
    EXPECT_EQ(sim::TelephonyReports()[0].call, "address");
    EXPECT_EQ(sim::UnifiedLog(),
              (Lines{{LogLevel::kDefault, "sendWanIPToHV sent WAN IP to Linefold successfully"}}));
    EXPECT_TRUE(sim::SystemLogLines().empty());
}

TEST_F(TelephonyClientTest, TellsTheDaemonAnEmptyAddress) {
    TelephonyClient::sendWanIPToHV("");
    EXPECT_EQ(report(), (Texts{""}));
}

TEST_F(TelephonyClientTest, SaysThatTheAddressCouldNotBeSentAndGivesUp) {
    sim::SetTelephony({.isReachable = false});
    TelephonyClient::sendWanIPToHV("203.0.113.7");
    EXPECT_EQ(reports(), 0U);
    EXPECT_EQ(sim::UnifiedLog(),
              (Lines{{LogLevel::kError,
                      "sendWanIPToHV to Linefold failed, could not open HVServerConnection"}}));
}

TEST_F(TelephonyClientTest, LogsTheErrorOfTheAddressAtErrorLevel) {
    sim::SetTelephony({.status = {.domain = 3, .error = 61}});
    TelephonyClient::sendWanIPToHV("203.0.113.7");
    EXPECT_EQ(
        sim::UnifiedLog(),
        (Lines{{LogLevel::kError, "sendWanIPToHV failed WAN IP to Linefold due to error: 61"}}));
}

TEST_F(TelephonyClientTest, MakesTheExceptionKnownBeforeEachConnection) {
    sendCivicInfo();
    TelephonyClient::sendWanIPToHV("203.0.113.7");
    EXPECT_EQ(sim::JournalCount("HVServerConnection.addIdentifierException LinefoldMobileHelper"),
              2U);
    EXPECT_TRUE(sim::JournalHasInOrder({"HVServerConnection.addIdentifierException",
                                        "HVServerConnection.create",
                                        "HVServerConnection.released",
                                        "HVServerConnection.addIdentifierException",
                                        "HVServerConnection.create"}));
    EXPECT_EQ(sim::TelephonyReports()[0].identifiers,
              (std::vector<std::string>{"LinefoldMobileHelper"}));
}

TEST_F(TelephonyClientTest, KeepsNoConnection) {
    sendCivicInfo();
    TelephonyClient::sendWanIPToHV("");
    EXPECT_EQ(sim::TelephonyConnections(), 0U);
    sim::SetTelephony({.status = {.domain = 1, .error = 1}});
    sendCivicInfo();
    EXPECT_EQ(sim::TelephonyConnections(), 0U);
}

TEST_F(TelephonyClientTest, OnlyLogsWhatItIsNotifiedOf) {
    sim::SetTelephony({.notifications = 2});
    TelephonyClient::sendWanIPToHV("203.0.113.7");
    EXPECT_EQ(logged(kNotice, "_ServerConnectionCallback for LinefoldMobileHelper"), 2U);
    EXPECT_EQ(report(), (Texts{"203.0.113.7"}));
}

TEST_F(TelephonyClientTest, ADaemonThatDoesNotAnswerIsAnError) {
    sim::SetTelephony({.delay = 100});
    TelephonyClient::sendWanIPToHV("203.0.113.7");
    EXPECT_EQ(sim::Now(), 2.0);
    EXPECT_EQ(logged(LogLevel::kError,
                     "sendWanIPToHV failed WAN IP to Linefold due to error: " +
                         std::to_string(ETIMEDOUT)),
              1U);
}

}  // namespace
