#include "platform/linux/ArchiveNames.h"

#include <algorithm>
#include <cerrno>
#include <climits>

namespace platform {
namespace {

/// Deeper folders are nobody's, and walking them for each entry would cost more than expanding it.
constexpr std::size_t kMostSteps = 64;

bool IsControl(char c) {
    const auto byte = static_cast<unsigned char>(c);
    return byte < 0x20 || byte == 0x7F;
}

std::vector<std::string> StepsOf(std::string_view name) {
    std::vector<std::string> steps;
    while (!name.empty()) {
        const std::string_view step = name.substr(0, name.find('/'));
        name.remove_prefix(std::min(step.size() + 1, name.size()));
        if (!step.empty() && step != ".") {
            steps.emplace_back(step);
        }
    }
    return steps;
}

std::optional<ArchiveError> CheckText(std::string_view text) {
    if (text.empty()) {
        return ArchiveError{EINVAL, "the name is empty"};
    }
    if (text.starts_with('/')) {
        return ArchiveError{EPERM, "the name is absolute"};
    }
    // Another system's separator: taken as a letter here, "..\x" would be a trap for the next.
    if (text.find('\\') != std::string_view::npos) {
        return ArchiveError{EINVAL, "the name has a backslash"};
    }
    if (std::ranges::any_of(text, IsControl)) {
        return ArchiveError{EINVAL, "the name has a control character"};
    }
    if (text.size() >= PATH_MAX) {
        return ArchiveError{ENAMETOOLONG, "the name is too long"};
    }
    return std::nullopt;
}

std::optional<ArchiveError> CheckSteps(const std::vector<std::string>& steps) {
    if (std::ranges::find(steps, "..") != steps.end()) {
        return ArchiveError{EPERM, "the name leads upwards"};
    }
    if (steps.size() > kMostSteps) {
        return ArchiveError{ENAMETOOLONG, "the name has too many folders"};
    }
    if (std::ranges::any_of(steps, [](const auto& step) { return step.size() > NAME_MAX; })) {
        return ArchiveError{ENAMETOOLONG, "a part of the name is too long"};
    }
    if (std::ranges::find(steps, kUnfinishedName) != steps.end()) {
        return ArchiveError{EINVAL, "the name is reserved"};
    }
    return std::nullopt;
}

}  // namespace

ArchivePath ParseArchiveName(std::string_view name) {
    if (auto error = CheckText(name)) {
        return {.steps = {}, .error = std::move(error)};
    }
    ArchivePath path{.steps = StepsOf(name)};
    path.error = CheckSteps(path.steps);
    return path;
}

std::optional<ArchiveError> CheckLinkTarget(std::string_view target, std::size_t depth) {
    if (auto error = CheckText(target)) {
        return ArchiveError{error->code, "of a link's target: " + error->reason};
    }
    const auto steps = StepsOf(target);
    const auto firstDown = std::ranges::find_if(steps, [](const auto& s) { return s != ".."; });
    const auto up = static_cast<std::size_t>(firstDown - steps.begin());
    if (up > depth || std::find(firstDown, steps.end(), "..") != steps.end()) {
        return ArchiveError{EPERM, "the link may lead out"};
    }
    return std::nullopt;
}

}  // namespace platform
