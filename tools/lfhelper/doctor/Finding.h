// What one look at the system found.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace lfhelper::doctor {

enum class Level : std::uint8_t {
    kOk,
    kNote,     ///< may well be meant so, or could not be seen
    kProblem,  ///< keeps the service from some of its work
};

struct Finding {
    std::string check;  ///< a short name that programs can rely on
    Level level = Level::kOk;
    std::string text;      ///< for people, without a full stop
    std::string remedy{};  ///< what to do about it; empty where there is nothing to do
};

using Findings = std::vector<Finding>;

/// What is looked at, beside what is fixed.
struct Subject {
    std::string servicePath;
    std::string group;
};

[[nodiscard]] inline Finding Ok(std::string_view check, std::string text) {
    return {.check = std::string(check), .level = Level::kOk, .text = std::move(text)};
}

[[nodiscard]] inline Finding Note(std::string_view check,
                                  std::string text,
                                  std::string remedy = {}) {
    return {.check = std::string(check),
            .level = Level::kNote,
            .text = std::move(text),
            .remedy = std::move(remedy)};
}

[[nodiscard]] inline Finding Problem(std::string_view check, std::string text, std::string remedy) {
    return {.check = std::string(check),
            .level = Level::kProblem,
            .text = std::move(text),
            .remedy = std::move(remedy)};
}

}  // namespace lfhelper::doctor
