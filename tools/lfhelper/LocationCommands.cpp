#include "tools/lfhelper/LocationCommands.h"

#include <array>
#include <charconv>
#include <optional>
#include <system_error>

#include "tools/TelephonyPort.h"
#include "tools/lfhelper/PushedResult.h"

namespace lfhelper {
namespace {

using tools::TelephonyMessage;

std::optional<double> ParseDegrees(std::string_view text) {
    double degrees = 0;
    const char* const end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, degrees);
    return error == std::errc{} && rest == end ? std::optional(degrees) : std::nullopt;
}

/// The key of a message as programs find it in our JSON: "countryCode".
std::string JsonKey(std::string_view key) {
    std::string name(key);
    name.front() = static_cast<char>(name.front() - 'A' + 'a');
    return name;
}

/// The texts of a report, one line each for people.
Answer AnswerOfReport(const TelephonyMessage& report) {
    Answer answer;
    for (const auto& text : report.texts) {
        answer.text += std::string(text.name) + ": " + text.value.value_or("(absent)") + "\n";
        if (text.value) {
            answer.fields.add(JsonKey(text.key), *text.value);
        } else {
            answer.fields.addNull(JsonKey(text.key));
        }
    }
    return answer;
}

/// Makes a request and, when asked to, waits for the report that it brings about.
Request RequestOfReport(const CommandLine& line, TelephonyMessage::Kind kind, Request ask) {
    if (!line.has("wait")) {
        return ask;
    }
    PushedResult result{.port = tools::kTelephonyPort, .ask = std::move(ask), .take = {}};
    result.take = [kind](tools::NamedPort& port,
                         const tools::PortMessage& message) -> std::optional<Answer> {
        const TelephonyMessage report = tools::ReadTelephonyMessage(message);
        if (report.isReport()) {
            (void)tools::AnswerReport(port, message, {});  // it may have gone: the report is here
        }
        return report.kind == kind ? std::optional(AnswerOfReport(report)) : std::nullopt;
    };
    return [result](LFMobileHelper* helper) { return AwaitPushedResult(helper, result); };
}

}  // namespace

Preparation PrepareCountryCode(const CommandLine& /*line*/) {
    return {.request = [](LFMobileHelper* helper) {
        std::array<char, LF_MOBILE_HELPER_COUNTRY_CODE_SIZE> countryCode{};
        Answer answer{.code = LFMobileHelperCopyCountryCode(helper, countryCode.data())};
        if (answer.code == LF_MOBILE_HELPER_SUCCESS) {
            const std::string text = countryCode.data();
            answer.text = text.empty() ? "" : text + "\n";
            answer.absence = text.empty() ? "the service has no country code" : "";
            answer.fields.add("countryCode", text);
        }
        return answer;
    }};
}

Preparation PrepareCivicAddress(const CommandLine& line) {
    const auto latitude = ParseDegrees(line.operands[0]);
    const auto longitude = ParseDegrees(line.operands[1]);
    if (!latitude || !longitude) {
        return {.error = "LATITUDE and LONGITUDE must be decimal numbers of degrees"};
    }
    return {.request = RequestOfReport(
                line,
                TelephonyMessage::Kind::kCivicInfo,
                [latitude = *latitude, longitude = *longitude](LFMobileHelper* helper) {
                    return Answer{.code = LFMobileHelperRequestCountryCodeFromLocation(
                                      helper, latitude, longitude)};
                })};
}

Preparation PrepareWanIp(const CommandLine& line) {
    return {.request = RequestOfReport(
                line, TelephonyMessage::Kind::kLocalRoutableAddress, [](LFMobileHelper* helper) {
                    return Answer{.code = LFMobileHelperRequestWanIPFromLocation(helper)};
                })};
}

}  // namespace lfhelper
