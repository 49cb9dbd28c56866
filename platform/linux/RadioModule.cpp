// The modem manager's logging, switched over the system bus.
//
// The call waits for its answer although nobody looks at it: the modem manager asks the bus who
// called before it does anything, and a caller that is gone by then is nobody. The waiting is our
// own, since the library's waits for a bus that says nothing for a minute and a half.
#include "platform/linux/RadioModule.h"

#include <systemd/sd-bus.h>

#include <cerrno>
#include <chrono>
#include <cstdint>
#include <memory>

namespace {

using Clock = std::chrono::steady_clock;

constexpr std::chrono::seconds kPatience{2};

// The address is fixed: nothing in the environment decides whom root speaks to.
constexpr const char* kBusAddress = "unix:path=/run/dbus/system_bus_socket";
constexpr const char* kService = "org.freedesktop.ModemManager1";
constexpr const char* kObject = "/org/freedesktop/ModemManager1";
constexpr const char* kInterface = "org.freedesktop.ModemManager1";

/// Closes without another word to a bus that may not listen.
struct CloseBus {
    void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
};

struct ReleaseMessage {
    void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};

using Bus = std::unique_ptr<sd_bus, CloseBus>;
using Message = std::unique_ptr<sd_bus_message, ReleaseMessage>;

/// What came of the call.
struct Outcome {
    bool isKnown = false;
    int error = 0;
};

/// The functions of the library answer with a negated errno value.
bool IsFailure(int result, int& error) {
    error = result < 0 ? -result : 0;
    return result < 0;
}

int Connect(Bus& bus) {
    sd_bus* made = nullptr;
    int error = 0;
    if (IsFailure(sd_bus_new(&made), error)) {
        return error;
    }
    bus.reset(made);
    (void)(IsFailure(sd_bus_set_address(made, kBusAddress), error) ||
           IsFailure(sd_bus_set_bus_client(made, 1), error) ||
           IsFailure(sd_bus_start(made), error));
    return error;
}

int MakeCall(sd_bus* bus, const char* level, Message& call) {
    sd_bus_message* made = nullptr;
    int error = 0;
    if (IsFailure(
            sd_bus_message_new_method_call(bus, &made, kService, kObject, kInterface, "SetLogging"),
            error)) {
        return error;
    }
    call.reset(made);
    // A switch of its logging is no reason to start a modem manager.
    (void)(IsFailure(sd_bus_message_set_auto_start(made, 0), error) ||
           IsFailure(sd_bus_message_append(made, "s", level), error));
    return error;
}

int NoteAnswer(sd_bus_message* answer, void* outcome, sd_bus_error* /*error*/) {
    *static_cast<Outcome*>(outcome) = {.isKnown = true, .error = sd_bus_message_get_errno(answer)};
    return 0;
}

std::uint64_t MicrosecondsUntil(Clock::time_point deadline) {
    const auto left =
        std::chrono::duration_cast<std::chrono::microseconds>(deadline - Clock::now()).count();
    return left > 0 ? static_cast<std::uint64_t>(left) : 0;
}

int WaitForAnswer(sd_bus* bus, const Outcome& outcome) {
    const auto deadline = Clock::now() + kPatience;
    int error = 0;
    while (!outcome.isKnown) {
        const int progress = sd_bus_process(bus, nullptr);
        if (IsFailure(progress, error)) {
            return error;
        }
        if (outcome.isKnown || progress > 0) {
            continue;
        }
        const std::uint64_t left = MicrosecondsUntil(deadline);
        if (left == 0) {
            return ETIMEDOUT;
        }
        if (IsFailure(sd_bus_wait(bus, left), error) && error != EINTR) {
            return error;
        }
    }
    return outcome.error;
}

}  // namespace

__attribute__((visibility("default"))) int LinefoldRadioSetLogging(int isEnabled) noexcept {
    Outcome outcome;
    Bus bus;
    Message call;
    int error = Connect(bus);
    if (error == 0) {
        error = MakeCall(bus.get(), isEnabled != 0 ? "DEBUG" : "ERR", call);
    }
    if (error == 0) {
        (void)IsFailure(
            sd_bus_call_async(bus.get(), nullptr, call.get(), NoteAnswer, &outcome, UINT64_MAX),
            error);
    }
    return error == 0 ? WaitForAnswer(bus.get(), outcome) : error;
}
