#include "tools/linefold-sim/Telephony.h"

#include <poll.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <deque>
#include <optional>
#include <string>

#include "platform/PropertyList.h"
#include "tools/NamedPort.h"
#include "tools/TelephonyPort.h"
#include "tools/linefold-sim/RoleOptions.h"

namespace simulator {
namespace {

using platform::PropertyList;
using tools::NamedPort;
using tools::PortMessage;
using tools::TelephonyMessage;
using Clock = std::chrono::steady_clock;
using Takes = KnownOption::Takes;

constexpr std::string_view kRole = "telephony";

struct Settings {
    tools::TelephonyStatus status{};
    Clock::duration delay{};
    bool isSilent = false;
    std::optional<std::string> notification{};
    bool ownsServer = true;
    bool ownsDatabases = true;
};

std::optional<Settings> Parse(std::span<const std::string_view> words) {
    constexpr std::array<KnownOption, 6> kKnown{{{"--error"},
                                                 {"--domain"},
                                                 {"--delay"},
                                                 {"--silent", Takes::kNothing},
                                                 {"--notify"},
                                                 {"--only"}}};
    const auto options = RoleOptions::parse(kRole, words, kKnown);
    if (!options) {
        return std::nullopt;
    }
    constexpr double kLeast = -2147483648.0;
    const auto error = options->number("--error", 0, kLeast);
    const auto domain = options->number("--domain", error == 0 ? 0 : 2, kLeast);
    const auto delay = options->number("--delay", 0, 0);
    const std::string only = options->value("--only", "");
    if (!error || !domain || !delay) {
        return std::nullopt;
    }
    if (!only.empty() && only != "server" && only != "lasd") {
        (void)Complain(kRole, "the value of --only must be server or lasd", kUsage);
        return std::nullopt;
    }
    return Settings{
        .status = {.domain = static_cast<std::int32_t>(*domain),
                   .error = static_cast<std::int32_t>(*error)},
        .delay = std::chrono::duration_cast<Clock::duration>(std::chrono::duration<double>(*delay)),
        .isSilent = options->has("--silent"),
        .notification =
            options->has("--notify") ? std::optional(options->value("--notify", "")) : std::nullopt,
        .ownsServer = only != "lasd",
        .ownsDatabases = only != "server"};
}

/// A text between quotes, with what could be mistaken for more of the line escaped.
std::string Quoted(std::string_view text) {
    std::string quoted = "\"";
    for (const char byte : text) {
        if (byte == '"' || byte == '\\') {
            quoted += '\\';
        }
        quoted += static_cast<unsigned char>(byte) < 0x20 ? '?' : byte;
    }
    return quoted + "\"";
}

std::string Value(const tools::ReportedText& text) {
    return text.value ? Quoted(*text.value) : "(absent)";
}

std::string Line(const TelephonyMessage& report) {
    if (report.kind == TelephonyMessage::Kind::kLocalRoutableAddress) {
        return "routable address: " + Value(report.texts.front());
    }
    std::string line;
    for (const auto& text : report.texts) {
        line += (line.empty() ? "civic info: " : ", ") + std::string(text.name) + " " + Value(text);
    }
    return line;
}

/// A notification of the database updater: a property list behind a header with the id 0.
std::string DatabaseLine(const PortMessage& message) {
    const auto body = platform::PropertyListCreateWithData(message.body);
    const auto text = [&body](const char* key) {
        const PropertyList* const value = body ? body->find(key) : nullptr;
        const auto* const string = value == nullptr ? nullptr : value->as<std::string>();
        return string == nullptr ? std::nullopt : std::optional(*string);
    };
    const auto notification = text("Notification");
    if (message.id != 0 || !notification) {
        return "not understood: message " + std::to_string(message.id) + " of " +
               std::to_string(message.body.size()) + " bytes at " +
               std::string(tools::kDatabasePort);
    }
    const auto type = text("DBType");
    return "database: " + Quoted(*notification) + (type ? ", type " + Quoted(*type) : "");
}

void Say(const std::string& line) {
    (void)std::fprintf(stdout, "%s\n", line.c_str());
}

/// The daemon's side of com.vendra.linefold.server.
class Server {
public:
    Server(NamedPort port, Settings settings)
        : port_(std::move(port)), settings_(std::move(settings)) {}

