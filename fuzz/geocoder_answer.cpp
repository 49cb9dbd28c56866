// Answers of a geocoder: whatever they hold, what comes out are names that can be reported.
#include <algorithm>
#include <span>

#include "fuzz/Fuzz.h"
#include "platform/Utf8.h"
#include "platform/linux/Geocoder.h"

namespace {

void RequireName(const std::optional<std::string>& text) {
    Require(!text || (!text->empty() && text->size() <= 512 && platform::IsUtf8(*text) &&
                      std::ranges::none_of(*text, [](char byte) {
                          return static_cast<unsigned char>(byte) < 0x20 || byte == 0x7f;
                      })));
}

void RequireAddress(const platform::ORBStructuredAddress& address) {
    RequireName(address.administrativeArea);
    RequireName(address.locality);
    RequireName(address.postCode);
    Require(!address.countryCode || (address.countryCode->size() == 2 &&
                                     std::ranges::all_of(*address.countryCode, [](char letter) {
                                         return letter >= 'A' && letter <= 'Z';
                                     })));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto answer =
        platform::ReadGeocoderAnswer(std::as_bytes(std::span(data, size)), LinefoldGeocoderRead);
    Require(answer.items.has_value() != answer.error.has_value());
    if (answer.error) {
        RequireName(answer.error->description);
        return 0;
    }
    Require(answer.items->size() == 1 && answer.items->front() && answer.items->front()->isValid);
    if (const auto& address = answer.items->front()->orbAddress->structuredAddress) {
        RequireAddress(*address);
    }
    return 0;
}
