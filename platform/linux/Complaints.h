// Error lines about what an operator has to mend, held back until they may be written.
#pragma once

#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/linux/PlatformLog.h"

namespace platform {

/// Gathers lines while a lock is held, and writes them when it goes: a log may be slow. Born before
/// the lock is taken.
class Complaints {
public:
    /// The lines begin with the name of the family that complains.
    explicit Complaints(const char* family) : family_(family) {}

    Complaints(const Complaints&) = delete;
    Complaints& operator=(const Complaints&) = delete;

    ~Complaints() {
        for (const auto& [subject, text] : lines_) {
            PlatformLog(LogLevel::kError, "%s: %s %s", family_, subject.c_str(), text.c_str());
        }
    }

    void add(std::string_view subject, std::string_view text) {
        lines_.emplace_back(subject, text);
    }

private:
    const char* const family_;
    std::vector<std::pair<std::string, std::string>> lines_;
};

}  // namespace platform
