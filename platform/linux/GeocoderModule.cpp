// Which parts of an answer say what. Of each list the first that is there counts: which of them a
// place has depends on its country and its size.
#include "platform/linux/GeocoderModule.h"

#include <initializer_list>
#include <string>

#include <nlohmann/json.hpp>

namespace {

using Json = nlohmann::json;

struct Sink {
    void* context;
    void (*take)(void* context, LinefoldGeocoderField field, const char* text, size_t size);
};

/// The text under a key, or null.
const std::string* TextOf(const Json& object, const char* key) {
    const auto found = object.find(key);
    const auto* const text =
        found == object.end() ? nullptr : found->get_ptr<const Json::string_t*>();
    return text == nullptr || text->empty() ? nullptr : text;
}

void HandOver(const Sink& sink,
              LinefoldGeocoderField field,
              const Json& object,
              std::initializer_list<const char*> keys) {
    for (const char* const key : keys) {
        if (const auto* const text = TextOf(object, key)) {
            sink.take(sink.context, field, text->data(), text->size());
            return;
        }
    }
}

}  // namespace

LinefoldGeocoderResult LinefoldGeocoderRead(const void* body,
                                            size_t size,
                                            void* context,
                                            void (*take)(void* context,
                                                         LinefoldGeocoderField field,
                                                         const char* text,
                                                         size_t size)) noexcept {
    const auto* const text = static_cast<const char*>(body);
    constexpr bool kThrows = false;
    const Json answer = Json::parse(text, text + size, nullptr, kThrows);
    if (!answer.is_object()) {
        return LINEFOLD_GEOCODER_NO_ANSWER;
    }
    const Sink sink{.context = context, .take = take};
    if (answer.contains("error")) {
        HandOver(sink, LINEFOLD_GEOCODER_ERROR, answer, {"error"});
        return LINEFOLD_GEOCODER_REFUSED;
    }
    const auto address = answer.find("address");
    if (address == answer.end() || !address->is_object()) {
        return LINEFOLD_GEOCODER_NO_ADDRESS;
    }
    HandOver(sink, LINEFOLD_GEOCODER_COUNTRY_CODE, *address, {"country_code"});
    HandOver(
        sink, LINEFOLD_GEOCODER_STATE, *address, {"state", "region", "state_district", "county"});
    HandOver(sink,
             LINEFOLD_GEOCODER_CITY,
             *address,
             {"city", "town", "village", "municipality", "hamlet"});
    HandOver(sink, LINEFOLD_GEOCODER_POSTAL_CODE, *address, {"postcode"});
    return LINEFOLD_GEOCODER_ADDRESS;
}
