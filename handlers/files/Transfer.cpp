// Ownership comes first, so that what the privileged service puts somewhere is its own from the
// start: the source is given away before it is copied or moved, and a failure to do so is ignored.
#include "handlers/files/Transfer.h"

#include <cerrno>
#include <string_view>
#include <vector>

#include "handlers/files/PathNames.h"
#include "platform/DirectoryAccess.h"
#include "platform/FileManager.h"

using platform::DirectoryAccess;
using platform::PathAccess;

namespace {

constexpr int kStatFailed = -1;

/// One bit of the file type, and tested as one: block devices and sockets have it, too, and count
/// as directories where a file is in the way.
constexpr std::uint32_t kDirectoryBit = 0x4000;

int CopyOrMove(TransferMode mode, const PathAccess& source, const PathAccess& destination) {
    return mode == TransferMode::kCopy ? FileManagerCopyItem(source, destination)
                                       : FileManagerMoveItem(source, destination);
}

/// An item of the source tree, and where it goes.
int MergeItem(const DirectoryAccess& from,
              const DirectoryAccess& to,
              std::string_view subpath,
              TransferMode mode) {
    const PathAccess source = from.item(subpath);
    if (const PathAccess old = to.item(subpath);
        KindAt(source) == ItemKind::kOther && KindAt(old) == ItemKind::kOther) {
        (void)FileManagerRemoveItem(old);  // what stays in the way fails the copy
    }
    if (const auto parent = subpath.rfind('/'); parent != std::string_view::npos) {
        (void)to.makeDirectories(subpath.substr(0, parent));  // likewise
    }
    return CopyOrMove(mode, source, to.item(subpath));
}

/// Item by item, whatever becomes of the others. The first failure, or 0.
int MergeItems(const PathAccess& source, const std::string& destination, TransferMode mode) {
    const DirectoryAccess from(source);
    std::vector<std::string> subpaths;
    if (const int error = from.subpaths(&subpaths); error != 0 || subpaths.empty()) {
        return error;
    }
    (void)FileManagerCreateDirectory(destination, platform::IntermediateDirectories::kAreMade, {});
    const DirectoryAccess to{PathAccess(destination)};
    int firstFailure = 0;
    for (const auto& subpath : subpaths) {
        const int error = MergeItem(from, to, subpath, mode);
        firstFailure = firstFailure != 0 ? firstFailure : error;
    }
    return firstFailure;
}

/// The whole at once where nothing is in the way, else its items one by one.
int Merge(const PathAccess& source, const std::string& destination, TransferMode mode) {
    if (CopyOrMove(mode, source, PathAccess(destination)) == 0) {
        return 0;
    }
    int failure = 0;
    if (KindAt(source) != ItemKind::kOther) {
        failure = MergeItems(source, destination, mode);
    }
    // A move leaves an empty folder. A copy does not, unless the source was empty to begin with: it
    // goes then, too. So does a folder stay whose subfolders were there on both sides.
    (void)source.removeDirectory();
    return failure;
}

}  // namespace

int PerformTransfer(const Transfer& transfer) {
    const PathAccess source(transfer.source);
    platform::FileStatus status;
    if (source.stat(&status) != 0) {
        return kStatFailed;
    }
    std::string end = transfer.destination;
    const PathAccess destination(end);
    const ItemKind kind = KindAt(destination);
    if (kind == ItemKind::kNone) {
        (void)source.setOwner(transfer.uid, transfer.gid);
        return CopyOrMove(transfer.mode, source, destination);
    }
    if (kind == ItemKind::kDirectory) {
        end += "/" + BaseName(transfer.source);
        if (const PathAccess old(end); KindAt(old) == ItemKind::kOther) {
            (void)FileManagerRemoveItem(old);  // what stays in the way fails the merge
        }
    } else if ((status.mode & kDirectoryBit) != 0) {
        return EEXIST;
    } else {
        (void)FileManagerRemoveItem(destination);  // likewise
    }
    (void)source.setOwner(transfer.uid, transfer.gid);
    (void)Merge(source, end, transfer.mode);  // callers do not hear of what could not be merged
    return 0;
}
