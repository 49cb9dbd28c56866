// Updates of the service databases, and their outcomes.
//
// A check for several types does not tell how many outcomes it will have: there is one for each
// type that is updated or fails, none for one that is up to date beside others, and a failure does
// not name its type. So whoever waits asks for one type after the other, and each of these checks
// has one outcome, whichever it is.
#include "tools/lfhelper/UpdateCommands.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <memory>
#include <optional>
#include <system_error>
#include <utility>

#include "platform/PropertyList.h"
#include "tools/TelephonyPort.h"
#include "tools/lfhelper/PushedResult.h"

namespace lfhelper {
namespace {

constexpr int kSecondsMax = 300;
constexpr int kSecondsLimit = 86'400;
constexpr std::string_view kNotificationPrefix = "com.vendra.lasd.";

struct Type {
    std::string_view name;
    std::uint32_t bit;
};

/// In the service's own order.
constexpr std::array<Type, 5> kTypes{
    {{"gsm", 8}, {"umts", 1}, {"cdma", 2}, {"lte", 4}, {"scdma", 16}}};

constexpr std::uint32_t kAllTypes = 31;

template <typename Number>
std::optional<Number> ParseNumber(std::string_view text, int base = 10) {
    Number number{};
    const char* const end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, number, base);
    return error == std::errc{} && rest == end ? std::optional(number) : std::nullopt;
}

std::optional<std::uint32_t> ParseMask(std::string_view text) {
    const bool isHexadecimal = text.starts_with("0x") || text.starts_with("0X");
    return isHexadecimal ? ParseNumber<std::uint32_t>(text.substr(2), 16)
                         : ParseNumber<std::uint32_t>(text);
}

/// Names with commas between them, "all", or a number.
std::optional<std::uint32_t> ParseTypes(std::string_view text) {
    if (text == "all") {
        return kAllTypes;
    }
    if (const auto mask = ParseMask(text)) {
        return mask;
    }
    std::uint32_t mask = 0;
    for (;;) {
        const auto comma = text.find(',');
        const auto* const type = std::ranges::find(kTypes, text.substr(0, comma), &Type::name);
        if (type == kTypes.end()) {
            return std::nullopt;
        }
        mask |= type->bit;
        if (comma == std::string_view::npos) {
            return mask;
        }
        text.remove_prefix(comma + 1);
    }
}

/// One check to be made and waited for.
struct Check {
    std::string name;
    std::uint32_t mask = 0;
};

/// A mask without any of the types is still one check.
std::vector<Check> ChecksOf(std::uint32_t mask) {
    std::vector<Check> checks;
    for (const Type& type : kTypes) {
        if ((type.bit & mask) != 0) {
            checks.push_back({.name = std::string(type.name), .mask = type.bit});
        }
    }
    if (checks.empty()) {
        checks.push_back({.name = "none of the types", .mask = mask});
    }
    return checks;
}

const std::string* TextIn(const platform::PropertyList& list, std::string_view key) {
    const auto* const value = list.find(key);
    return value == nullptr ? nullptr : value->as<std::string>();
}

/// What the service says of a check for one type, without the prefix that all have; none when the
/// message is no notification, or one of another type that somebody had asked for before.
std::optional<std::string> OutcomeIn(const tools::PortMessage& message, std::string_view type) {
    const auto list = platform::PropertyListCreateWithData(message.body);
    const auto* const text = list ? TextIn(*list, "Notification") : nullptr;
    if (message.id != 0 || text == nullptr || !text->starts_with(kNotificationPrefix)) {
        return std::nullopt;
    }
    const auto* const toldType = TextIn(*list, "DBType");
    if (toldType != nullptr && *toldType != type) {
        return std::nullopt;
    }
    return text->substr(kNotificationPrefix.size());
}

std::string MeaningOf(const std::string& outcome) {
    if (outcome == "UpdateAvailable") {
        return "updated";
    }
    if (outcome == "NoUpdateRequired") {
        return "no update required";
    }
    return outcome == "UpdateFailed" ? "the update failed" : outcome;
}

bool IsGood(const std::string& outcome) {
    return outcome == "UpdateAvailable" || outcome == "NoUpdateRequired";
}

Answer AskFor(LFMobileHelper* helper, std::uint32_t mask) {
    return {.code = LFMobileHelperCheckForDatabaseUpdate(helper, static_cast<std::int32_t>(mask))};
}

/// The checks of one command, made and answered one after the other.
class Checks {
public:
    explicit Checks(std::vector<Check> checks) : checks_(std::move(checks)) {}

