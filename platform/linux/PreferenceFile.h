// The file of one preference domain.
#pragma once

#include <string>

#include "platform/linux/PropertyListFile.h"

namespace platform {

/// Reads and replaces a domain's file, with the rights that the calling thread has.
class PreferenceFile {
public:
    using State = PropertyListFile::State;
    using Contents = PropertyListFile::Contents;

    explicit PreferenceFile(std::string path) : path_(std::move(path)) {}

    [[nodiscard]] Contents read() const;

    /// As PropertyListFile::replace. A link stays, and what it leads to is replaced. The new file
    /// has the mode of the old one, or nobody but its owner can read it.
    [[nodiscard]] std::string replace(const Contents& contents) const;

private:
    const std::string path_;
};

}  // namespace platform
