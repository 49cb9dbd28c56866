// A STUN server's part (RFC 8489): it tells who asks under which address it sees him.
#pragma once

#include <span>
#include <string_view>

namespace simulator {

inline constexpr std::string_view kStunHelp =
    "stun [OPTIONS]\n"
    "Answers STUN binding requests, and prints a line for each, after a first line \"ready\". "
    "Plays\n"
    "until SIGTERM.\n"
    "\n"
    "  --listen ADDRESS:PORT  where to listen (default: 198.51.100.1:3478)\n"
    "  --claim ADDRESS        tell this IPv4 or IPv6 address in place of the true one\n"
    "  --plain                tell it in a MAPPED-ADDRESS, as old servers do\n"
    "  --error NUMBER         refuse with this error, 300 to 699\n"
    "  --delay SECONDS        answer so much later\n"
    "  --skip NUMBER          leave so many requests unanswered first\n"
    "  --silent               never answer\n"
    "  --garbage              answer with what is no STUN message\n"
    "  --other-transaction    answer as if to another request\n"
    "  --other-port           answer from another port\n"
    "\n"
    "Example, inside the private phone root:\n"
    "  nsenter --net=/run/netns/gateway linefold-sim stun --claim 192.0.2.77\n";

[[nodiscard]] int PlayStun(std::span<const std::string_view> words);

}  // namespace simulator
