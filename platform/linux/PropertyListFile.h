// A property-list file that is replaced as a whole.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>
#include <vector>

#include "platform/PropertyList.h"

namespace platform {

/// Reads and replaces a file of that name in a folder, which the caller holds open, with the rights
/// that the calling thread has.
class PropertyListFile {
public:
    enum class State : std::uint8_t {
        kAbsent,
        kRead,
        kDamaged,     ///< no property list with a dictionary at its top
        kUnreadable,  ///< no permission, not a regular file, or too large
    };

    enum class Links : bool { kRefused, kFollowed };

    struct Contents {
        State state = State::kAbsent;
        PropertyList entries{};    ///< a dictionary, empty unless the file was read
        std::size_t fileSize = 0;  ///< in bytes
        std::string complaint{};   ///< what keeps the file from being used
    };

    PropertyListFile(int folder, std::string name) : folder_(folder), name_(std::move(name)) {}

    /// `links` says what happens to a symbolic link of that name.
    [[nodiscard]] Contents read(Links links) const;

    /// Puts these entries, with that mode, in the place of what was read, which was not unreadable:
    /// a reader sees the old file or the new one, also when the system stops in the middle. A
    /// damaged file is kept beside the new one. Gives an empty text, or what went wrong; then the
    /// file is as it was, or, should the very last sync have failed, new but not yet sure to last.
    [[nodiscard]] std::string replace(const Contents& contents, mode_t mode) const;

    /// Removes the damaged file that was kept, and what a crash in the middle of a replacement left
    /// behind. False when one of them is still there.
    [[nodiscard]] bool removeKept() const;

private:
    const int folder_;
    const std::string name_;
};

}  // namespace platform
