/* The public header must serve a plain C99 program; the calls here are made by the C++ tests. */
#include "client/linefold_helper.h"

const char* LFTestErrorNameFromC(int32_t code);
int32_t LFTestCallFromC(void);

const char* LFTestErrorNameFromC(int32_t code) {
    return LFMobileHelperErrorName(code);
}

int32_t LFTestCallFromC(void) {
    char token[LF_MOBILE_HELPER_TOKEN_SIZE] = "before";
    LFMobileHelper* helper = LFMobileHelperCreateWithPath("/nonexistent/service");
    int32_t code = LFMobileHelperCopyVoicemailToken(helper, token);
    LFMobileHelperDestroy(helper);
    return token[0] == '\0' ? code : -1;
}
