// The service: its socket, and whether somebody answers behind it.
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <future>
#include <memory>
#include <optional>
#include <thread>

#include "client/linefold_helper.h"
#include "tools/lfhelper/EntitledGroup.h"
#include "tools/lfhelper/doctor/Checks.h"
#include "tools/lfhelper/doctor/FileFacts.h"

namespace lfhelper::doctor {
namespace {

constexpr const char* kSocket = "service-socket";
constexpr const char* kFolder = "service-folder";
constexpr const char* kAnswer = "service-answer";
constexpr const char* kStart = "systemctl restart linefold-mobile-helper.socket";
constexpr const char* kReadLog = "see journalctl -u linefold-mobile-helper";
constexpr std::chrono::seconds kPatience{5};

struct DestroyHelper {
    void operator()(LFMobileHelper* helper) const { LFMobileHelperDestroy(helper); }
};

Finding JudgeSocket(const std::string& path, const FileFacts& facts) {
    constexpr mode_t kOpenToAll = S_IWUSR | S_IWGRP | S_IWOTH;
    if (facts.isUnseen()) {
        return Note(kSocket, path + " cannot be seen: " + facts.error, "run this as root");
    }
    if (facts.isAbsent()) {
        return Problem(kSocket, path + " is not there", kStart);
    }
    if (!facts.is(S_IFSOCK)) {
        return Problem(kSocket,
                       path + " is " + KindOf(facts) + " and not a socket",
                       "remove it; " + std::string(kStart));
    }
    if (facts.owner != 0) {
        return Problem(kSocket,
                       path + " belongs to user " + std::to_string(facts.owner) +
                           " and not to root: who answers there is not the service",
                       "stop that user's program; " + std::string(kStart));
    }
    if ((facts.mode & kOpenToAll) != kOpenToAll) {
        return Problem(kSocket, path + " is not open to all callers", "chmod 666 '" + path + "'");
    }
    return Ok(kSocket, path + " is a socket of root's, open to all callers");
}

/// The result of a check-in; none when there is none in time.
std::optional<std::int32_t> CheckIn(const std::string& path) {
    const auto result = std::make_shared<std::promise<std::int32_t>>();
    auto code = result->get_future();
    // A service that never answers would hold us for ever; this thread ends with the process.
    std::thread([result, path] {
        const std::unique_ptr<LFMobileHelper, DestroyHelper> helper(
            LFMobileHelperCreateWithPath(path.c_str()));
        result->set_value(LFMobileHelperCheckIn(helper.get()));
    }).detach();
    return code.wait_for(kPatience) == std::future_status::ready ? std::optional(code.get())
                                                                 : std::nullopt;
}

Finding JudgeAnswer(const Subject& subject, bool hasGroup, std::optional<std::int32_t> code) {
    if (!code) {
        return Problem(kAnswer, "the service does not answer within 5 seconds", kReadLog);
    }
    if (*code == LF_MOBILE_HELPER_SUCCESS) {
        return Ok(kAnswer, "the service answers, and takes this caller");
    }
    if (*code == LF_MOBILE_HELPER_NOT_ENTITLED && !hasGroup) {
        return Note(kAnswer,
                    "the service answers, but does not take this caller, who is not in the group " +
                        subject.group,
                    "run this as root");
    }
    if (*code == LF_MOBILE_HELPER_NOT_ENTITLED) {
        return Problem(kAnswer,
                       "the service answers, but does not take this caller: the group " +
                           subject.group + " is not entitled",
                       "mend what the lines above say about the entitlement");
    }
    return Problem(kAnswer,
                   "the service cannot be used: " + std::string(LFMobileHelperErrorString(*code)),
                   kReadLog);
}

}  // namespace

Findings CheckServiceSocket(const Subject& subject) {
    const std::string& path = subject.servicePath;
    const FileFacts folder = LookAt(path.substr(0, path.rfind('/')), Links::kFollowed);
    Findings findings{JudgeSocket(path, LookAt(path))};
    if (const std::string why = folder.isThere() ? WhyNotRootsOwn(folder, S_IFDIR) : "";
        !why.empty()) {
        const std::string name = path.substr(0, path.rfind('/'));
        findings.push_back(Problem(kFolder, name + " " + why, MakeRootsOwn(name)));
    }
    return findings;
}

Findings CheckAnswer(const Subject& subject) {
    if (!LookAt(subject.servicePath).is(S_IFSOCK)) {
        return {};  // that there is none has been said
    }
    const bool hasGroup = !TakeEntitledGroup(subject.group).has_value();
    return {JudgeAnswer(subject, hasGroup, CheckIn(subject.servicePath))};
}

}  // namespace lfhelper::doctor
