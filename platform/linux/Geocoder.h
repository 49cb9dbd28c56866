// Reverse geocoding by a server that speaks the Nominatim reverse API.
#pragma once

#include <cstddef>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/ORBServices.h"
#include "platform/linux/GeocoderModule.h"

namespace platform {

/// Items, one at most, or an error.
struct GeocoderAnswer {
    std::optional<ORBMapItems> items{};
    std::optional<ORBError> error{};
};

/// The URL that asks a server for the address of a place. `server` is the URL of its reverse
/// operation, to which the query is added.
[[nodiscard]] std::string ReverseGeocodeUrl(std::string_view server, ORBCoordinate coordinate);

/// What the body of an answer says. `read` is the module's function.
[[nodiscard]] GeocoderAnswer ReadGeocoderAnswer(std::span<const std::byte> body,
                                                decltype(&LinefoldGeocoderRead) read);

/// Starts a look-up, which does not wait, and gives its answer once on NetworkQueue.
void StartReverseGeocode(std::string_view url, std::function<void(GeocoderAnswer)> answered);

}  // namespace platform
