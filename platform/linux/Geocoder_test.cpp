#include "platform/linux/Geocoder.h"

#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <stdexcept>

#include "platform/BuildConstants.h"
#include "platform/DynamicLibrary.h"
#include "tests/http/RawServer.h"

using namespace platform;

namespace {

/// What an answer comes to: "country|state|city|postal code", "no address" or "error: " and why.
std::string Summary(const GeocoderAnswer& answer) {
    if (answer.error) {
        return "error: " + answer.error->description;
    }
    if (!answer.items || answer.items->size() != 1 || !answer.items->front() ||
        !answer.items->front()->isValid || !answer.items->front()->orbAddress) {
        return "no item";
    }
    const auto& address = answer.items->front()->orbAddress->structuredAddress;
    if (!address) {
        return "no address";
    }
    return address->countryCode.value_or("-") + "|" + address->administrativeArea.value_or("-") +
           "|" + address->locality.value_or("-") + "|" + address->postCode.value_or("-");
}

std::string Read(std::string_view body) {
    static const auto library =
        DynamicLibrary::open(std::string(kLibraryDirectory) + "/libLinefoldGeocoder.so");
    static const auto read =
        library.function<std::remove_pointer_t<decltype(&LinefoldGeocoderRead)>>(
            "LinefoldGeocoderRead");
    return Summary(ReadGeocoderAnswer(std::as_bytes(std::span(body)), read));
}

std::string ReadAddress(std::string_view parts) {
    return Read("{\"address\":{" + std::string(parts) + "}}");
}

/// An answer of the real kind.
constexpr std::string_view kWestminster = R"({"place_id":255,"licence":"Data","osm_type":"way",
    "lat":"51.50","lon":"-0.12","category":"amenity","display_name":"Palace of Westminster, London",
    "address":{"amenity":"Palace of Westminster","road":"Old Palace Yard","suburb":"Westminster",
    "city":"London","ISO3166-2-lvl8":"GB-WSM","state":"England","ISO3166-2-lvl4":"GB-ENG",
    "postcode":"SW1A 0AA","country":"United Kingdom","country_code":"gb"},
    "boundingbox":["51.49","51.51","-0.13","-0.11"]})";

TEST(GeocoderAnswer, TellsTheFourParts) {
    EXPECT_EQ(Read(kWestminster), "GB|England|London|SW1A 0AA");
}

TEST(GeocoderAnswer, TakesTheFirstPartOfItsKindThatIsThere) {
    EXPECT_EQ(ReadAddress(R"("town":"T","village":"V","region":"R","county":"C")"), "-|R|T|-");
    EXPECT_EQ(ReadAddress(R"("hamlet":"H","municipality":"M","state_district":"D","county":"C")"),
              "-|D|M|-");
    EXPECT_EQ(ReadAddress(R"("village":"V","state":"","county":"C")"), "-|C|V|-");
    EXPECT_EQ(ReadAddress(R"("hamlet":"H","city":7,"state":null,"region":["R"])"), "-|-|H|-");
}

TEST(GeocoderAnswer, SpellsTheCountryInCapitals) {
    EXPECT_EQ(ReadAddress(R"("country_code":"de")"), "DE|-|-|-");
    EXPECT_EQ(ReadAddress(R"("country_code":"Fr")"), "FR|-|-|-");
    for (const char* const code : {"usa", "u", "4u", "\\u00e4\\u00f6", ""}) {
        EXPECT_EQ(ReadAddress("\"country_code\":\"" + std::string(code) + "\""), "-|-|-|-") << code;
    }
}

TEST(GeocoderAnswer, KeepsNamesInAnyScript) {
    EXPECT_EQ(ReadAddress("\"city\":\"\xe6\x9d\xb1\xe4\xba\xac\",\"state\":\"K\\u00f6ln\""),
              "-|K\xc3\xb6ln|\xe6\x9d\xb1\xe4\xba\xac|-");
}

TEST(GeocoderAnswer, DropsWhatIsNoName) {
    EXPECT_EQ(ReadAddress(R"("city":"a\nb","state":"\u0000","postcode":"\u007f")"), "-|-|-|-");
    EXPECT_EQ(ReadAddress("\"city\":\"" + std::string(513, 'x') + "\""), "-|-|-|-");
    EXPECT_EQ(ReadAddress("\"city\":\"" + std::string(512, 'x') + "\""),
              "-|-|" + std::string(512, 'x') + "|-");
}

TEST(GeocoderAnswer, GivesTheServersReason) {
    EXPECT_EQ(Read(R"({"error":"Unable to geocode"})"), "error: Unable to geocode");
    EXPECT_EQ(Read(R"({"error":{"code":400,"message":"x"}})"), "error: the geocoder refused");
    EXPECT_EQ(Read(R"({"error":"","address":{"city":"London"}})"), "error: the geocoder refused");
}

TEST(GeocoderAnswer, MayHaveNoAddress) {
    EXPECT_EQ(Read("{}"), "no address");
    EXPECT_EQ(Read(R"({"address":null})"), "no address");
    EXPECT_EQ(Read(R"({"address":"London"})"), "no address");
    EXPECT_EQ(Read(R"({"address":{}})"), "-|-|-|-");
}

