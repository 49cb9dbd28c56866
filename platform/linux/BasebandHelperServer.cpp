#include "platform/BasebandHelperServer.h"

#include <string>

#include "platform/BuildConstants.h"
#include "platform/DynamicLibrary.h"
#include "platform/linux/BasebandHelperModule.h"

namespace platform {
namespace {

struct Module {
    DynamicLibrary library =
        DynamicLibrary::open(std::string(kLibraryDirectory) + "/libBasebandHelperServer.so");
    decltype(&LinefoldBasebandHelperCanHost) canHost =
        library.function<int()>("LinefoldBasebandHelperCanHost");
    decltype(&LinefoldBasebandHelperCreate) create =
        library.function<BasebandHelperModuleServer*(void*)>("LinefoldBasebandHelperCreate");
    decltype(&LinefoldBasebandHelperStart) start =
        library.function<void(BasebandHelperModuleServer*)>("LinefoldBasebandHelperStart");
    decltype(&LinefoldBasebandHelperStop) stop =
        library.function<void(BasebandHelperModuleServer*)>("LinefoldBasebandHelperStop");
    decltype(&LinefoldBasebandHelperIsBusy) isBusy =
        library.function<int(BasebandHelperModuleServer*)>("LinefoldBasebandHelperIsBusy");
    decltype(&LinefoldBasebandHelperRelease) release =
        library.function<void(BasebandHelperModuleServer*)>("LinefoldBasebandHelperRelease");

    [[nodiscard]] bool isComplete() const {
        return canHost && create && start && stop && isBusy && release;
    }
};

const Module& TheModule() {
    static const Module module;
    return module;
}

class ModuleServer final : public BasebandHelperServer {
public:
    explicit ModuleServer(BasebandHelperModuleServer* server) : server_(server) {}

    ~ModuleServer() { TheModule().release(server_); }

    ModuleServer(const ModuleServer&) = delete;
    ModuleServer& operator=(const ModuleServer&) = delete;

    [[nodiscard]] BasebandHelperModuleServer* server() const { return server_; }

private:
    BasebandHelperModuleServer* const server_;
};

BasebandHelperModuleServer* ServerOf(BasebandHelperServer& server) {
    return static_cast<ModuleServer&>(server).server();
}

}  // namespace

bool CanHostBasebandHelperServer() {
    return TheModule().isComplete() && TheModule().canHost() != 0;
}

std::shared_ptr<BasebandHelperServer> BasebandHelperServer::create(
    std::shared_ptr<LogServer> /*logServer*/) {
    BasebandHelperModuleServer* const server = TheModule().create(nullptr);
    return server == nullptr ? nullptr : std::make_shared<ModuleServer>(server);
}

void BasebandHelperServer::start() {
    TheModule().start(ServerOf(*this));
}

void BasebandHelperServer::stop() {
    TheModule().stop(ServerOf(*this));
}

bool BasebandHelperServer::isBusy() {
    return TheModule().isBusy(ServerOf(*this)) != 0;
}

}  // namespace platform
