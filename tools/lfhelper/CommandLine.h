// The command line, taken apart into a command, its operands and the options.
#pragma once

#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace lfhelper {

struct CommandLine {
    struct Option {
        std::string_view name;
        std::string value;
    };

    /// Empty when there is none; of "preferences" and "voicemail", the word behind belongs to it.
    std::string command;
    std::vector<std::string> operands;
    std::vector<Option> options;
    /// What is wrong with it; the other members are filled as far as they could be read.
    std::string error;

    [[nodiscard]] bool has(std::string_view name) const { return find(name) != nullptr; }

    /// The value of an option, where the last one of a name counts.
    [[nodiscard]] std::optional<std::string> value(std::string_view name) const;

private:
    [[nodiscard]] const Option* find(std::string_view name) const;
};

/// Options may stand anywhere; behind "--", and with a digit behind the "-", all are operands.
[[nodiscard]] CommandLine ParseCommandLine(std::span<const char* const> arguments);

}  // namespace lfhelper
