// The wiring of the daemon: the co-hosted helper, the server, its run, and the exit status.
#include "Helper/Shared/Server/HelperServerUtils.h"
#include "Helper/Shared/Server/MessageLayouts.h"
#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/BasebandHelperServer.h"
#include "platform/Log.h"
#include "platform/Process.h"
#include "platform/SerialQueue.h"

using namespace platform;

namespace {

std::shared_ptr<BasebandHelperServer> StartBasebandServer() {
    if (!CanHostBasebandHelperServer()) {
        return nullptr;
    }
    auto baseband = BasebandHelperServer::create(nullptr);
    if (baseband != nullptr) {
        baseband->start();
    }
    return baseband;
}

int RunServer(const std::shared_ptr<BasebandHelperServer>& baseband) {
    MobileHelperServer* const server = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
    if (server == nullptr) {
        return 1;
    }
    if (baseband != nullptr) {
        MobileHelperServerSetIdleHandler(server, [baseband] { return baseband->isBusy(); });
    }
    ProcessOnTerminationRequest([server] { MobileHelperServerStop(server); });
    MobileHelperServerRun(server);
    MobileHelperServerDestroy(server);
    return 0;
}

}  // namespace

int main() {
    ProcessSettleIn();
    auto baseband = StartBasebandServer();
    const int status = RunServer(baseband);
    if (baseband != nullptr) {
        baseband->stop();
    }
    if (status == 1) {
        Log(LogLevel::kError, "unable to startup LinefoldMobileHelper server");
    }
    baseband = nullptr;
    SerialQueuesStop();
    return status;
}
