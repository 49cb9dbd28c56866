// Tokens are secrets: but for the one that was asked for, no output holds one.
#include "tools/lfhelper/VoicemailCommands.h"

#include <array>
#include <optional>
#include <string>

#include "tools/lfhelper/StandardInput.h"

namespace lfhelper {
namespace {

/// More than any token; the library says what is too long.
constexpr std::size_t kMostInput = 4096;

using Key = std::optional<std::string>;

JsonObject FieldsOf(const Key& key) {
    JsonObject fields;
    if (key) {
        fields.add("key", *key);
    }
    return fields;
}

Answer SetToken(LFMobileHelper* helper, const Key& key, const std::string& token) {
    const std::int32_t code =
        key ? LFMobileHelperSetVoicemailTokenForKey(helper, key->c_str(), token.c_str())
            : LFMobileHelperSetVoicemailToken(helper, token.c_str());
    return {.code = code, .fields = FieldsOf(key)};
}

Answer GetToken(LFMobileHelper* helper, const Key& key) {
    std::array<char, LF_MOBILE_HELPER_TOKEN_SIZE> token{};
    Answer answer{.fields = FieldsOf(key)};
    answer.code = key ? LFMobileHelperCopyVoicemailTokenForKey(helper, key->c_str(), token.data())
                      : LFMobileHelperCopyVoicemailToken(helper, token.data());
    if (answer.code != LF_MOBILE_HELPER_SUCCESS) {
        return answer;
    }
    if (token.front() == '\0') {
        answer.absence = "there is no token" + (key ? " under the key \"" + *key + "\"" : "") +
                         ", or it is too long to be read";
        answer.fields.addNull("token");
    } else {
        answer.text = std::string(token.data()) + "\n";
        answer.fields.add("token", token.data());
    }
    return answer;
}

Answer IsSubscribed(LFMobileHelper* helper) {
    std::int32_t isSubscribed = 0;
    Answer answer{.code = LFMobileHelperIsVoicemailSubscribed(helper, &isSubscribed)};
    if (answer.code == LF_MOBILE_HELPER_SUCCESS) {
        answer.text = isSubscribed != 0 ? "subscribed\n" : "not subscribed\n";
        answer.fields.addLiteral("subscribed", isSubscribed != 0 ? "true" : "false");
    }
    return answer;
}

}  // namespace

Preparation PrepareVoicemailSetToken(const CommandLine& line) {
    const Input token = ReadOperand(line.operands[0], kMostInput, LastLineFeed::kDropped);
    if (!token.error.empty()) {
        return {.error = token.error};
    }
    if (token.content.find('\0') != std::string::npos) {
        return {.error = "TOKEN must be a text without NUL"};
    }
    return {.request = [key = line.value("key"), token = token.content](LFMobileHelper* helper) {
        return SetToken(helper, key, token);
    }};
}

Preparation PrepareVoicemailGetToken(const CommandLine& line) {
    return {.request = [key = line.value("key")](LFMobileHelper* helper) {
        return GetToken(helper, key);
    }};
}

Preparation PrepareVoicemailClearToken(const CommandLine& /*line*/) {
    return {.request = [](LFMobileHelper* helper) {
        return Answer{.code = LFMobileHelperClearVoicemailToken(helper)};
    }};
}

Preparation PrepareVoicemailRemoveAll(const CommandLine& /*line*/) {
    return {.request = [](LFMobileHelper* helper) {
        return Answer{.code = LFMobileHelperRemoveAllVoicemailRecords(helper)};
    }};
}

Preparation PrepareVoicemailIsSubscribed(const CommandLine& /*line*/) {
    return {.request = IsSubscribed};
}

}  // namespace lfhelper
