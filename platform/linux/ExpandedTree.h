// Folders, links and files made below an open folder, whose owner may be moving things about in it.
#pragma once

#include <sys/stat.h>

#include <cstddef>
#include <ctime>
#include <span>
#include <string>
#include <vector>

#include "platform/linux/OwnedFd.h"

namespace platform {

/// Every step is taken from the folder before it, held open, and none follows a link: whoever owns
/// a folder in the tree can move it, and what is made goes with it, but cannot lead us elsewhere.
/// All results are errno values, 0 for success.
class ExpandedTree {
public:
    using Steps = std::vector<std::string>;

    /// The folder stays its owner's.
    explicit ExpandedTree(int folder) : folder_(folder) {}

    /// A folder; one that is there already stays as it is, with its mode.
    [[nodiscard]] int makeFolder(const Steps& steps, mode_t mode);

    /// A symbolic link in place of what is there, unless that is a folder.
    [[nodiscard]] int makeLink(const Steps& steps, const std::string& target);

    /// How many folders were made on the way to what was asked for.
    [[nodiscard]] std::size_t impliedFolders() const { return impliedFolders_; }

private:
    friend class UnfinishedFile;

    [[nodiscard]] int openFolder(std::span<const std::string> steps, OwnedFd* folder);

    const int folder_;
    std::size_t impliedFolders_ = 0;
};

/// A file that grows beside its place and takes it when it is complete; otherwise nothing of it
/// stays.
class UnfinishedFile {
public:
    UnfinishedFile() = default;
    ~UnfinishedFile();
    UnfinishedFile(const UnfinishedFile&) = delete;
    UnfinishedFile& operator=(const UnfinishedFile&) = delete;

    [[nodiscard]] int create(ExpandedTree& tree, const ExpandedTree::Steps& steps, mode_t mode);
    [[nodiscard]] int write(std::span<const std::byte> bytes);

    /// Replaces what is at the place, unless that is a folder.
    [[nodiscard]] int finish(const timespec& modified);

private:
    OwnedFd folder_;
    OwnedFd file_;
    std::string name_;
};

}  // namespace platform
