#include "tools/linefold-sim/Geocoder.h"

#include <poll.h>
#include <sys/socket.h>

#include <array>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <memory>
#include <optional>
#include <string>
#include <thread>

#include "tools/linefold-sim/RoleOptions.h"

namespace simulator {
namespace {

using platform::OwnedFd;
using Takes = KnownOption::Takes;

constexpr std::string_view kRole = "geocoder";
constexpr std::size_t kLargestRequest = 16U << 10;
constexpr int kConnectionsMax = 64;

struct Settings {
    std::string place;
    std::string answer;  ///< the whole of it, header and body
    std::chrono::duration<double> delay{};
    bool isNever = false;
};

std::string JsonText(std::string_view text) {
    std::string json = "\"";
    for (const char byte : text) {
        if (byte == '"' || byte == '\\') {
            json += '\\';
        }
        if (static_cast<unsigned char>(byte) < 0x20) {
            std::array<char, 8> escape{};
            (void)std::snprintf(
                escape.data(), escape.size(), "\\u%04x", static_cast<unsigned>(byte));
            json += escape.data();
        } else {
            json += byte;
        }
    }
    return json + "\"";
}

/// The address as such a server words it.
std::string AddressJson(const RoleOptions& options) {
    struct Part {
        const char* option;
        const char* key;
        const char* otherwise;
    };

    constexpr std::array<Part, 4> kParts{{{"--city", "city", "Cupertino"},
                                          {"--state", "state", "California"},
                                          {"--postal-code", "postcode", "95014"},
                                          {"--country", "country_code", "us"}}};
    bool isGiven = false;
    for (const Part& part : kParts) {
        isGiven = isGiven || options.has(part.option);
    }
    std::string json;
    for (const Part& part : kParts) {
        if (!isGiven || options.has(part.option)) {
            json += (json.empty() ? "" : ",") + JsonText(part.key) + ":" +
                    JsonText(options.value(part.option, part.otherwise));
        }
    }
    return "{\"place_id\":1,\"licence\":\"simulated\",\"address\":{" + json + "}}";
}

std::string Body(const RoleOptions& options) {
    if (options.has("--body")) {
        return options.value("--body", "");
    }
    return options.has("--failure") ? "{\"error\":" + JsonText(options.value("--failure", "")) + "}"
                                    : AddressJson(options);
}

std::optional<Settings> Parse(std::span<const std::string_view> words) {
    constexpr std::array<KnownOption, 11> kKnown{{{"--listen"},
                                                  {"--country"},
                                                  {"--state"},
                                                  {"--city"},
                                                  {"--postal-code"},
                                                  {"--failure"},
                                                  {"--status"},
                                                  {"--body"},
                                                  {"--size"},
                                                  {"--delay"},
                                                  {"--never", Takes::kNothing}}};
    const auto options = RoleOptions::parse(kRole, words, kKnown);
    if (!options) {
        return std::nullopt;
    }
    const auto status = options->number("--status", 200, 100);
    const auto size = options->number("--size", 0, 0);
    const auto delay = options->number("--delay", 0, 0);
    const auto place = options->place("--listen", "198.51.100.1:8080");
    if (!status || !size || !delay || !place) {
        return std::nullopt;
    }
    std::string body = Body(*options);
    body.resize(std::max(body.size(), static_cast<std::size_t>(*size)), ' ');
    const std::string header = "HTTP/1.1 " + std::to_string(static_cast<int>(*status)) +
                               " Simulated\r\nContent-Type: application/json; charset=utf-8\r\n"
                               "Connection: close\r\nContent-Length: " +
                               std::to_string(body.size()) + "\r\n\r\n";
    return Settings{.place = *place,
                    .answer = header + body,
                    .delay = std::chrono::duration<double>(*delay),
                    .isNever = options->has("--never")};
}

/// Reads to the end of the header. Empty when the client goes away before.
std::string ReadRequest(int connection) {
    std::string request;
    std::array<char, 4096> piece;
    while (request.find("\r\n\r\n") == std::string::npos) {
        const ssize_t size = recv(connection, piece.data(), piece.size(), 0);
        if (size <= 0 || request.size() > kLargestRequest) {
            return {};
        }
        request.append(piece.data(), static_cast<std::size_t>(size));
    }
    return request;
}

void WaitForEnd(int connection) {
    std::array<char, 256> piece;
    while (recv(connection, piece.data(), piece.size(), 0) > 0) {
    }
}

void Serve(const OwnedFd& connection, const Settings& settings) {
    const std::string request = ReadRequest(connection.get());
    if (request.empty()) {
        return;
    }
    (void)std::fprintf(stdout, "%s\n", request.substr(0, request.find("\r\n")).c_str());
    std::this_thread::sleep_for(settings.delay);
    std::string_view rest = settings.answer;
    while (!settings.isNever && !rest.empty()) {
        const ssize_t size = send(connection.get(), rest.data(), rest.size(), MSG_NOSIGNAL);
        if (size <= 0) {
            return;
        }
        rest.remove_prefix(static_cast<std::size_t>(size));
    }
    if (!settings.isNever) {
        (void)shutdown(connection.get(), SHUT_WR);
    }
    WaitForEnd(connection.get());
}

void Play(const OwnedFd& listening, const Settings& settings, const Termination& termination) {
    static std::atomic<int> connections = 0;
    // Threads may outlive this function, up to the end of the process.
    static const Settings& shared = *new Settings(settings);
    std::array<pollfd, 2> states{{{.fd = termination.descriptor(), .events = POLLIN, .revents = 0},
                                  {.fd = listening.get(), .events = POLLIN, .revents = 0}}};
    while (states[0].revents == 0) {
        (void)poll(states.data(), states.size(), -1);
        if (states[1].revents == 0) {
            continue;
        }
        auto connection =
            std::make_shared<OwnedFd>(accept4(listening.get(), nullptr, nullptr, SOCK_CLOEXEC));
        if (connection->isOpen() && connections < kConnectionsMax) {
            ++connections;
            std::thread([connection] {
                Serve(*connection, shared);
                --connections;
            }).detach();
        }
    }
}

}  // namespace

int PlayGeocoder(std::span<const std::string_view> words) {
    const auto settings = Parse(words);
    if (!settings) {
        return kUsage;
    }
    const Termination termination;
    const OwnedFd listening = SocketAt(kRole, settings->place, SOCK_STREAM);
    if (!listening.isOpen()) {
        return kCannotPlay;
    }
    (void)std::fprintf(stdout, "ready\n");
    Play(listening, *settings, termination);
    return 0;
}

}  // namespace simulator
