#include "tools/lfhelper/PreferenceCommands.h"

#include <memory>

#include "tools/lfhelper/PreferenceValue.h"
#include "tools/lfhelper/StandardInput.h"

namespace lfhelper {
namespace {

struct FreeData {
    void operator()(void* data) const { LFMobileHelperFree(data); }
};

struct Place {
    std::string domain;
    std::string key;
};

Place PlaceOf(const CommandLine& line) {
    return {.domain = line.operands[0], .key = line.operands[1]};
}

JsonObject FieldsOf(const Place& place) {
    JsonObject fields;
    fields.add("domain", place.domain);
    fields.add("key", place.key);
    return fields;
}

Answer AnswerOfAbsence(const Place& place) {
    Answer answer{.fields = FieldsOf(place),
                  .absence = "there is no value of \"" + place.key + "\" in " + place.domain};
    answer.fields.addNull("type");
    answer.fields.addNull("value");
    return answer;
}

using CopyValue = decltype(&LFMobileHelperCopyPreferenceValue);

Answer GetValue(LFMobileHelper* helper, CopyValue copyValue, const Place& place, ValueForm form) {
    void* data = nullptr;
    std::size_t size = 0;
    const std::int32_t code =
        copyValue(helper, place.domain.c_str(), place.key.c_str(), &data, &size);
    const std::unique_ptr<void, FreeData> owner(data);
    if (code != LF_MOBILE_HELPER_SUCCESS) {
        return {.code = code, .fields = FieldsOf(place)};
    }
    if (data == nullptr) {
        return AnswerOfAbsence(place);
    }
    auto shown = ShowValue({static_cast<const char*>(data), size}, form);
    if (!shown) {
        return {.code = LF_MOBILE_HELPER_ERROR_INVALID_REPLY, .fields = FieldsOf(place)};
    }
    Answer answer{.text = std::move(shown->text), .fields = FieldsOf(place)};
    answer.fields.append(shown->fields);
    return answer;
}

}  // namespace

Preparation PreparePreferencesGet(const CommandLine& line) {
    const CopyValue copyValue = line.has("application") ? LFMobileHelperCopyAppPreferenceValue
                                                        : LFMobileHelperCopyPreferenceValue;
    const ValueForm form = line.has("plist") ? ValueForm::kPlist : ValueForm::kPlain;
    return {.request = [copyValue, form, place = PlaceOf(line)](LFMobileHelper* helper) {
        return GetValue(helper, copyValue, place, form);
    }};
}

Preparation PreparePreferencesSet(const CommandLine& line) {
    const auto type = FindValueType(line.value("type").value_or("string"));
    if (!type) {
        return {.error = "the value of --type must be one of " + ValueTypeNames()};
    }
    const bool isText = *type != ValueType::kPlist;
    const Input value = ReadOperand(line.operands[2],
                                    LF_MOBILE_HELPER_MAX_VALUE_SIZE,
                                    isText ? LastLineFeed::kDropped : LastLineFeed::kKept);
    if (!value.error.empty()) {
        return {.error = value.error};
    }
    const SerializedValue serialized = SerializeValue(*type, value.content);
    if (!serialized.error.empty()) {
        return {.error = serialized.error};
    }
    return {.request = [bytes = serialized.bytes, place = PlaceOf(line)](LFMobileHelper* helper) {
        return Answer{
            .code = LFMobileHelperSetPreferenceValue(
                helper, place.domain.c_str(), place.key.c_str(), bytes.data(), bytes.size()),
            .fields = FieldsOf(place)};
    }};
}

Preparation PreparePreferencesRemove(const CommandLine& line) {
    return {.request = [place = PlaceOf(line)](LFMobileHelper* helper) {
        return Answer{.code = LFMobileHelperRemovePreferenceValue(
                          helper, place.domain.c_str(), place.key.c_str()),
                      .fields = FieldsOf(place)};
    }};
}

}  // namespace lfhelper
