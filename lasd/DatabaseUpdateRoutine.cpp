// The check for newer service databases.
#include "Helper/Shared/Server/HelperServerUtils.h"
#include "Helper/Shared/Server/RequestProtocol.h"
#include "lasd/LASDUpdater.h"
#include "platform/Assertion.h"

kern_return_t server_LFMobileHelperCheckForDatabaseUpdate(mach_port_t port, std::int32_t types) {
    // Requests arrive on ports that a check-in made, and these have a server for as long as they
    // are served.
    MobileHelperServer* const server = ServerForPort(port);
    PLATFORM_ASSERT(server != nullptr);
    LASDUpdater::shared().checkForUpdate(server, static_cast<std::uint32_t>(types));
    return platform::KERN_SUCCESS;
}
