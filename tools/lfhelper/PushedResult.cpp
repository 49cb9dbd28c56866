#include "tools/lfhelper/PushedResult.h"

#include <algorithm>
#include <chrono>
#include <cstdio>

namespace lfhelper {
namespace {

using Clock = std::chrono::steady_clock;

int MillisecondsUntil(Clock::time_point end) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(end - Clock::now()).count();
    return static_cast<int>(std::max<std::int64_t>(left, 0));
}

/// What goes wrong while the service answered well.
Answer WithProblem(std::string_view name,
                   const std::string& text,
                   int exitStatus,
                   Answer answer = {}) {
    answer.problem = {.name = std::string(name), .text = text, .exitStatus = exitStatus};
    return answer;
}

}  // namespace

Answer AwaitPushedResult(LFMobileHelper* helper, const PushedResult& result) {
    const std::string name(result.port);
    auto port = tools::NamedPort::own(name);
    if (!port) {
        return WithProblem("PORT_NOT_FREE",
                           "cannot wait in the telephony daemon's place: somebody owns the port " +
                               name + ", or it cannot be had; nothing was asked",
                           3);
    }
    Answer asked = result.ask(helper);
    if (asked.code != LF_MOBILE_HELPER_SUCCESS) {
        return asked;
    }
    const std::string seconds = std::to_string(result.secondsMax);
    (void)std::fprintf(stderr,
                       "lfhelper: waiting for the result at %s, at most %s seconds\n",
                       name.c_str(),
                       seconds.c_str());
    const auto end = Clock::now() + std::chrono::seconds(result.secondsMax);
    // A message may be none of ours, and a signal may come: neither is the end of the time.
    while (Clock::now() < end) {
        const auto message = port->receive(MillisecondsUntil(end));
        if (!message) {
            continue;
        }
        if (auto answer = result.take(*port, *message)) {
            answer->fields.append(asked.fields);
            return std::move(*answer);
        }
    }
    return WithProblem(
        "NO_RESULT",
        "the service took the request, and no result came within " + seconds + " seconds",
        1,
        std::move(asked));
}

}  // namespace lfhelper
