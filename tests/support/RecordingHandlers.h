// The 24 handlers, for tests of what stands in front of them: they note how they were called and
// answer as the test said.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "platform/MachPort.h"

namespace recording {

struct Call {
    std::size_t number = 0;
    platform::mach_port_t port = platform::MACH_PORT_NULL;
    std::vector<std::string> texts{};
    std::vector<double> numbers{};
    std::string data{};
};

struct Answer {
    platform::kern_return_t code = platform::KERN_SUCCESS;
    /// Out values are written with every code.
    std::string text;
    std::int32_t number = 0;
    std::string data;
    std::function<void(const Call&)> meanwhile;
};

[[nodiscard]] std::vector<Call>& Calls();
[[nodiscard]] Answer& NextAnswer();
void Reset();

}  // namespace recording
