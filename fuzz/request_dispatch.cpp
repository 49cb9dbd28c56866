// Any bytes on a client's private port, with any descriptor beside them: one reply each, of a
// documented shape, and nothing is left behind.
#include "Helper/Shared/Server/HelperServerUtils.h"
#include "Helper/Shared/Server/RequestProtocol.h"
#include "fuzz/FuzzedDescriptor.h"
#include "tests/support/TestClient.h"

namespace {

/// A server with one client that has checked in.
struct Service {
    Service() {
        sim::Reset();
        TestClient::entitleGroup();
        server = MobileHelperServerCreate(kServiceName, kRequestSubsystem);
        Require(client.checkIn() == platform::KERN_SUCCESS);
        descriptors = sim::OpenDescriptors();
    }

    ~Service() {
        client.closeAll();
        sim::Settle();
        MobileHelperServerDestroy(server);
    }

    MobileHelperServer* server = nullptr;
    TestClient client;
    std::size_t descriptors = 0;
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto input = std::as_bytes(std::span(data, size));
    if (input.empty()) {
        return 0;
    }
    Service service;
    const auto request = input.subspan(1);
    FuzzedDescriptors beside(input[0]);
    const auto reply =
        service.client.call({request.begin(), request.end()}, std::move(beside.passed));
    Require(reply.has_value() == (request.size() >= sizeof(platform::MachMsgHeader)));
    if (reply.has_value()) {
        const auto header = platform::Load<platform::MachMsgHeader>(reply->bytes, 0);
        Require(header.id == ReplyId(platform::Load<platform::MachMsgHeader>(request, 0).id));
        Require(header.size >= platform::kErrorReplySize && header.size <= platform::kMaxReplySize);
        Require(sim::OpenDescriptors() == service.descriptors);
    }
    Require(sim::AllocatedMemory() == 0);
    return 0;
}
