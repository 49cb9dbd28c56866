// A radio manager that remembers.
#include "platform/RadioManager.h"

#include "platform/sim/SimRadioManager.h"
#include "platform/sim/World.h"

namespace sim {
namespace {

std::vector<bool>& Requests() {
    static std::vector<bool>& requests = *new std::vector<bool>;
    return requests;
}

}  // namespace

const std::vector<bool>& RadioManagerRequests() {
    return Requests();
}

void ResetRadioManager() {
    Requests().clear();
}

}  // namespace sim

namespace platform {

void RadioManagerSetLogToFile(bool isEnabled) {
    if (!sim::CallFails("RadioManagerSetLogToFile", isEnabled ? "on" : "off")) {
        sim::Requests().push_back(isEnabled);
    }
}

}  // namespace platform
