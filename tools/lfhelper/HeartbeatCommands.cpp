#include "tools/lfhelper/HeartbeatCommands.h"

namespace lfhelper {

Preparation PrepareHeartbeat(const CommandLine& line) {
    const std::string& state = line.operands[0];
    if (state != "on" && state != "off") {
        return {.error = "STATE must be on or off, not \"" + state + "\""};
    }
    return {.request = [state](LFMobileHelper* helper) {
        Answer answer{.code = LFMobileHelperSetHeartbeatEnabled(helper, state == "on" ? 1 : 0)};
        answer.fields.add("state", state);
        return answer;
    }};
}

}  // namespace lfhelper
