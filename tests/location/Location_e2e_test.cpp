// Routines 18 to 20 through the real daemon: what the telephony daemon hears, and what is logged.
#include <gtest/gtest.h>

#include <algorithm>
#include <csignal>
#include <mutex>

#include "tests/http/RawServer.h"
#include "tests/location/Configuration.h"
#include "tests/location/PortServer.h"
#include "tests/location/StunServer.h"
#include "tests/support/PhoneRoot.h"

namespace {

using Lines = std::vector<std::string>;
using platform::PropertyList;

constexpr std::int32_t kRequestCivic = 8683567;
constexpr std::int32_t kCopyCountryCode = 8683568;
constexpr std::int32_t kRequestWanIp = 8683569;

/// The telephony daemon, which notes each report as "key=text;…" and then does as it is told.
class Telephony {
public:
    enum class Answers : std::uint8_t { kSuccess, kError5, kNever };

    void answer(Answers how) { how_ = how; }

    [[nodiscard]] Lines reports() const {
        const std::lock_guard guard(lock_);
        return reports_;
    }

    /// A report has come that is not answered, and whose sender is still there.
    [[nodiscard]] bool isHanging() const { return isHanging_; }

private:
    void serve(const port::PortConnection& connection) {
        (void)connection.receive();
        const auto report = connection.receive();
        note(report.body);
        if (how_ == Answers::kNever) {
            isHanging_ = true;
            connection.hang();
            isHanging_ = false;
        } else {
            connection.answer(report.id + 100, 2, how_ == Answers::kError5 ? 5 : 0);
            connection.hang();
        }
    }

    void note(const PropertyList& body) {
        std::string report;
        for (const auto& [key, value] : *body.as<PropertyList::Dictionary>()) {
            report += key + "=" + *value.as<std::string>() + ";";
        }
        const std::lock_guard guard(lock_);
        reports_.push_back(report);
    }

    mutable std::mutex lock_;
    Lines reports_;  // under lock_
    std::atomic<Answers> how_ = Answers::kSuccess;
    std::atomic<bool> isHanging_ = false;
    const port::PortServer server_{[this](const port::PortConnection& it) { serve(it); }};
};

std::string HttpAnswer(std::string_view body) {
    return "HTTP/1.1 200 OK\r\nContent-Length: " + std::to_string(body.size()) + "\r\n\r\n" +
           std::string(body);
}

constexpr std::string_view kLondon =
    R"({"address":{"city":"London","state":"England","country_code":"gb"}})";

std::size_t Count(const Lines& lines, std::string_view end) {
    return static_cast<std::size_t>(
        std::ranges::count_if(lines, [end](const auto& line) { return line.ends_with(end); }));
}

class Location : public testing::Test {
protected:
    ~Location() override { configuration::Remove(); }

    [[nodiscard]] std::int32_t requestCivic(double latitude, double longitude) const {
        auto message = phone::Message(kRequestCivic, 48);
        platform::Store(std::span(message), 32, latitude);
        platform::Store(std::span(message), 40, longitude);
        return client_.privatePort.call(message).code();
    }

    [[nodiscard]] std::int32_t requestWanIp() const {
        return client_.privatePort.call(phone::Message(kRequestWanIp, 24)).code();
    }

    /// The whole field.
    [[nodiscard]] std::string countryCode() const {
        const auto reply = client_.privatePort.call(phone::Message(kCopyCountryCode, 24));
        EXPECT_EQ(reply.bytes.size(), 100U);
        return {reinterpret_cast<const char*>(reply.bytes.data()) + 36, 64};
    }

    /// Collects lines until one of them ends so.
    void awaitLine(std::string_view end) {
        EXPECT_TRUE(phone::Eventually([&] {
            for (auto* const reader : {&journal_, &systemLog_}) {
                for (auto& line : reader->take()) {
                    lines_.push_back(std::move(line));
                }
            }
            return Count(lines_, end) != 0;
        })) << end;
    }

