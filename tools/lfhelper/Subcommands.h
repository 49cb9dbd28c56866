// The commands: one row and one function each.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <span>
#include <string>
#include <string_view>

#include "client/linefold_helper.h"
#include "tools/lfhelper/CommandLine.h"
#include "tools/lfhelper/Json.h"

namespace lfhelper {

/// What went wrong on this side although the service did not refuse.
struct Problem {
    std::string name{};  ///< for programs
    std::string text{};  ///< for people; empty when there is no problem
    int exitStatus = 0;
};

struct Answer {
    std::int32_t code = LF_MOBILE_HELPER_SUCCESS;
    /// For people, ending in a newline; when it is empty, the code says all.
    std::string text{};
    /// For programs, beside the code.
    JsonObject fields{};
    /// For people, when the service found nothing where it was asked to look; else empty.
    std::string absence{};
    Problem problem{};
};

using Request = std::function<Answer(LFMobileHelper* helper)>;

/// What a command that looks for itself, without a request, has seen.
struct Report {
    bool isWell = true;
    /// For people, ending in a newline.
    std::string text{};
    /// For programs.
    JsonObject fields{};
};

/// What a command makes of its operands before anything is connected: one of these.
struct Preparation {
    Request request{};
    /// What is wrong with the operands.
    std::string error{};
    std::function<Report()> look{};
};

struct Subcommand {
    std::string_view name;
    std::string_view operands;
    std::string_view summary;
    std::string_view help;
    std::size_t operandsMin;
    std::size_t operandsMax;
    Preparation (*prepare)(const CommandLine& line);
};

[[nodiscard]] std::span<const Subcommand> Subcommands();

/// Null when there is none of that name.
[[nodiscard]] const Subcommand* FindSubcommand(std::string_view name);

}  // namespace lfhelper
