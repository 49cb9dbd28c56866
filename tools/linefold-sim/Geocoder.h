// A geocoding server's part: the reverse operation of the Nominatim API, by plain HTTP.
#pragma once

#include <span>
#include <string_view>

namespace simulator {

inline constexpr std::string_view kGeocoderHelp =
    "geocoder [OPTIONS]\n"
    "Answers HTTP requests as a geocoding server that speaks the Nominatim reverse API, always "
    "with\n"
    "the same place, and prints the line of each request, after a first line \"ready\". Plays "
    "until\n"
    "SIGTERM.\n"
    "\n"
    "  --listen ADDRESS:PORT  where to listen (default: 198.51.100.1:8080)\n"
    "  --country CODE         the place, of which what is not given is not known; without any of\n"
    "  --state NAME           these it is \"us\", \"California\", \"Cupertino\" and \"95014\"\n"
    "  --city NAME\n"
    "  --postal-code TEXT\n"
    "  --failure TEXT         say that there is no place, with this error\n"
    "  --status NUMBER        answer with this status (default: 200)\n"
    "  --body TEXT            answer with this text in place of JSON\n"
    "  --size BYTES           fill the answer up to so many bytes\n"
    "  --delay SECONDS        answer so much later\n"
    "  --never                take requests and never answer\n"
    "\n"
    "Example, inside the private phone root:\n"
    "  nsenter --net=/run/netns/gateway linefold-sim geocoder --city London --country gb\n";

[[nodiscard]] int PlayGeocoder(std::span<const std::string_view> words);

}  // namespace simulator