    Answer ask(LFMobileHelper* helper) {
        helper_ = helper;
        return AskFor(helper_, checks_.at(outcomes_.size()).mask);
    }

    /// Asks for the next type, or ends the command with a success or the refusal of the service.
    std::optional<Answer> take(const tools::PortMessage& message) {
        auto outcome = OutcomeIn(message, checks_.at(outcomes_.size()).name);
        if (!outcome) {
            return std::nullopt;
        }
        outcomes_.push_back(std::move(*outcome));
        if (outcomes_.size() == checks_.size()) {
            return Answer{};
        }
        Answer asked = ask(helper_);
        return asked.code == LF_MOBILE_HELPER_SUCCESS ? std::nullopt : std::optional(asked);
    }

    /// Adds what has come to the command's answer, however that ended.
    void complete(Answer& answer) const {
        JsonObject outcomes;
        std::string failed;
        for (std::size_t i = 0; i < outcomes_.size(); ++i) {
            const std::string& name = checks_[i].name;
            answer.text += name + ": " + MeaningOf(outcomes_[i]) + "\n";
            outcomes.add(name, outcomes_[i]);
            if (!IsGood(outcomes_[i])) {
                failed += (failed.empty() ? "" : ", ") + name;
            }
        }
        answer.fields.add("outcomes", outcomes);
        if (!failed.empty() && answer.problem.text.empty()) {
            answer.problem = {.name = "UPDATE_FAILED",
                              .text = "failed: " + failed + "; the service's log tells why",
                              .exitStatus = 1};
        }
    }

private:
    const std::vector<Check> checks_;
    std::vector<std::string> outcomes_;
    LFMobileHelper* helper_ = nullptr;
};

Answer UpdateAndWait(LFMobileHelper* helper, std::uint32_t mask, int secondsMax) {
    Checks checks(ChecksOf(mask));
    Answer answer = AwaitPushedResult(
        helper,
        {.port = tools::kDatabasePort,
         .secondsMax = secondsMax,
         .ask = [&checks](LFMobileHelper* asked) { return checks.ask(asked); },
         .take = [&checks](tools::NamedPort& /*port*/,
                           const tools::PortMessage& message) { return checks.take(message); }});
    checks.complete(answer);
    return answer;
}

}  // namespace

Preparation PrepareUpdateDatabases(const CommandLine& line) {
    const auto mask = ParseTypes(line.value("types").value_or("all"));
    if (!mask) {
        return {.error =
                    "the value of --types must be names of gsm, umts, cdma, lte and scdma with "
                    "commas between them, or all, or a mask"};
    }
    const auto seconds =
        ParseNumber<int>(line.value("timeout").value_or(std::to_string(kSecondsMax)));
    if (!seconds || *seconds < 1 || *seconds > kSecondsLimit) {
        return {.error = "the value of --timeout must be a number of seconds from 1 to 86400"};
    }
    if (!line.has("wait")) {
        return {.request = [mask](LFMobileHelper* helper) { return AskFor(helper, *mask); }};
    }
    return {.request = [mask, seconds](LFMobileHelper* helper) {
        return UpdateAndWait(helper, *mask, *seconds);
    }};
}

}  // namespace lfhelper
