// The role of the configuration server: a folder, served over HTTPS beyond the phone's networks.
#pragma once

#include <span>
#include <string_view>

namespace simulator {

inline constexpr std::string_view kConfigurationServerHelp =
    R"(configuration-server [OPTIONS] FOLDER
Serves FOLDER at https://configuration.vendra.example/ with nginx, in the gateway's network, under a
certificate of a private authority that the sandbox's bundle names meanwhile. Prints a line when it
serves, and one for each request, until SIGTERM. Inside of tools/sandbox only.

Options:
  --certificate KIND   trusted (as without it), expired, other-host, self-signed (the bundle names none
                       that signed it), unknown-authority
  --redirect PATH=URL  answers PATH with a redirect; may be given again
  --port N             listens there instead of 443

Example:
  mkdir -p /tmp/www/1/v3 && cp lasd.plist /tmp/www/1/v3/
  linefold-sim configuration-server /tmp/www &
)";

int PlayConfigurationServer(std::span<const std::string_view> words);

}  // namespace simulator
