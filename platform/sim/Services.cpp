#include "platform/sim/Services.h"

#include <cstdio>
#include <cstdlib>
#include <utility>

#include "platform/BasebandHelperServer.h"
#include "platform/Process.h"
#include "platform/RunLoop.h"
#include "platform/sim/World.h"

namespace sim {

Services& TheServices() {
    static Services& services = *new Services;
    return services;
}

void ResetServices() {
    const Services old = std::exchange(TheServices(), Services());
}

void SetUser(std::string_view name,
             std::uint32_t uid,
             std::uint32_t gid,
             std::optional<std::string> home) {
    TheServices().users.insert_or_assign(
        std::string(name), User{.record = {.uid = uid, .gid = gid}, .home = std::move(home)});
}

void RemoveUser(std::string_view name) {
    TheServices().users.erase(std::string(name));
}

const std::vector<PreferencesFlush>& PreferencesFlushes() {
    return TheServices().flushes;
}

void SetBaseband(Baseband baseband) {
    TheServices().baseband = baseband;
}

void SetBasebandBusy(bool isBusy) {
    TheServices().isBasebandBusy = isBusy;
}

void RequestTermination() {
    if (TheServices().terminationHandler) {
        platform::RunLoop::current().post(TheServices().terminationHandler);
    }
}

}  // namespace sim

namespace platform {
namespace {

class SimBaseband final : public BasebandHelperServer {
public:
    ~SimBaseband() { sim::NoteCall("BasebandHelperServer.dropped"); }
};

}  // namespace

bool CanHostBasebandHelperServer() {
    sim::NoteCall("CanHostBasebandHelperServer");
    return sim::TheServices().baseband != sim::Baseband::kAbsent;
}

std::shared_ptr<BasebandHelperServer> BasebandHelperServer::create(
    std::shared_ptr<LogServer> logServer) {
    const bool fails = sim::CallFails("BasebandHelperServer.create", logServer ? "log" : "no log");
    const bool isPresent = sim::TheServices().baseband == sim::Baseband::kPresent;
    return isPresent && !fails ? std::make_shared<SimBaseband>() : nullptr;
}

void BasebandHelperServer::start() {
    sim::NoteCall("BasebandHelperServer.start");
}

void BasebandHelperServer::stop() {
    sim::NoteCall("BasebandHelperServer.stop");
}

bool BasebandHelperServer::isBusy() {
    sim::NoteCall("BasebandHelperServer.isBusy");
    return sim::TheServices().isBasebandBusy;
}

void ProcessSettleIn() {
    sim::NoteCall("ProcessSettleIn");
}

std::uint32_t ProcessUserId() {
    return 0;
}

std::uint32_t ProcessGroupId() {
    return 0;
}

void ProcessOnTerminationRequest(std::function<void()> handler) {
    sim::NoteCall("ProcessOnTerminationRequest");
    sim::TheServices().terminationHandler = std::move(handler);
}

void ProcessRefuseToStart(const char* format, std::string_view argument) {
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
#pragma GCC diagnostic ignored "-Wformat-security"
    (void)std::fprintf(stderr, format, std::string(argument).c_str());
#pragma GCC diagnostic pop
    (void)std::fputc('\n', stderr);
    std::_Exit(1);
}

}  // namespace platform
