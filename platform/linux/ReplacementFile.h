// A complete new file beside an old one, which then takes the old one's place.
#pragma once

#include <sys/types.h>

#include <functional>
#include <string>
#include <string_view>

namespace platform {

/// Goes with the object unless it took its place. All operations give 0 or an errno value.
class ReplacementFile {
public:
    /// In this folder, which the caller holds open, under a temporary name that nobody else uses in
    /// it meanwhile.
    ReplacementFile(int folder, std::string temporaryName)
        : folder_(folder), temporaryName_(std::move(temporaryName)) {}

    ~ReplacementFile();
    ReplacementFile(const ReplacementFile&) = delete;
    ReplacementFile& operator=(const ReplacementFile&) = delete;

    using Put = std::function<void(std::string_view)>;

    /// Makes the file with what `produce` puts, and has it on the disk. What an interrupted run may
    /// have left under the temporary name is removed.
    [[nodiscard]] int make(mode_t mode, const std::function<void(const Put&)>& produce);

    /// From now on it has the name; a reader sees the old file or the new one. Should only the very
    /// last sync fail, it has the name and is not yet sure to last.
    [[nodiscard]] int takePlace(const std::string& name);

private:
    const int folder_;
    const std::string temporaryName_;
    bool isMade_ = false;
};

/// Has a folder's names on the disk. A folder is opened for reading to be synced; where that is not
/// allowed, what was done in it is as sure as the file system makes it. 0 or an errno value.
[[nodiscard]] int SyncFolder(int folder);

}  // namespace platform
