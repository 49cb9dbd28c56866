// The file manager: whole items (files, links, folders with all below them) copied, moved, removed.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/PathAccess.h"

namespace platform {

// All of these return 0 or an errno value; there is no failure without one. Paths are resolved by
// the rule of PathAccess, the last step is taken as it is (a link there is the item), and inside a
// tree nothing but descriptors is followed: whoever exchanges folders and links meanwhile leads
// nobody elsewhere. The call returns when the work is done, and never waits for another process. A
// tree that was made to be endless is E2BIG: when the names still to be visited, or the hard links
// found, would take more than 64 MiB.

/// Asked about what cannot be copied inside a tree, by its path below the top. True: leave it out
/// and go on. What no item can be blamed for, such as a full disk, is not asked about.
using LeaveOutHandler = std::function<bool(const std::string& subpath, int error)>;

/// Copies an item to a path where nothing is; EEXIST when something is there.
///
/// The copy belongs to the process. Permissions, times, user.* attributes, holes, symbolic links
/// (dangling ones too) and hard links inside the tree are kept; set-id bits, security.* and
/// trusted.* attributes, access control lists and flags such as the immutable one are not. FIFOs,
/// sockets and device nodes inside a tree are left out without a word, or told to the handler with
/// EOPNOTSUPP; an item that is one is EOPNOTSUPP. A tree into itself is EINVAL. Without a handler
/// the first failure inside a tree is that of the copy.
///
/// The path shows nothing until the copy is complete: a copy that fails is removed, and one that
/// the end of the process interrupts lies beside under a name of ours, which the next copy into
/// that folder removes.
[[nodiscard]] int FileManagerCopyItem(const PathAccess& source,
                                      const PathAccess& destination,
                                      const LeaveOutHandler& leavesOut = {});

/// True for an errno value that no single item can be blamed for: a full or broken disk, or no more
/// memory or descriptors.
[[nodiscard]] bool ConcernsAllItems(int error);

/// Moves an item to a path where nothing is; EEXIST when something is there. On one file system
/// everything stays as it is. To another one the item is copied, as above, and then removed: when
/// the copy fails the source is whole, when the removal fails both the copy and the rest stay.
[[nodiscard]] int FileManagerMoveItem(const PathAccess& source, const PathAccess& destination);

/// Removes an item with all below it. Stops at the first that cannot be removed. EINVAL for a path
/// that ends in "." or "..".
[[nodiscard]] int FileManagerRemoveItem(const PathAccess& item);

struct FileAttributes {
    std::optional<std::uint32_t> permissions{};  ///< as in chmod(2)
    std::optional<std::uint32_t> owner{};
    std::optional<std::uint32_t> group{};
};

/// Sets what is given, the owner and the group first. A link has no permissions of its own: those
/// are not set, and that is no failure.
[[nodiscard]] int FileManagerSetAttributes(const FileAttributes& attributes,
                                           const PathAccess& item);

enum class IntermediateDirectories : bool { kMustExist, kAreMade };

/// Makes a directory with these attributes; permissions that are not given are 0777 less the
/// process's mask. EEXIST when something is there. With intermediates, missing folders on the way
/// are made with the same attributes, and a directory that is there is a success and stays as it
/// is.
[[nodiscard]] int FileManagerCreateDirectory(std::string_view path,
                                             IntermediateDirectories intermediates,
                                             const FileAttributes& attributes);

/// Replaces the item at a path by a regular file with these contents: a reader sees the old item
/// or the new one, also when the system stops in the middle, and the new one lasts. It keeps the
/// permissions of a regular file that was there, else has 0644. A link is replaced, not followed; a
/// directory is EISDIR.
[[nodiscard]] int FileManagerReplaceContents(const PathAccess& item,
                                             std::span<const std::byte> contents);

}  // namespace platform
