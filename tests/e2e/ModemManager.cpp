// A modem manager for the tests and the demonstration, on the bus at its argument: it writes down
// each level that SetLogging asks for, behind the user that the bus knows the caller by when it is
// asked a while later, as the real one asks before it does anything.
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>

namespace {

constexpr const char* kName = "org.freedesktop.ModemManager1";

int SetLogging(sd_bus_message* call, void* /*data*/, sd_bus_error* /*error*/) {
    const char* level = nullptr;
    if (sd_bus_message_read(call, "s", &level) < 0) {
        return -1;
    }
    usleep(100'000);
    sd_bus_creds* caller = nullptr;
    uid_t user = 0;
    const bool isKnown = sd_bus_query_sender_creds(call, SD_BUS_CREDS_EUID, &caller) >= 0 &&
                         sd_bus_creds_get_euid(caller, &user) >= 0;
    std::printf("%s %s\n", isKnown ? (user == 0 ? "root" : "somebody") : "nobody", level);
    std::fflush(stdout);
    sd_bus_creds_unref(caller);
    return sd_bus_reply_method_return(call, "");
}

const sd_bus_vtable kTable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD("SetLogging", "s", "", SetLogging, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END,
};

bool Offer(sd_bus* bus, const char* address) {
    return sd_bus_set_address(bus, address) >= 0 && sd_bus_set_bus_client(bus, 1) >= 0 &&
           sd_bus_start(bus) >= 0 &&
           sd_bus_add_object_vtable(
               bus, nullptr, "/org/freedesktop/ModemManager1", kName, kTable, nullptr) >= 0 &&
           sd_bus_request_name(bus, kName, 0) >= 0;
}

}  // namespace

int main(int argc, char** argv) {
    sd_bus* bus = nullptr;
    if (argc != 2 || sd_bus_new(&bus) < 0 || !Offer(bus, argv[1])) {
        return 1;
    }
    std::printf("ready\n");
    std::fflush(stdout);
    for (;;) {
        const int progress = sd_bus_process(bus, nullptr);
        if (progress < 0 || (progress == 0 && sd_bus_wait(bus, UINT64_MAX) < 0)) {
            return 0;
        }
    }
}