TEST(GeocoderAnswer, IsAnErrorWhenItIsNoObject) {
    const std::string deep(60'000, '[');
    for (const std::string& body : {std::string(),
                                    std::string("null"),
                                    std::string("[]"),
                                    std::string("<html><body>London</body></html>"),
                                    std::string("{\"address\":{\"city\":\"Lon"),
                                    std::string("{\"address\":{\"city\":\"\xff\"}}"),
                                    std::string("{} {}"),
                                    std::string(4, '\0'),
                                    deep}) {
        EXPECT_EQ(Read(body), "error: the geocoder's answer is no JSON object")
            << body.substr(0, 40);
    }
}

TEST(GeocoderAnswer, SurvivesWhateverIsNested) {
    std::string deep = "{\"address\":{\"city\":\"London\"},\"more\":";
    deep += std::string(30'000, '[') + std::string(30'000, ']') + "}";
    EXPECT_EQ(Read(deep), "-|-|London|-");
}

TEST(ReverseGeocodeUrl, AddsTheQuestionToTheServersUrl) {
    EXPECT_EQ(ReverseGeocodeUrl("https://geocoder.example/reverse", {51.5, -0.125}),
              "https://geocoder.example/reverse?format=jsonv2&lat=51.5000000&lon=-0.1250000"
              "&zoom=18&addressdetails=1&accept-language=en");
    EXPECT_EQ(ReverseGeocodeUrl("http://h/r?key=k", {-90, 180})
                  .find("http://h/r?key=k&format=jsonv2&lat=-90.0000000&lon=180.0000000&"),
              0U);
    EXPECT_NE(ReverseGeocodeUrl("http://h/r", {1e-300, 5e-9}).find("lat=0.0000000&lon=0.0000000"),
              std::string::npos);
}

/// What a look-up at a server comes to that answers with these bytes.
std::string Ask(const std::string& answer) {
    const web::RawServer server(
        [&answer](const web::RawConnection& connection) { connection.send(answer); });
    const auto promise = std::make_shared<std::promise<std::string>>();
    StartReverseGeocode(
        ReverseGeocodeUrl(server.url("/reverse"), {51.5, -0.125}),
        [promise](const GeocoderAnswer& told) { promise->set_value(Summary(told)); });
    auto future = promise->get_future();
    if (future.wait_for(std::chrono::seconds(20)) != std::future_status::ready) {
        throw std::runtime_error("no answer within 20 s");
    }
    return future.get();
}

std::string Ok(std::string_view body) {
    return "HTTP/1.1 200 OK\r\nConnection: close\r\nContent-Length: " +
           std::to_string(body.size()) + "\r\n\r\n" + std::string(body);
}

TEST(ReverseGeocode, GivesWhatTheServerTells) {
    EXPECT_EQ(Ask(Ok(kWestminster)), "GB|England|London|SW1A 0AA");
}

TEST(ReverseGeocode, SaysWhoAsksAndWhatFor) {
    std::string request;
    const web::RawServer server([&](const web::RawConnection& connection) {
        request = connection.request();
        connection.send(Ok("{}"));
    });
    std::promise<void> answered;
    StartReverseGeocode(ReverseGeocodeUrl(server.url("/reverse"), {51.5, -0.125}),
                        [&](const GeocoderAnswer&) { answered.set_value(); });
    answered.get_future().wait();
    EXPECT_TRUE(request.starts_with("GET /reverse?format=jsonv2&lat=51.5000000&lon=-0.1250000&"));
    EXPECT_NE(request.find("User-Agent: LinefoldMobileHelper\r\n"), std::string::npos);
    EXPECT_NE(request.find("Accept: application/json\r\n"), std::string::npos);
}

TEST(ReverseGeocode, IsAnErrorWhenTheServerSpeaksSomethingElse) {
    EXPECT_EQ(Ask(Ok("<html>login</html>")), "error: the geocoder's answer is no JSON object");
    EXPECT_EQ(Ask("HTTP/1.1 200 OK\r\n\r\n"), "error: the geocoder's answer is no JSON object");
    EXPECT_EQ(Ask("SSH-2.0-server\r\n").find("error: the geocoder cannot be asked: "), 0U);
    EXPECT_EQ(Ask("").find("error: the geocoder cannot be asked: "), 0U);
}

TEST(ReverseGeocode, IsAnErrorWithAnyOtherStatus) {
    EXPECT_EQ(Ask("HTTP/1.1 503 Busy\r\nContent-Length: 2\r\n\r\n{}"),
              "error: the geocoder answered with status 503");
    EXPECT_EQ(Ask("HTTP/1.1 204 None\r\n\r\n"), "error: the geocoder answered with status 204");
}

TEST(ReverseGeocode, IsAnErrorBeyond64KiB) {
    const auto padded = [](std::size_t size) {
        std::string body(kWestminster);
        body.resize(size, ' ');
        return body;
    };
    EXPECT_EQ(Ask(Ok(padded(64 << 10))), "GB|England|London|SW1A 0AA");
    const std::string tooLarge = Ask(Ok(padded((64 << 10) + 1)));
    EXPECT_EQ(tooLarge.find("error: the geocoder cannot be asked: "), 0U) << tooLarge;
    EXPECT_EQ(Ask("HTTP/1.1 200 OK\r\n\r\n" + padded(10 << 20)), tooLarge) << "no size announced";
}

TEST(ReverseGeocode, IsAnErrorWhenNobodyListensOrTheUrlIsNone) {
    for (const char* const url : {"http://127.0.0.1:9/", "ftp://127.0.0.1/", "nonsense", ""}) {
        std::promise<std::string> promise;
        StartReverseGeocode(
            url, [&](const GeocoderAnswer& answer) { promise.set_value(Summary(answer)); });
        EXPECT_EQ(promise.get_future().get().find("error: the geocoder"), 0U) << url;
    }
}

}  // namespace
