// lfhelper: calls LinefoldMobileHelper from a shell.
#include <cstdio>
#include <memory>
#include <span>
#include <string>
#include <string_view>

#include "client/linefold_helper.h"
#include "platform/BuildConstants.h"
#include "tools/lfhelper/CommandLine.h"
#include "tools/lfhelper/EntitledGroup.h"
#include "tools/lfhelper/Json.h"
#include "tools/lfhelper/Subcommands.h"

using namespace lfhelper;

namespace {

enum ExitStatus { kSuccess = 0, kFailure = 1, kUsage = 2, kNotServed = 3, kNoValue = 4 };

struct DestroyHelper {
    void operator()(LFMobileHelper* helper) const { LFMobileHelperDestroy(helper); }
};

using Helper = std::unique_ptr<LFMobileHelper, DestroyHelper>;

void Print(std::FILE* stream, std::string_view text) {
    (void)std::fwrite(text.data(), 1, text.size(), stream);
}

void PrintError(std::string_view text) {
    Print(stderr, "lfhelper: ");
    Print(stderr, text);
    Print(stderr, "\n");
}

/// A line for each command whose name starts so.
std::string ListOfCommands(std::string_view start) {
    std::string text;
    for (const Subcommand& subcommand : Subcommands()) {
        if (subcommand.name.starts_with(start)) {
            std::string name(subcommand.name);
            name.resize(26, ' ');
            text += "  " + name + std::string(subcommand.summary) + "\n";
        }
    }
    return text;
}

void PrintHelp() {
    std::string text =
        "Usage: lfhelper [OPTIONS] COMMAND [ARGUMENTS]\n"
        "Calls the service LinefoldMobileHelper.\n"
        "\n"
        "Commands:\n" +
        ListOfCommands("");
    text +=
        "\n"
        "Options:\n"
        "  --group NAME    the entitled group to call as, which root takes (default: " +
        std::string(platform::kDefaultEntitledGroup) +
        ")\n"
        "  --service PATH  the socket of the service\n"
        "                  (default: " LF_MOBILE_HELPER_DEFAULT_SERVICE_PATH
        ")\n"
        "  --json          print one JSON object\n"
        "  --help          print this text, or that of a command\n"
        "  --version       print the version\n"
        "\n"
        "Exit status: 0 success; 1 the service refused or failed, or doctor found a problem;\n"
        "2 wrong usage; 3 no service, not entitled, or the group cannot be taken; 4 there is no\n"
        "such value.\n"
        "\n"
        "Examples:\n"
        "  lfhelper check-in\n"
        "  lfhelper preferences set --help\n";
    Print(stdout, text);
}

void PrintHelpOf(const Subcommand& subcommand) {
    Print(stdout,
          "Usage: lfhelper [OPTIONS] " + std::string(subcommand.name) +
              (subcommand.operands.empty() ? "" : " ") + std::string(subcommand.operands) + "\n" +
              std::string(subcommand.help) + "\nOptions for all commands: lfhelper --help\n");
}

/// Also for a word that commands start with and that is none itself.
bool IsKnown(const std::string& command) {
    return FindSubcommand(command) != nullptr || !ListOfCommands(command + " ").empty();
}

/// Says in JSON, too, why there was nothing to call.
int Fail(const CommandLine& line, ExitStatus status, std::string_view name, std::string_view why) {
    PrintError(why);
    if (status == kUsage) {
        Print(stderr,
              "Try: lfhelper " + (IsKnown(line.command) ? line.command + " " : "") + "--help\n");
    }
    if (line.has("json")) {
        JsonObject object;
        object.add("command", line.command);
        object.add("exitStatus", std::int64_t{status});
        object.addNull("code");
        object.add("name", name);
        object.add("meaning", why);
        Print(stdout, object.toString() + "\n");
    }
    return status;
}

int ExitStatusOf(const Answer& answer) {
    if (!answer.problem.text.empty()) {
        return answer.problem.exitStatus;
    }
    switch (answer.code) {
        case LF_MOBILE_HELPER_SUCCESS:
            return answer.absence.empty() ? kSuccess : kNoValue;
        case LF_MOBILE_HELPER_NOT_ENTITLED:
        case LF_MOBILE_HELPER_ERROR_NO_SERVICE:
        case LF_MOBILE_HELPER_ERROR_NOT_A_SERVICE:
        case LF_MOBILE_HELPER_ERROR_NO_PERMISSION:
            return kNotServed;
        case LF_MOBILE_HELPER_ERROR_ARGUMENT_TOO_LONG:
        case LF_MOBILE_HELPER_ERROR_PATH_TOO_LONG:
            return kUsage;
        default:
            return kFailure;
    }
}

/// Its code, or what went wrong on this side.
JsonObject OutcomeForPrograms(const Answer& answer) {
    JsonObject object;
    if (answer.problem.text.empty()) {
        object.add("code", std::int64_t{answer.code});
        object.add("name", LFMobileHelperErrorName(answer.code));
        object.add("meaning", LFMobileHelperErrorString(answer.code));
    } else {
        object.addNull("code");
        object.add("name", answer.problem.name);
        object.add("meaning", answer.problem.text);
    }
    return object;
}

void PrintAnswerForPrograms(const Subcommand& subcommand, const Answer& answer) {
    JsonObject object;
    object.add("command", subcommand.name);
    object.add("exitStatus", std::int64_t{ExitStatusOf(answer)});
    object.append(OutcomeForPrograms(answer));
    object.append(answer.fields);
    Print(stdout, object.toString() + "\n");
}

void PrintAnswerForPeople(const Subcommand& subcommand, const Answer& answer) {
    Print(stdout, answer.text);
    const std::string name(subcommand.name);
    const std::string meaning = LFMobileHelperErrorString(answer.code);
    if (!answer.problem.text.empty()) {
        PrintError(name + ": " + answer.problem.text);
    } else if (!answer.absence.empty()) {
        PrintError(name + ": " + answer.absence);
    } else if (answer.code == LF_MOBILE_HELPER_SUCCESS && answer.text.empty()) {
        Print(stdout, name + ": " + meaning + "\n");
    } else if (answer.code != LF_MOBILE_HELPER_SUCCESS) {
        PrintError(name + ": " + std::to_string(answer.code) + " " +
                   LFMobileHelperErrorName(answer.code) + ": " + meaning);
    }
}

int Call(const CommandLine& line, const Subcommand& subcommand, const Request& request) {
    const std::string group = line.value("group").value_or(platform::kDefaultEntitledGroup);
    if (const auto problem = TakeEntitledGroup(group)) {
        return Fail(line, kNotServed, "NO_GROUP", *problem);
    }
    const Helper helper(LFMobileHelperCreateWithPath(
        line.value("service").value_or(LF_MOBILE_HELPER_DEFAULT_SERVICE_PATH).c_str()));
    const Answer answer = request(helper.get());
    if (line.has("json")) {
        PrintAnswerForPrograms(subcommand, answer);
    } else {
        PrintAnswerForPeople(subcommand, answer);
    }
    return ExitStatusOf(answer);
}

int Look(const CommandLine& line, const std::function<Report()>& look) {
    const Report report = look();
    const ExitStatus status = report.isWell ? kSuccess : kFailure;
    if (line.has("json")) {
        JsonObject object;
        object.add("command", line.command);
        object.add("exitStatus", std::int64_t{status});
        object.append(report.fields);
        Print(stdout, object.toString() + "\n");
    } else {
        Print(stdout, report.text);
    }
    return status;
}

int RunSubcommand(const CommandLine& line, const Subcommand& subcommand) {
    if (line.operands.size() < subcommand.operandsMin) {
        return Fail(line, kUsage, "USAGE", "too few arguments for " + line.command);
    }
    if (line.operands.size() > subcommand.operandsMax) {
        return Fail(line, kUsage, "USAGE", "too many arguments for " + line.command);
    }
    const Preparation preparation = subcommand.prepare(line);
    if (preparation.look) {
        return Look(line, preparation.look);
    }
    return preparation.error.empty() ? Call(line, subcommand, preparation.request)
                                     : Fail(line, kUsage, "USAGE", preparation.error);
}

/// For a word that commands start with and that is none itself.
int RunHalfCommand(const CommandLine& line, const std::string& itsCommands) {
    if (!line.has("help")) {
        return Fail(line, kUsage, "USAGE", line.command + " is not the whole command");
    }
    Print(stdout,
          "Commands:\n" + itsCommands + "\nTry: lfhelper " + line.command + " WORD --help\n");
    return kSuccess;
}

int Run(const CommandLine& line) {
    const Subcommand* const subcommand = FindSubcommand(line.command);
    if (!line.error.empty()) {
        return Fail(line, kUsage, "USAGE", line.error);
    }
    if (const auto itsCommands = ListOfCommands(line.command + " "); !itsCommands.empty()) {
        return RunHalfCommand(line, itsCommands);
    }
    if (subcommand == nullptr && !line.command.empty()) {
        return Fail(line, kUsage, "USAGE", "there is no command " + line.command);
    }
    if (line.has("version")) {
        Print(stdout, "lfhelper " LINEFOLD_VERSION "\n");
        return kSuccess;
    }
    if (line.has("help")) {
        subcommand == nullptr ? PrintHelp() : PrintHelpOf(*subcommand);
        return kSuccess;
    }
    if (subcommand == nullptr) {
        return Fail(line, kUsage, "USAGE", "a command is missing");
    }
    return RunSubcommand(line, *subcommand);
}

}  // namespace

int main(int argc, char** argv) {
    const std::span<const char* const> arguments(argv, static_cast<std::size_t>(argc));
    const int status = Run(ParseCommandLine(arguments.subspan(arguments.empty() ? 0 : 1)));
    // A full disk or a closed pipe must not look like an answer that was given.
    if (std::fflush(stdout) != 0 || std::ferror(stdout) != 0) {
        PrintError("the output could not be written");
        return status == kSuccess ? kFailure : status;
    }
    return status;
}
