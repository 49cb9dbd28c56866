#include "platform/linux/Geocoder.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <utility>

#include "platform/BuildConstants.h"
#include "platform/DynamicLibrary.h"
#include "platform/hvu/Http.h"
#include "platform/linux/NetworkQueue.h"

namespace platform {
namespace {

using hvu::Http::HttpRequest;
using hvu::Http::HttpResponse;
using hvu::Http::HttpSession;

constexpr std::size_t kLargestAnswer = 64U << 10;

/// Longer than anybody waits for the answer: one that is late is told in the log. Beyond it the
/// look-up would only keep others from being made.
constexpr long kSecondsMax = 30;

/// Of a name on this planet, with room to spare.
constexpr std::size_t kLongestText = 512;

GeocoderAnswer Failure(std::string why) {
    return {.items = std::nullopt, .error = ORBError{std::move(why)}};
}

/// To about a centimetre. The daemon sets no locale, so there is always a point.
std::string Degrees(double degrees) {
    std::array<char, 32> text{};
    (void)std::snprintf(text.data(), text.size(), "%.7f", degrees);
    return text.data();
}

bool IsControl(char byte) {
    return static_cast<unsigned char>(byte) < 0x20 || byte == 0x7f;
}

/// Names do not run to pages, nor hold control characters: what does is not one.
bool IsName(std::string_view text) {
    return text.size() <= kLongestText && std::ranges::none_of(text, IsControl);
}

/// Two letters, as capitals.
std::optional<std::string> CountryCode(std::string_view text) {
    std::string code;
    for (const char letter : text) {
        code += letter >= 'a' && letter <= 'z' ? static_cast<char>(letter - 'a' + 'A') : letter;
    }
    const bool isCode = code.size() == 2 && std::ranges::all_of(code, [](char letter) {
                            return letter >= 'A' && letter <= 'Z';
                        });
    return isCode ? std::optional(code) : std::nullopt;
}

/// What the module hands over.
struct Found {
    ORBStructuredAddress address{};
    std::string error{};

    void take(LinefoldGeocoderField field, std::string_view text) {
        if (!IsName(text)) {
            return;
        }
        switch (field) {
            case LINEFOLD_GEOCODER_COUNTRY_CODE:
                address.countryCode = CountryCode(text);
                break;
            case LINEFOLD_GEOCODER_STATE:
                address.administrativeArea = text;
                break;
            case LINEFOLD_GEOCODER_CITY:
                address.locality = text;
                break;
            case LINEFOLD_GEOCODER_POSTAL_CODE:
                address.postCode = text;
                break;
            case LINEFOLD_GEOCODER_ERROR:
                error = text;
                break;
        }
    }
};

void TakeText(void* context, LinefoldGeocoderField field, const char* text, std::size_t size) {
    static_cast<Found*>(context)->take(field, {text, size});
}

struct Module {
    DynamicLibrary library =
        DynamicLibrary::open(std::string(kLibraryDirectory) + "/libLinefoldGeocoder.so");
    decltype(&LinefoldGeocoderRead) read =
        library.function<std::remove_pointer_t<decltype(&LinefoldGeocoderRead)>>(
            "LinefoldGeocoderRead");
};

const Module& TheModule() {
    static const Module& module = *new Module;
    return module;
}

GeocoderAnswer AnswerOf(const HttpResponse* response) {
    constexpr int kOk = 200;
    if (response == nullptr) {
        return Failure("the geocoder cannot be asked: there is no HTTP client");
    }
    if (response->errorType() != hvu::Http::ErrorType::kNone) {
        return Failure(std::string("the geocoder cannot be asked: ") +
                       hvu::Http::asString(response->errorType()));
    }
    if (response->statusCode() != kOk) {
        return Failure("the geocoder answered with status " +
                       std::to_string(response->statusCode()));
    }
    return TheModule().read == nullptr
               ? Failure("the geocoder's answer cannot be read: the module for it is missing")
               : ReadGeocoderAnswer(response->body(), TheModule().read);
}

}  // namespace

std::string ReverseGeocodeUrl(std::string_view server, ORBCoordinate coordinate) {
    std::string url(server);
    url += server.find('?') == std::string_view::npos ? '?' : '&';
    return url + "format=jsonv2&lat=" + Degrees(coordinate.latitude) +
           "&lon=" + Degrees(coordinate.longitude) + "&zoom=18&addressdetails=1&accept-language=en";
}

GeocoderAnswer ReadGeocoderAnswer(std::span<const std::byte> body,
                                  decltype(&LinefoldGeocoderRead) read) {
    Found found;
    switch (read(body.data(), body.size(), &found, TakeText)) {
        case LINEFOLD_GEOCODER_NO_ANSWER:
            return Failure("the geocoder's answer is no JSON object");
        case LINEFOLD_GEOCODER_REFUSED:
            return Failure(found.error.empty() ? "the geocoder refused" : found.error);
        case LINEFOLD_GEOCODER_NO_ADDRESS:
            return {.items = ORBMapItems{ORBMapItem{.orbAddress = ORBAddress{}}}, .error = {}};
        case LINEFOLD_GEOCODER_ADDRESS:
            break;
    }
    ORBMapItem item{.orbAddress = ORBAddress{.structuredAddress = std::move(found.address)}};
    return {.items = ORBMapItems{std::move(item)}, .error = {}};
}

void StartReverseGeocode(std::string_view url, std::function<void(GeocoderAnswer)> answered) {
    const auto session = HttpSession::create();
    session->setBodyLimit(kLargestAnswer);
    session->setTimeLimit(kSecondsMax);
    const auto request = HttpRequest::create(
        hvu::Http::RequestType::kGet,
        url,
        {{"Accept", "application/json"}, {"User-Agent", "LinefoldMobileHelper"}},
        session);
    if (request == nullptr) {
        NetworkQueue().async(
            [answered] { answered(Failure("the geocoder's URL cannot be used")); });
        return;
    }
    request->setCompletionQueue(NetworkQueue());
    request->setCompletionHandler([answered](const std::shared_ptr<HttpResponse>& response) {
        answered(AnswerOf(response.get()));
    });
    request->start({});
}

}  // namespace platform
