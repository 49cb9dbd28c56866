// A path that somebody else named, resolved once so that nobody can walk us elsewhere.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

struct FileStatus {
    std::uint32_t mode = 0;  ///< type and permission bits, as in st_mode
    std::uint32_t uid = 0;
    std::uint32_t gid = 0;
};

/// The parent directory of a path, held open, and the name of the last step.
///
/// The daemon is root and works below folders that the mobile user owns. On the way a symbolic link
/// is followed if root owns it, or if it leads to something that the link's own owner owns;
/// otherwise EPERM. ".." is taken as it stands. A resolution that failed is answered by every
/// operation with its error. All operations return 0 or an errno value, and none but stat, realPath
/// and read follows a link in the last step. A path that ends in a slash names a directory.
class PathAccess {
public:
    explicit PathAccess(std::string_view path);
    PathAccess(PathAccess&&) noexcept;
    PathAccess& operator=(PathAccess&&) noexcept;
    PathAccess(const PathAccess&) = delete;
    PathAccess& operator=(const PathAccess&) = delete;
    ~PathAccess();

    /// lstat(2); `*status` is written on success only.
    [[nodiscard]] int lstat(FileStatus* status) const;

    /// The same for what a link in the last step leads to, followed by the rule.
    [[nodiscard]] int stat(FileStatus* status) const;

    /// remove(3): a file, a link, or an empty directory.
    [[nodiscard]] int remove() const;

    /// symlink(2): makes the path a link with these contents; EEXIST when something is there.
    [[nodiscard]] int symlink(std::string_view contents) const;

    /// rmdir(2): an empty directory, and nothing else.
    [[nodiscard]] int removeDirectory() const;

    /// The contents of a link, whole; EINVAL when the item is none.
    [[nodiscard]] int readLink(std::string* contents) const;

    /// realpath(3) of what the path leads to, links followed by the rule.
    [[nodiscard]] int realPath(std::string* path) const;

    /// The bytes of the regular file that the path leads to. EINVAL for anything else, of which
    /// none is opened; EFBIG when there are more than `most`. Never waits for another process.
    [[nodiscard]] int read(std::size_t most, std::vector<std::byte>* contents) const;

    /// lchown(2); what is all ones stays as it is. A link is never given to root: whoever wrote it
    /// would lead us from then on. It stays whose it is, and that is a success.
    [[nodiscard]] int setOwner(std::uint32_t uid, std::uint32_t gid) const;

    /// chmod(2) of the item itself; a link has no mode of its own: EOPNOTSUPP.
    [[nodiscard]] int setMode(std::uint32_t mode) const;

    /// mkdir(2): an empty directory with this mode less the process's mask.
    [[nodiscard]] int makeDirectory(std::uint32_t mode) const;

    /// rename(2): what is here takes the place of what may be there.
    [[nodiscard]] int moveOnto(const PathAccess& destination) const;

    /// fsync(2) of the file or directory, and then of the folder that it lies in. A failure is told
    /// in one error line.
    [[nodiscard]] int synchronize() const;

    /// What the twin keeps, for the file manager of the same twin.
    struct State;

    explicit PathAccess(std::unique_ptr<State> state);

    [[nodiscard]] const State& state() const { return *state_; }

private:
    std::unique_ptr<State> state_;
};

}  // namespace platform
