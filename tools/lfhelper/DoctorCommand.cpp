#include "tools/lfhelper/DoctorCommand.h"

#include <algorithm>
#include <array>
#include <string>

#include "platform/BuildConstants.h"
#include "tools/lfhelper/doctor/Checks.h"

namespace lfhelper {
namespace {

using doctor::Finding;
using doctor::Findings;
using doctor::Level;
using doctor::Subject;

constexpr std::array kChecks{doctor::CheckServiceSocket,
                             doctor::CheckEntitlement,
                             doctor::CheckMobileUser,
                             doctor::CheckFolders,
                             doctor::CheckHeartbeat,
                             doctor::CheckConfiguration,
                             doctor::CheckLibraries,
                             doctor::CheckAnswer};

std::string NameOf(Level level) {
    switch (level) {
        case Level::kOk:
            return "ok";
        case Level::kNote:
            return "note";
        case Level::kProblem:
            break;
    }
    return "problem";
}

Findings Examine(const Subject& subject) {
    Findings findings;
    for (const auto& check : kChecks) {
        for (Finding& finding : check(subject)) {
            findings.push_back(std::move(finding));
        }
    }
    return findings;
}

std::string LineOf(const Finding& finding) {
    constexpr std::size_t kWidth = 9;
    std::string line = NameOf(finding.level);
    line.resize(kWidth, ' ');
    line += finding.check + ": " + finding.text;
    return line + (finding.remedy.empty() ? "" : " -> " + finding.remedy) + "\n";
}

JsonObject ObjectOf(const Finding& finding) {
    JsonObject object;
    object.add("check", finding.check);
    object.add("level", NameOf(finding.level));
    object.add("finding", finding.text);
    if (finding.remedy.empty()) {
        object.addNull("remedy");
    } else {
        object.add("remedy", finding.remedy);
    }
    return object;
}

std::string Counted(std::ptrdiff_t count, const std::string& what) {
    return std::to_string(count) + " " + what + (count == 1 ? "" : "s");
}

Report ReportOf(const Findings& findings) {
    const auto problems = std::ranges::count(findings, Level::kProblem, &Finding::level);
    const auto notes = std::ranges::count(findings, Level::kNote, &Finding::level);
    Report report{.isWell = problems == 0};
    std::string objects;
    for (const Finding& finding : findings) {
        report.text += LineOf(finding);
        objects += (objects.empty() ? "" : ",") + ObjectOf(finding).toString();
    }
    report.text += Counted(problems, "problem") + ", " + Counted(notes, "note") + "\n";
    report.fields.add("problems", std::int64_t{problems});
    report.fields.add("notes", std::int64_t{notes});
    report.fields.addLiteral("checks", "[" + objects + "]");
    return report;
}

}  // namespace

Preparation PrepareDoctor(const CommandLine& line) {
    const Subject subject{
        .servicePath = line.value("service").value_or(LF_MOBILE_HELPER_DEFAULT_SERVICE_PATH),
        .group = line.value("group").value_or(platform::kDefaultEntitledGroup)};
    return {.look = [subject] { return ReportOf(Examine(subject)); }};
}

}  // namespace lfhelper
