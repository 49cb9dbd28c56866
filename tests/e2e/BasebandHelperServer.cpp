// A baseband helper for the tests: it writes down what it is asked, and is told by files what to
// answer. /run/baseband/busy makes it busy, /run/baseband/decline and /run/baseband/refuse say no.
#include <unistd.h>

#include <fstream>

#include "platform/linux/BasebandHelperModule.h"

struct BasebandHelperModuleServer {};

namespace {

bool IsTold(const char* path) {
    return access(path, F_OK) == 0;
}

void Note(const char* what) {
    std::ofstream("/run/baseband/journal", std::ios::app) << what << '\n';
}

}  // namespace

#define MODULE_EXPORT extern "C" __attribute__((visibility("default")))

MODULE_EXPORT int LinefoldBasebandHelperCanHost() {
    return IsTold("/run/baseband/refuse") ? 0 : 1;
}

MODULE_EXPORT BasebandHelperModuleServer* LinefoldBasebandHelperCreate(void* logServer) {
    Note(logServer == nullptr ? "create without log server" : "create");
    return IsTold("/run/baseband/decline") ? nullptr : new BasebandHelperModuleServer;
}

MODULE_EXPORT void LinefoldBasebandHelperStart(BasebandHelperModuleServer* /*server*/) {
    Note("start");
}

MODULE_EXPORT void LinefoldBasebandHelperStop(BasebandHelperModuleServer* /*server*/) {
    Note("stop");
}

MODULE_EXPORT int LinefoldBasebandHelperIsBusy(BasebandHelperModuleServer* /*server*/) {
    const bool isBusy = IsTold("/run/baseband/busy");
    Note(isBusy ? "busy" : "not busy");
    return isBusy ? 1 : 0;
}

MODULE_EXPORT void LinefoldBasebandHelperRelease(BasebandHelperModuleServer* server) {
    Note("release");
    delete server;
}
