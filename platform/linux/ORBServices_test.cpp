#include "platform/ORBServices.h"

#include <gtest/gtest.h>

#include <chrono>
#include <cmath>
#include <future>
#include <limits>
#include <stdexcept>

#include "tests/http/RawServer.h"
#include "tests/location/Configuration.h"
#include "tests/location/StunServer.h"
#include "tests/support/PhoneRoot.h"

using namespace platform;

namespace {

constexpr std::string_view kAnswer =
    "HTTP/1.1 200 OK\r\nContent-Length: 36\r\n\r\n{\"address\":{\"country_code\":\"gb\"}}   ";

template <typename T>
T Await(std::future<T> future) {
    if (future.wait_for(std::chrono::seconds(20)) != std::future_status::ready) {
        throw std::runtime_error("no answer within 20 s");
    }
    return future.get();
}

class ORBServices : public testing::Test {
protected:
    ORBServices() { configuration::Remove(); }

    ~ORBServices() override { configuration::Remove(); }

    /// The country of the answer, or why there is none.
    [[nodiscard]] std::future<std::string> geocode(ORBCoordinate coordinate) const {
        auto promise = std::make_shared<std::promise<std::string>>();
        auto future = promise->get_future();
        const auto ticket = ORBMapService::sharedService().ticketForReverseGeocodeCoordinate(
            coordinate, {.includeETA = false, .shiftLocationsIfNeeded = true});
        ticket->submitWithHandler(
            [this, promise](const auto& items, const auto& error) {
                EXPECT_TRUE(queue_.isCurrent());
                EXPECT_NE(items.has_value(), error.has_value());
                promise->set_value(
                    error ? error->description
                          : *items->front()->orbAddress->structuredAddress->countryCode);
            },
            queue_);
        return future;
    }

    /// The address, or why there is none.
    [[nodiscard]] std::future<std::string> lookUpAddress(
        const std::optional<std::string>& of = std::nullopt) const {
        auto promise = std::make_shared<std::promise<std::string>>();
        auto future = promise->get_future();
        ORBMapService::sharedService().ticketForOrbIpLookupForIpAddr(of)->submitWithHandler(
            [this, promise](const auto& result, const auto& error) {
                EXPECT_TRUE(queue_.isCurrent());
                EXPECT_NE(result.has_value(), error.has_value());
                promise->set_value(error ? error->description : result->ipAddress);
            },
            queue_);
        return future;
    }

    const SerialQueue queue_{"answers"};
};

TEST_F(ORBServices, TellTheConfiguredCountry) {
    EXPECT_EQ(ORBCountryConfiguration::sharedConfiguration().countryCode(), std::nullopt);
    configuration::Write({{"CountryCode", "GB"}});
    EXPECT_EQ(ORBCountryConfiguration::sharedConfiguration().countryCode(), "GB");
}

TEST_F(ORBServices, AnswerOnTheGivenQueue) {
    const web::RawServer geocoder(
        [](const web::RawConnection& connection) { connection.send(kAnswer); });
    const stun::Server stun(
        [](const stun::Request& request, int) { request.send(request.success(7)); });
    configuration::Write({{"ReverseGeocodeURL", geocoder.url("/reverse")},
                          {"StunServer", "127.0.0.1:" + stun.port()}});
    EXPECT_EQ(Await(geocode({51.5, -0.125})), "GB");
    EXPECT_EQ(Await(lookUpAddress()), "192.0.2.7");
}

TEST_F(ORBServices, AnswerAtOnceWhenTheirServerIsNotConfigured) {
    configuration::Write({{"CountryCode", "GB"}});
    EXPECT_EQ(Await(geocode({51.5, -0.125})),
              "no geocoder is configured: ReverseGeocodeURL is missing");
    EXPECT_EQ(Await(lookUpAddress()), "no STUN server is configured: StunServer is missing");
}

TEST_F(ORBServices, AskNobodyAboutWhatIsNoPlaceOnEarth) {
    const web::RawServer geocoder(
        [](const web::RawConnection& connection) { connection.send(kAnswer); });
    configuration::Write({{"ReverseGeocodeURL", geocoder.url("/reverse")}});
    const double nan = std::numeric_limits<double>::quiet_NaN();
    const double infinity = std::numeric_limits<double>::infinity();
    for (const ORBCoordinate coordinate : {ORBCoordinate{nan, 0},
                                           ORBCoordinate{0, nan},
                                           ORBCoordinate{infinity, 0},
                                           ORBCoordinate{0, -infinity},
                                           ORBCoordinate{std::nextafter(90.0, 91.0), 0},
                                           ORBCoordinate{-1e300, 0},
                                           ORBCoordinate{0, std::nextafter(-180.0, -181.0)}}) {
        EXPECT_EQ(Await(geocode(coordinate)), "the coordinate is no place on earth");
    }
    EXPECT_TRUE(geocoder.requests().empty());
    EXPECT_EQ(Await(geocode({-90, 180})), "GB");
}

TEST_F(ORBServices, RefuseAStunServerThatIsNone) {
    configuration::Write({{"StunServer", "stun.example:port"}});
    EXPECT_EQ(Await(lookUpAddress()), "StunServer is no host with or without a port");
}

TEST_F(ORBServices, LookUpNobodyElsesAddress) {
    configuration::Write({{"StunServer", "127.0.0.1:9"}});
    EXPECT_EQ(Await(lookUpAddress("192.0.2.1")), "only this device's own address can be looked up");
}

TEST_F(ORBServices, AllowSixteenLookUpsAtOnce) {
    std::vector<std::future<std::string>> waiting;
    {
        const web::RawServer geocoder(
            [](const web::RawConnection& connection) { connection.pause(20'000); });
        configuration::Write(
            {{"ReverseGeocodeURL", geocoder.url("/reverse")}, {"StunServer", "127.0.0.1:9"}});
        for (int i = 0; i < 16; ++i) {
            waiting.push_back(geocode({51.5, -0.125}));
        }
        EXPECT_EQ(Await(geocode({51.5, -0.125})), "too many look-ups are under way");
        EXPECT_EQ(Await(lookUpAddress()), "too many look-ups are under way");
    }
    for (auto& answer : waiting) {
        EXPECT_EQ(Await(std::move(answer)).find("the geocoder cannot be asked: "), 0U);
    }
    const auto isFree = [this] {
        return Await(lookUpAddress()) == "the STUN server cannot be reached: Connection refused";
    };
    EXPECT_TRUE(phone::Eventually(isFree)) << "the shares come back with the answers";
}

}  // namespace
