#include "tools/lfhelper/CommandLine.h"

#include <algorithm>
#include <array>

namespace lfhelper {
namespace {

enum class Takes { kNothing, kValue };

struct KnownOption {
    std::string_view name;
    Takes takes;
    /// The commands that it belongs to; none for all.
    std::array<std::string_view, 3> commands{};

    [[nodiscard]] bool belongsTo(std::string_view command) const {
        return commands[0].empty() || std::ranges::find(commands, command) != commands.end();
    }

    [[nodiscard]] std::string commandNames() const {
        const auto end = std::ranges::find(commands, std::string_view());
        std::string names(commands[0]);
        for (auto command = commands.begin() + 1; command < end; ++command) {
            names += (command + 1 == end ? " or " : ", ") + std::string(*command);
        }
        return names;
    }
};

constexpr auto kKnownOptions = std::to_array<KnownOption>({
    {"help", Takes::kNothing},
    {"version", Takes::kNothing},
    {"json", Takes::kNothing},
    {"group", Takes::kValue},
    {"service", Takes::kValue},
    {"complex", Takes::kNothing, {"raw"}},
    {"claim-size", Takes::kValue, {"raw"}},
    {"key", Takes::kValue, {"voicemail get-token", "voicemail set-token"}},
    {"application", Takes::kNothing, {"preferences get"}},
    {"plist", Takes::kNothing, {"preferences get"}},
    {"type", Takes::kValue, {"preferences set"}},
    {"types", Takes::kValue, {"update-databases"}},
    {"timeout", Takes::kValue, {"update-databases"}},
    {"wait", Takes::kNothing, {"update-databases", "civic-address", "wan-ip"}},
});

/// The first words of commands that have two.
constexpr std::array<std::string_view, 2> kCommandGroups{"preferences", "voicemail"};

bool IsCommandGroup(std::string_view word) {
    return std::ranges::find(kCommandGroups, word) != kCommandGroups.end();
}

const KnownOption* FindKnownOption(std::string_view name) {
    const auto found = std::ranges::find(kKnownOptions, name, &KnownOption::name);
    return found == kKnownOptions.end() ? nullptr : &*found;
}

bool LooksLikeOption(std::string_view argument) {
    const bool isNumber = argument.size() > 1 && argument[1] >= '0' && argument[1] <= '9';
    return argument.size() > 1 && argument[0] == '-' && !isNumber;
}

class Parser {
public:
    explicit Parser(std::span<const char* const> arguments) : rest_(arguments) {}

    CommandLine parse() {
        bool optionsEnded = false;
        while (!rest_.empty()) {
            const std::string_view argument = next();
            if (!optionsEnded && argument == "--") {
                optionsEnded = true;
            } else if (!optionsEnded && LooksLikeOption(argument)) {
                takeOption(argument);
            } else {
                takeOperand(argument);
            }
        }
        checkCommands();
        return std::move(line_);
    }

private:
    std::string_view next() {
        const std::string_view argument = rest_.front();
        rest_ = rest_.subspan(1);
        return argument;
    }

    void fail(std::string message) {
        // The first mistake is the one to mend first.
        if (line_.error.empty()) {
            line_.error = std::move(message);
        }
    }

    void takeOperand(std::string_view argument) {
        if (!hasCommand_) {
            hasCommand_ = true;
            line_.command = argument;
        } else if (IsCommandGroup(line_.command)) {
            line_.command.append(" ").append(argument);
        } else {
            line_.operands.emplace_back(argument);
        }
    }

    void takeOption(std::string_view argument) {
        const std::size_t equals = argument.find('=');
        const bool hasValue = equals != std::string_view::npos;
        const std::string_view written = argument.substr(0, equals);
        const auto* const option =
            written.starts_with("--") ? FindKnownOption(written.substr(2)) : nullptr;
        if (option == nullptr) {
            fail("there is no option " + std::string(written));
        } else if (option->takes == Takes::kNothing && hasValue) {
            fail("the option " + std::string(written) + " takes no value");
        } else if (option->takes == Takes::kValue && !hasValue && rest_.empty()) {
            fail("the option " + std::string(written) + " needs a value");
        } else {
            std::string value;
            if (option->takes == Takes::kValue) {
                value = hasValue ? argument.substr(equals + 1) : next();
            }
            line_.options.push_back({option->name, std::move(value)});
        }
    }

    void checkCommands() {
        for (const auto& option : line_.options) {
            const KnownOption& known = *FindKnownOption(option.name);
            if (!known.belongsTo(line_.command)) {
                fail("the option --" + std::string(option.name) + " belongs to the command " +
                     known.commandNames());
            }
        }
    }

    std::span<const char* const> rest_;
    CommandLine line_;
    bool hasCommand_ = false;
};

}  // namespace

const CommandLine::Option* CommandLine::find(std::string_view name) const {
    const auto found = std::find_if(options.rbegin(), options.rend(), [name](const Option& option) {
        return option.name == name;
    });
    return found == options.rend() ? nullptr : &*found;
}

std::optional<std::string> CommandLine::value(std::string_view name) const {
    const Option* const option = find(name);
    return option == nullptr ? std::nullopt : std::optional(option->value);
}

CommandLine ParseCommandLine(std::span<const char* const> arguments) {
    return Parser(arguments).parse();
}

}  // namespace lfhelper
