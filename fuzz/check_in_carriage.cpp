// Any bytes on a service connection, with any descriptor beside them: an entitled sender gets one
// reply, only a whole check-in makes a client, and nothing is left behind.
#include "Helper/Shared/Server/HelperServerUtils.h"
#include "Helper/Shared/Server/RequestProtocol.h"
#include "fuzz/FuzzedDescriptor.h"
#include "tests/support/TestClient.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto input = std::as_bytes(std::span(data, size));
    if (input.empty()) {
        return 0;
    }
    sim::Reset();
    TestClient::entitleGroup();
    MobileHelperServer* const server = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
    const auto before = sim::OpenDescriptors();
    {
        auto connection =
            sim::Connect({.pid = 100, .uid = 501, .gid = kEntitledGroup}, kServiceName);
        const auto message = input.subspan(1);
        FuzzedDescriptors beside(input[0]);
        Require(connection.send(message, std::move(beside.passed)));
        sim::Settle();
        const auto reply = connection.receive();
        Require(reply.has_value() == (message.size() >= sizeof(platform::MachMsgHeader)));
        const bool isClient = reply.has_value() && !reply->descriptors.empty();
        Require(server->clients.size() == (isClient ? 1U : 0U));
    }
    sim::Settle();
    Require(server->clients.empty());
    sim::ExitProcess(100);
    sim::Settle();
    Require(sim::OpenDescriptors() == before && sim::AllocatedMemory() == 0);
    MobileHelperServerDestroy(server);
    return 0;
}
