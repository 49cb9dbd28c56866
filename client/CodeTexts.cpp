// What every documented code is called and means.
#include <algorithm>
#include <array>

#include "client/linefold_helper.h"

namespace {

struct CodeText {
    int32_t code;
    const char* name;
    const char* meaning;
};

// clang-format off
constexpr std::array<CodeText, 22> kCodeTexts{{
    {LF_MOBILE_HELPER_SUCCESS,                 "SUCCESS",                 "success"},
    {LF_MOBILE_HELPER_NO_SPACE,                "NO_SPACE",                "the service has no memory for its answer"},
    {LF_MOBILE_HELPER_FAILURE,                 "FAILURE",                 "the operation failed, or an argument is not UTF-8 or no property list"},
    {LF_MOBILE_HELPER_RESOURCE_SHORTAGE,       "RESOURCE_SHORTAGE",       "the service is at a limit of memory, descriptors or size"},
    {LF_MOBILE_HELPER_NO_ACCESS,               "NO_ACCESS",               "the path is not one that the service may change"},
    {LF_MOBILE_HELPER_NO_DATA,                 "NO_DATA",                 "the property-list file is missing or holds no dictionary"},
    {LF_MOBILE_HELPER_NOT_ENTITLED,            "NOT_ENTITLED",            "the group of the caller is not entitled to use the service"},
    {LF_MOBILE_HELPER_TYPE_ERROR,              "TYPE_ERROR",              "a descriptor has the wrong type, or two sizes in the message disagree"},
    {LF_MOBILE_HELPER_BAD_ID,                  "BAD_ID",                  "no routine has this message id"},
    {LF_MOBILE_HELPER_BAD_ARGUMENTS,           "BAD_ARGUMENTS",           "the message has the wrong size or form, or what must come beside it is missing or unusable"},
    {LF_MOBILE_HELPER_TRAILER_ERROR,           "TRAILER_ERROR",           "the trailer of the message does not say who sent it"},
    {LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT,  "ERROR_INVALID_ARGUMENT",  "an argument is NULL that must not be"},
    {LF_MOBILE_HELPER_ERROR_NO_SERVICE,        "ERROR_NO_SERVICE",        "there is no service at this path, or it does not take connections"},
    {LF_MOBILE_HELPER_ERROR_PATH_TOO_LONG,     "ERROR_PATH_TOO_LONG",     "the path of the service is longer than a socket address holds"},
    {LF_MOBILE_HELPER_ERROR_NO_PERMISSION,     "ERROR_NO_PERMISSION",     "this process may not connect to the path of the service"},
    {LF_MOBILE_HELPER_ERROR_NOT_A_SERVICE,     "ERROR_NOT_A_SERVICE",     "what is at the path of the service is not a socket for messages"},
    {LF_MOBILE_HELPER_ERROR_NO_RESOURCES,      "ERROR_NO_RESOURCES",      "no memory, descriptors or buffers are left for this call"},
    {LF_MOBILE_HELPER_ERROR_ARGUMENT_TOO_LONG, "ERROR_ARGUMENT_TOO_LONG", "an argument is too long for its field; nothing was sent"},
    {LF_MOBILE_HELPER_ERROR_REPLY_TOO_LARGE,   "ERROR_REPLY_TOO_LARGE",   "the reply is larger than the buffer for it"},
    {LF_MOBILE_HELPER_ERROR_INVALID_REPLY,     "ERROR_INVALID_REPLY",     "the reply breaks the protocol; the request may have been carried out"},
    {LF_MOBILE_HELPER_ERROR_CONNECTION_LOST,   "ERROR_CONNECTION_LOST",   "the connection ended before the reply; the request may have been carried out"},
}};

// clang-format on

const CodeText* FindCodeText(int32_t code) {
    const auto found = std::ranges::find(kCodeTexts, code, &CodeText::code);
    return found == kCodeTexts.end() ? nullptr : &*found;
}

}  // namespace

const char* LFMobileHelperErrorString(int32_t code) {
    const CodeText* const text = FindCodeText(code);
    return text == nullptr ? "a code that is not documented" : text->meaning;
}

const char* LFMobileHelperErrorName(int32_t code) {
    const CodeText* const text = FindCodeText(code);
    return text == nullptr ? "UNKNOWN" : text->name;
}