    [[nodiscard]] int descriptor() const { return port_.descriptor(); }

    void receive() {
        const auto message = port_.receive(0);
        if (!message) {
            return;
        }
        const TelephonyMessage read = tools::ReadTelephonyMessage(*message);
        if (read.isReport()) {
            Say(Line(read));
            waiting_.push_back({.due = Clock::now() + settings_.delay, .report = *message});
        } else if (read.kind == TelephonyMessage::Kind::kUnknown) {
            Say("not understood: message " + std::to_string(message->id) + " of " +
                std::to_string(message->body.size()) + " bytes");
        }
    }

    void answerWhatIsDue() {
        while (!waiting_.empty() && waiting_.front().due <= Clock::now()) {
            answer(waiting_.front().report);
            waiting_.pop_front();
        }
    }

    /// Until the next answer is due; -1 for ever.
    [[nodiscard]] int timeoutMs() const {
        if (waiting_.empty()) {
            return -1;
        }
        const auto left =
            std::chrono::ceil<std::chrono::milliseconds>(waiting_.front().due - Clock::now());
        return static_cast<int>(std::clamp<std::int64_t>(left.count(), 0, 1'000'000));
    }

private:
    struct Waiting {
        Clock::time_point due;
        PortMessage report;
    };

    // Whoever has gone meanwhile gets no answer, and needs none.
    void answer(const PortMessage& report) const {
        if (settings_.notification) {
            (void)tools::NotifySender(port_,
                                      report,
                                      PropertyList(PropertyList::Dictionary{
                                          {"Text", PropertyList(*settings_.notification)}}));
        }
        if (!settings_.isSilent) {
            (void)tools::AnswerReport(port_, report, settings_.status);
        }
    }

    NamedPort port_;
    const Settings settings_;
    std::deque<Waiting> waiting_;
};

void Play(std::optional<Server>& server,
          std::optional<NamedPort>& databases,
          const Termination& termination) {
    std::array<pollfd, 3> states{
        {{.fd = termination.descriptor(), .events = POLLIN, .revents = 0},
         {.fd = server ? server->descriptor() : -1, .events = POLLIN, .revents = 0},
         {.fd = databases ? databases->descriptor() : -1, .events = POLLIN, .revents = 0}}};
    while (states[0].revents == 0) {
        (void)poll(states.data(), states.size(), server ? server->timeoutMs() : -1);
        if (states[1].revents != 0) {
            server->receive();
        }
        if (states[2].revents != 0) {
            if (const auto message = databases->receive(0)) {
                Say(DatabaseLine(*message));
            }
        }
        if (server) {
            server->answerWhatIsDue();
        }
    }
}

}  // namespace

int PlayTelephony(std::span<const std::string_view> words) {
    const auto settings = Parse(words);
    if (!settings) {
        return kUsage;
    }
    const Termination termination;
    std::optional<Server> server;
    if (settings->ownsServer) {
        auto port = NamedPort::own(tools::kTelephonyPort);
        if (!port) {
            return Complain(kRole, "the port " + std::string(tools::kTelephonyPort) + " is taken");
        }
        server.emplace(std::move(*port), *settings);
    }
    std::optional<NamedPort> databases;
    if (settings->ownsDatabases) {
        databases = NamedPort::own(tools::kDatabasePort);
        if (!databases) {
            return Complain(kRole, "the port " + std::string(tools::kDatabasePort) + " is taken");
        }
    }
    Say("ready");
    Play(server, databases, termination);
    return 0;
}

}  // namespace simulator
