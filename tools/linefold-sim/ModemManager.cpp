// The real one asks the bus who called before it does anything, so a caller that does not wait for
// the answer is nobody to it. This one asks as late as the real one may.
#include "tools/linefold-sim/ModemManager.h"

#include <sys/types.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <array>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>

#include "tools/linefold-sim/RoleOptions.h"

namespace simulator {
namespace {

constexpr std::string_view kRole = "modem-manager";
constexpr const char* kSystemBus = "/run/dbus/system_bus_socket";
constexpr const char* kName = "org.freedesktop.ModemManager1";
constexpr const char* kObject = "/org/freedesktop/ModemManager1";
constexpr useconds_t kReflection = 100'000;

struct CloseBus {
    void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
};

struct ReleaseCredentials {
    void operator()(sd_bus_creds* credentials) const { sd_bus_creds_unref(credentials); }
};

const char* CallerOf(sd_bus_message* call) {
    sd_bus_creds* asked = nullptr;
    uid_t user = 0;
    const int result = sd_bus_query_sender_creds(call, SD_BUS_CREDS_EUID, &asked);
    const std::unique_ptr<sd_bus_creds, ReleaseCredentials> credentials(asked);
    if (result < 0 || sd_bus_creds_get_euid(credentials.get(), &user) < 0) {
        return "nobody";
    }
    return user == 0 ? "root" : "somebody";
}

int SetLogging(sd_bus_message* call, void* /*data*/, sd_bus_error* /*error*/) {
    const char* level = nullptr;
    if (const int result = sd_bus_message_read(call, "s", &level); result < 0) {
        return result;
    }
    usleep(kReflection);
    (void)std::printf("%s %s\n", CallerOf(call), level);
    return sd_bus_reply_method_return(call, "");
}

constexpr std::array<sd_bus_vtable, 3> kMethods{{
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD("SetLogging", "s", "", SetLogging, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END,
}};

bool Appear(sd_bus* bus, const std::string& path) {
    return sd_bus_set_address(bus, ("unix:path=" + path).c_str()) >= 0 &&
           sd_bus_set_bus_client(bus, 1) >= 0 && sd_bus_start(bus) >= 0 &&
           sd_bus_add_object_vtable(bus, nullptr, kObject, kName, kMethods.data(), nullptr) >= 0 &&
           sd_bus_request_name(bus, kName, 0) >= 0;
}

void Serve(sd_bus* bus) {
    for (;;) {
        const int progress = sd_bus_process(bus, nullptr);
        if (progress < 0 || (progress == 0 && sd_bus_wait(bus, UINT64_MAX) < 0)) {
            return;
        }
    }
}

}  // namespace

int PlayModemManager(std::span<const std::string_view> words) {
    constexpr std::array<KnownOption, 1> kKnown{{{"--bus"}}};
    const auto options = RoleOptions::parse(kRole, words, kKnown);
    if (!options) {
        return kUsage;
    }
    const std::string path = options->value("--bus", kSystemBus);
    sd_bus* made = nullptr;
    const bool isMade = sd_bus_new(&made) >= 0;
    const std::unique_ptr<sd_bus, CloseBus> bus(made);
    if (!isMade || !Appear(bus.get(), path)) {
        return Complain(kRole, "there is no bus at " + path + " that takes a modem manager");
    }
    (void)std::puts("ready");
    Serve(bus.get());
    return 0;
}

}  // namespace simulator
