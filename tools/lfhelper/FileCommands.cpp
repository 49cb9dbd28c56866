#include "tools/lfhelper/FileCommands.h"

#include <memory>

namespace lfhelper {
namespace {

struct FreeData {
    void operator()(void* data) const { LFMobileHelperFree(data); }
};

/// The service answers success whether it did it or not; a flag beside that tells.
Answer AnswerOfFlag(std::int32_t code, std::int32_t isDone, const std::string& failure) {
    Answer answer{.code = code};
    if (code == LF_MOBILE_HELPER_SUCCESS) {
        answer.fields.addLiteral("done", isDone != 0 ? "true" : "false");
    }
    if (code == LF_MOBILE_HELPER_SUCCESS && isDone == 0) {
        answer.problem = {
            .name = "NOT_DONE", .text = failure + "; its log tells why", .exitStatus = 1};
    }
    return answer;
}

}  // namespace

Preparation PrepareCopyFile(const CommandLine& line) {
    return {.request = [from = line.operands[0], to = line.operands[1], name = line.operands[2]](
                           LFMobileHelper* helper) {
        std::int32_t isDone = 0;
        const std::int32_t code =
            LFMobileHelperCopyFile(helper, from.c_str(), to.c_str(), name.c_str(), &isDone);
        Answer answer = AnswerOfFlag(
            code, isDone, "the service did not copy " + name + " from " + from + " to " + to);
        answer.fields.add("sourceDirectory", from);
        answer.fields.add("destinationDirectory", to);
        answer.fields.add("item", name);
        return answer;
    }};
}

Preparation PrepareCopyLogDirectory(const CommandLine& line) {
    return {.request = [source = line.operands[0]](LFMobileHelper* helper) {
        std::int32_t isDone = 0;
        const std::int32_t code = LFMobileHelperCopyLogDirectory(helper, source.c_str(), &isDone);
        Answer answer = AnswerOfFlag(code, isDone, "the service did not copy " + source);
        answer.fields.add("source", source);
        return answer;
    }};
}

Preparation PrepareMoveDirectory(const CommandLine& line) {
    return {.request = [source = line.operands[0], to = line.operands[1], name = line.operands[2]](
                           LFMobileHelper* helper) {
        std::int32_t isDone = 0;
        const std::int32_t code =
            LFMobileHelperMoveDirectory(helper, source.c_str(), to.c_str(), name.c_str(), &isDone);
        Answer answer = AnswerOfFlag(
            code, isDone, "the service did not move " + source + " to " + to + " as " + name);
        answer.fields.add("source", source);
        answer.fields.add("destinationDirectory", to);
        answer.fields.add("item", name);
        return answer;
    }};
}

Preparation PrepareCopyArchive(const CommandLine& line) {
    return {.request = [source = line.operands[0],
                        destination = line.operands[1]](LFMobileHelper* helper) {
        std::int32_t isDone = 0;
        const std::int32_t code =
            LFMobileHelperCopyArchive(helper, source.c_str(), destination.c_str(), &isDone);
        Answer answer = AnswerOfFlag(
            code, isDone, "the service did not copy all of " + source + " to " + destination);
        answer.fields.add("source", source);
        answer.fields.add("destination", destination);
        return answer;
    }};
}

Preparation PrepareLoadPlist(const CommandLine& line) {
    return {.request = [path = line.operands[0]](LFMobileHelper* helper) {
        void* data = nullptr;
        std::size_t size = 0;
        Answer answer{.code = LFMobileHelperLoadPlistFile(helper, path.c_str(), &data, &size)};
        const std::unique_ptr<void, FreeData> owner(data);
        if (answer.code == LF_MOBILE_HELPER_SUCCESS && data == nullptr) {
            answer.code = LF_MOBILE_HELPER_ERROR_INVALID_REPLY;  // a dictionary is never absent
        }
        answer.fields.add("path", path);
        if (answer.code == LF_MOBILE_HELPER_SUCCESS) {
            answer.text.assign(static_cast<const char*>(data), size);
            answer.fields.add("plist", answer.text);
        }
        return answer;
    }};
}

}  // namespace lfhelper