    phone::LogReader journal_ = phone::LogReader::journal();
    phone::LogReader systemLog_ = phone::LogReader::systemLog();
    Telephony telephony_;
    phone::Daemon daemon_;
    phone::Client client_ = phone::Client::checkIn();
    Lines lines_;
};

TEST_F(Location, OfAPlaceIsReportedAfterEightSecondsOnlyAsTheConfiguredCountry) {
    const web::RawServer geocoder([](const web::RawConnection& connection) {
        connection.pause(8000);
        connection.send(HttpAnswer(kLondon));
    });
    configuration::Write({{"CountryCode", "US"}, {"ReverseGeocodeURL", geocoder.url("/reverse")}});
    EXPECT_EQ(requestCivic(51.5, -0.125), 0);
    awaitLine("_RequestCivicInfoFromLatitudeLongitude wasn't waiting for response from ORB");
    EXPECT_EQ(telephony_.reports(), (Lines{"CountryCode=US;State=;City=;PostalCode=;"}));
    EXPECT_EQ(Count(lines_, "sendCivicInfoToHV sent civic info to Linefold successfully"), 1U);
    EXPECT_EQ(Count(lines_, "mapItems: (1)"), 0U);
}

TEST_F(Location, OfAPlaceThatNobodyTellsIsTheConfiguredCountry) {
    const web::RawServer geocoder(
        [](const web::RawConnection& connection) { connection.pause(60'000); });
    configuration::Write({{"CountryCode", "US"}, {"ReverseGeocodeURL", geocoder.url("/reverse")}});
    telephony_.answer(Telephony::Answers::kError5);
    EXPECT_EQ(requestCivic(51.5, -0.125), 0);
    awaitLine("5 3 sendCivicInfoToHV failed civic info to Linefold due to error: 5");
    EXPECT_EQ(telephony_.reports(), (Lines{"CountryCode=US;State=;City=;PostalCode=;"}));
}

TEST_F(Location, AddressThatNoServerTellsIsEmpty) {
    const stun::Server silent([](const stun::Request&, int) {});
    configuration::Write({{"StunServer", "127.0.0.1:" + silent.port()}});
    EXPECT_EQ(requestWanIp(), 0);
    awaitLine("_RequestWanIPFromLocation error: (the STUN server does not answer)");
    awaitLine("sendWanIPToHV sent WAN IP to Linefold successfully");
    EXPECT_EQ(telephony_.reports(), (Lines{"Address=;"}));
}

// One wait ends with the report that hangs. The next one is shared by all that were asked for while
// it hung, and has one report, too. Who asks for something else is served meanwhile.
TEST_F(Location, RequestsByTheThousandWaitForAHangingTelephonyDaemonAlone) {
    const std::string report = "CountryCode=US;State=;City=;PostalCode=;";
    configuration::Write({{"CountryCode", "US"}});
    telephony_.answer(Telephony::Answers::kNever);
    EXPECT_EQ(requestCivic(1, 1), 0);
    EXPECT_TRUE(phone::Eventually([this] { return telephony_.isHanging(); }));
    telephony_.answer(Telephony::Answers::kSuccess);
    for (int i = 1; i < 1000; ++i) {
        ASSERT_EQ(requestCivic(1, 1), 0);
    }
    EXPECT_EQ(countryCode().substr(0, 2), "US");
    EXPECT_TRUE(telephony_.isHanging()) << "all were taken while the report waited";
    EXPECT_TRUE(phone::Eventually([this] { return telephony_.reports().size() == 2; }));
    EXPECT_EQ(requestWanIp(), 0);
    awaitLine("sendWanIPToHV sent WAN IP to Linefold successfully");
    EXPECT_EQ(telephony_.reports(), (Lines{report, report, "Address=;"}))
        << "the last came behind all answers";
    EXPECT_EQ(Count(lines_, "sendCivicInfoToHV failed civic info to Linefold due to error: 110"),
              1U);
}

TEST_F(Location, OfAPlaceIsReportedAsTheGeocoderTellsIt) {
    const web::RawServer geocoder(
        [](const web::RawConnection& connection) { connection.send(HttpAnswer(kLondon)); });
    configuration::Write({{"CountryCode", "US"}, {"ReverseGeocodeURL", geocoder.url("/reverse")}});
    EXPECT_EQ(requestCivic(51.5, -0.125), 0);
    awaitLine("sendCivicInfoToHV sent civic info to Linefold successfully");
    EXPECT_EQ(telephony_.reports(),
              (Lines{"CountryCode=GB;State=England;City=London;PostalCode=;"}));
    EXPECT_EQ(lines_,
              (Lines{"3 3 server_LFMobileHelperRequestCountryCodeFromLocation \\n",
                     "5 3 _RequestCivicInfoFromLatitudeLongitude mapItems: (1)",
                     "5 3 _RequestCivicInfoFromLatitudeLongitude country code: GB",
                     "5 3 _RequestCivicInfoFromLatitudeLongitude state: England",
                     "5 3 _RequestCivicInfoFromLatitudeLongitude city: London",
                     "5 3 sendCivicInfoToHV sent civic info to Linefold successfully"}));
}

TEST_F(Location, AddressIsReportedAsTheServerTellsIt) {
    const stun::Server stun(
        [](const stun::Request& request, int) { request.send(request.success(7)); });
    configuration::Write({{"StunServer", "127.0.0.1:" + stun.port()}});
    EXPECT_EQ(requestWanIp(), 0);
    awaitLine("sendWanIPToHV sent WAN IP to Linefold successfully");
    EXPECT_EQ(telephony_.reports(), (Lines{"Address=192.0.2.7;"}));
    EXPECT_EQ(lines_,
              (Lines{"7 - server_LFMobileHelperRequestWanIPFromLocation",
                     "5 - _RequestWanIPFromLocation WAN IP: 192.0.2.7",
                     "5 - sendWanIPToHV sent WAN IP to Linefold successfully"}));
}

TEST_F(Location, OfZeroCoordinatesIsTheConfiguredCountry) {
    configuration::Write({{"CountryCode", "US"}});
    EXPECT_EQ(requestCivic(-0.0, 0), 0);
    awaitLine("sendCivicInfoToHV sent civic info to Linefold successfully");
    EXPECT_EQ(telephony_.reports(), (Lines{"CountryCode=US;State=;City=;PostalCode=;"}));
}

TEST_F(Location, CountryCodeFillsItsFieldAsFarAsItGoes) {
    EXPECT_EQ(countryCode(), std::string(64, '\0'));
    awaitLine("3 3 Didn't get valid country code from OrbService.\\n");
    configuration::Write({{"CountryCode", "GB"}});
    EXPECT_EQ(countryCode(), "GB" + std::string(62, '\0'));
    configuration::Write({{"CountryCode", std::string(100, 'x')}});
    EXPECT_EQ(countryCode(), std::string(64, 'x'));
}

TEST(LocationWithoutTelephony, IsLostWithOneLine) {
    auto systemLog = phone::LogReader::systemLog();
    configuration::Write({{"CountryCode", "US"}});
    const phone::Daemon daemon;
    const auto client = phone::Client::checkIn();
    EXPECT_EQ(client.privatePort.call(phone::Message(kRequestCivic, 48)).code(), 0);
    Lines lines;
    EXPECT_TRUE(phone::Eventually([&] {
        for (auto& line : systemLog.take()) {
            lines.push_back(std::move(line));
        }
        return lines.size() > 1;
    }));
    EXPECT_EQ(lines.at(1),
              "3 3 sendCivicInfoToHV to Linefold failed, could not open HVServerConnection");
    configuration::Remove();
}

/// Look-ups and a report under way that nobody will answer.
class LocationAtTheEnd : public testing::Test {
protected:
    LocationAtTheEnd() {
        configuration::Write({{"CountryCode", "US"},
                              {"ReverseGeocodeURL", geocoder_.url("/reverse")},
                              {"StunServer", "stun.example"}});
        telephony_.answer(Telephony::Answers::kNever);
        web::InGateway([this] {
            // A name server that never answers, at the address that resolv.conf has.
            nameServer_.reset(socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
            sockaddr_in address{};
            address.sin_family = AF_INET;
            address.sin_port = htons(53);
            EXPECT_EQ(
                bind(
                    nameServer_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address),
                0);
        });
    }

    ~LocationAtTheEnd() override { configuration::Remove(); }

    void begin(phone::Client& client) {
        auto place = phone::Message(kRequestCivic, 48);
        EXPECT_EQ(client.privatePort.call(place).code(), 0);
        platform::Store(std::span(place), 32, 51.5);
        EXPECT_EQ(client.privatePort.call(place).code(), 0);
        EXPECT_EQ(client.privatePort.call(phone::Message(kRequestWanIp, 24)).code(), 0);
        EXPECT_TRUE(phone::Eventually(
            [this] { return telephony_.isHanging() && !geocoder_.requests().empty(); }));
        std::array<char, 512> question{};
        EXPECT_GT(recv(nameServer_.get(), question.data(), question.size(), 0), 0);
    }

    /// No report has come to its end, not even by its own time limit.
    void expectNoReportEnded() {
        for (const auto& line : systemLog_.take()) {
            EXPECT_EQ(line.find("sendCivicInfoToHV"), std::string::npos) << line;
        }
    }

    phone::LogReader systemLog_ = phone::LogReader::systemLog();
    const web::RawServer geocoder_{
        [](const web::RawConnection& connection) { connection.pause(60'000); }};
    Telephony telephony_;
    platform::OwnedFd nameServer_;
};

TEST_F(LocationAtTheEnd, DoesNotHoldUpTheExit) {
    phone::Daemon daemon;
    auto client = phone::Client::checkIn();
    begin(client);
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.waitForExit(), 0);
    expectNoReportEnded();
}

TEST_F(LocationAtTheEnd, DoesNotKeepAnIdleDaemon) {
    phone::Daemon daemon({.program = phone::ProgramPath("LinefoldMobileHelper-brisk")});
    auto client = phone::Client::checkIn();
    begin(client);
    client.die();
    EXPECT_EQ(daemon.waitForExit(), 0);
}

}  // namespace
