// The file of one preference domain.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "platform/PropertyList.h"

namespace platform {

/// Reads and replaces a domain's file, with the rights that the calling thread has.
class PreferenceFile {
public:
    enum class State : std::uint8_t {
        kAbsent,
        kRead,
        kDamaged,     ///< no property list with a dictionary at its top
        kUnreadable,  ///< no permission, not a regular file, or too large
    };

    struct Contents {
        State state = State::kAbsent;
        PropertyList entries{};    ///< a dictionary, empty unless the file was read
        std::size_t fileSize = 0;  ///< in bytes
        std::string complaint{};   ///< what keeps the file from being used
    };

    explicit PreferenceFile(std::string path) : path_(std::move(path)) {}

    [[nodiscard]] Contents read() const;

    /// Puts these entries in the place of what was read, which was not unreadable: a reader sees
    /// the old file or the new one, also when the system stops in the middle. A link stays, and
    /// what it leads to is replaced. A damaged file is kept beside the new one. Gives an empty
    /// text, or what went wrong; then the file is as it was, or, should the very last sync have
    /// failed, new but not yet sure to last.
    [[nodiscard]] std::string replace(const Contents& contents) const;

private:
    const std::string path_;
};

}  // namespace platform
