#include "tools/lfhelper/RadioCommands.h"

#include <optional>

#include "tools/lfhelper/ParseNumber.h"

namespace lfhelper {
namespace {

std::optional<std::int32_t> ParseSwitch(const std::string& text) {
    if (text == "on" || text == "off") {
        return text == "on" ? 1 : 0;
    }
    return ParseNumber<std::int32_t>(text);
}

}  // namespace

Preparation PrepareRadioLogging(const CommandLine& line) {
    const auto isEnabled = ParseSwitch(line.operands[0]);
    if (!isEnabled) {
        return {.error = "the operand must be on, off or a number of 32 bits, not \"" +
                         line.operands[0] + "\""};
    }
    return {.request = [isEnabled = *isEnabled](LFMobileHelper* helper) {
        Answer answer{.code = LFMobileHelperSetRadioManagerLogging(helper, isEnabled)};
        answer.fields.add("enable", std::int64_t{isEnabled});
        return answer;
    }};
}

}  // namespace lfhelper
