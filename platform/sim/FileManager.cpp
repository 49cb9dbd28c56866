// Whole items of the tree in memory.
#include "platform/FileManager.h"

#include <cerrno>
#include <map>
#include <string>
#include <utility>

#include "platform/Process.h"
#include "platform/sim/PathState.h"
#include "platform/sim/World.h"

using sim::FileNode;
using sim::Node;

namespace platform {
namespace {

constexpr std::uint32_t kPermissionBits = 07777;
constexpr std::uint32_t kSetIdBits = 06000;
constexpr std::uint32_t kMask = 022;
constexpr std::string_view kUserAttributes = "user.";

std::string Both(const PathAccess& source, const PathAccess& destination) {
    return source.state().path + " -> " + destination.state().path;
}

/// Whether it can be copied; anything else is left out of a tree.
bool IsOrdinary(const FileNode& file) {
    return file.is(sim::kRegular) || file.is(sim::kDirectory) || file.is(sim::kLink);
}

FileNode CopyOf(const FileNode& file) {
    FileNode copy = file;
    copy.mode &= ~kSetIdBits;
    copy.owner = ProcessUserId();
    copy.group = ProcessGroupId();
    std::erase_if(copy.attributes, [](const auto& attribute) {
        return !attribute.first.starts_with(kUserAttributes);
    });
    return copy;
}

using Copies = std::map<const FileNode*, std::shared_ptr<FileNode>>;

std::unique_ptr<Node> CopyTree(const Node& node, Copies& copies) {
    auto& shared = copies[node.inode.get()];
    if (shared == nullptr) {
        shared = std::make_shared<FileNode>(CopyOf(node.file));
    }
    auto copy = std::make_unique<Node>(shared);
    for (const auto& [name, child] : node.children) {
        if (IsOrdinary(child->file)) {
            copy->add(name, CopyTree(*child, copies));
        }
    }
    return copy;
}

/// Both ends looked at, before anything changes.
struct Ends {
    Node* item = nullptr;
    const PathAccess::State* end = nullptr;
    int error = 0;
};

Ends Look(const PathAccess& source, const PathAccess& destination) {
    Ends ends{.item = nullptr, .end = &destination.state()};
    ends.error = source.state().find(&ends.item);
    if (ends.error == 0) {
        ends.error = ends.end->error;
    }
    if (ends.error == 0 && NodeAt(ends.end->place) != nullptr) {
        ends.error = EEXIST;
    }
    if (ends.error == 0 && ends.end->place.mustBeDirectory &&
        !ends.item->file.is(sim::kDirectory)) {
        ends.error = ENOTDIR;
    }
    if (ends.error == 0 && IsWithin(*ends.end->place.parent, *ends.item)) {
        ends.error = EINVAL;
    }
    return ends;
}

int Copy(const Ends& ends) {
    if (!IsOrdinary(ends.item->file)) {
        return EOPNOTSUPP;
    }
    Copies copies;
    ends.end->place.parent->add(ends.end->place.name, CopyTree(*ends.item, copies));
    return 0;
}

void TakeOut(const PathAccess& item) {
    item.state().place.parent->children.erase(item.state().place.name);
}

int MakeOne(Node* folder, const std::string& name, const FileAttributes& attributes) {
    folder->add(name,
                {.mode = sim::kDirectory |
                         (attributes.permissions.value_or(0777 & ~kMask) & kPermissionBits),
                 .owner = attributes.owner.value_or(ProcessUserId()),
                 .group = attributes.group.value_or(ProcessGroupId())});
    return 0;
}

/// The first missing folder on the way, where everything before it is there.
int MakeWithIntermediates(std::string_view path, const FileAttributes& attributes) {
    Node* end = nullptr;
    for (std::size_t length = path.find_first_not_of('/'); length < path.size();) {
        length = std::min(path.find('/', length), path.size());
        const auto way = path.substr(0, length);
        int error = sim::Walk(sim::Links::kByRule).walk(sim::TreeRoot(), way, &end);
        if (error == ENOENT) {
            sim::Place place;
            error = Resolve(way, sim::Links::kByRule, &place);
            // A link that leads nowhere has the name already.
            if (error == 0 && NodeAt(place) != nullptr) {
                error = ENOENT;
            }
            if (error == 0) {
                error = MakeOne(place.parent, place.name, attributes);
                end = NodeAt(place);
            }
        }
        if (error != 0) {
            return error;
        }
        if (!end->file.is(sim::kDirectory)) {
            return path.find_first_not_of('/', length) == std::string_view::npos ? EEXIST : ENOTDIR;
        }
        length = path.find_first_not_of('/', length);
    }
    return 0;
}

}  // namespace

int FileManagerCopyItem(const PathAccess& source,
                        const PathAccess& destination,
                        const LeaveOutHandler& /*leavesOut: here nothing inside a tree fails*/) {
    if (sim::CallFails("FileManager.copyItem", Both(source, destination))) {
        return ENOSPC;
    }
    const Ends ends = Look(source, destination);
    return ends.error != 0 ? ends.error : Copy(ends);
}

int FileManagerMoveItem(const PathAccess& source, const PathAccess& destination) {
    if (sim::CallFails("FileManager.moveItem", Both(source, destination))) {
        return EIO;
    }
    const Ends ends = Look(source, destination);
    if (ends.error != 0) {
        return ends.error;
    }
    if (!source.state().namesAnEntry() || ends.item->isMountPoint) {
        return EBUSY;
    }
    if (FileSystemOf(*ends.item) != FileSystemOf(*ends.end->place.parent)) {
        const int error = Copy(ends);
        if (error == 0) {
            TakeOut(source);
        }
        return error;
    }
    auto& siblings = source.state().place.parent->children;
    auto moved = std::move(siblings.at(source.state().place.name));
    TakeOut(source);
    ends.end->place.parent->add(ends.end->place.name, std::move(moved));
    return 0;
}

int FileManagerRemoveItem(const PathAccess& item) {
    if (sim::CallFails("FileManager.removeItem", item.state().path)) {
        return EIO;
    }
    Node* node = nullptr;
    if (const int error = item.state().find(&node); error != 0) {
        return error;
    }
    if (!item.state().namesAnEntry()) {
        return EINVAL;
    }
    TakeOut(item);
    return 0;
}

int FileManagerSetAttributes(const FileAttributes& attributes, const PathAccess& item) {
    if (sim::CallFails("FileManager.setAttributes", item.state().path)) {
        return EPERM;
    }
    Node* node = nullptr;
    if (const int error = item.state().find(&node); error != 0) {
        return error;
    }
    FileNode& file = node->file;
    const std::uint32_t group = attributes.group.value_or(file.groupId());
    file.owner = attributes.owner.value_or(file.owner);
    file.group = group;
    if (attributes.permissions && !file.is(sim::kLink)) {
        file.mode = (file.mode & ~kPermissionBits) | (*attributes.permissions & kPermissionBits);
    }
    return 0;
}

int FileManagerCreateDirectory(std::string_view path,
                               IntermediateDirectories intermediates,
                               const FileAttributes& attributes) {
    if (sim::CallFails("FileManager.createDirectory", path)) {
        return ENOSPC;
    }
    sim::Place place;
    if (path.empty()) {
        return ENOENT;
    }
    if (intermediates == IntermediateDirectories::kAreMade) {
        return MakeWithIntermediates(path, attributes);
    }
    if (const int error = Resolve(path, sim::Links::kByRule, &place); error != 0) {
        return error;
    }
    return NodeAt(place) != nullptr ? EEXIST : MakeOne(place.parent, place.name, attributes);
}

int FileManagerReplaceContents(const PathAccess& item, std::span<const std::byte> contents) {
    if (sim::CallFails("FileManager.replaceContents", item.state().path)) {
        return ENOSPC;
    }
    const auto& [path, place, error] = item.state();
    if (error != 0) {
        return error;
    }
    const Node* const old = NodeAt(place);
    if (old != nullptr && old->file.is(sim::kDirectory)) {
        return EISDIR;
    }
    if (place.mustBeDirectory) {
        return ENOTDIR;
    }
    const std::uint32_t mode =
        old != nullptr && old->file.is(sim::kRegular) ? old->file.mode & 0777 : 0666 & ~kMask;
    place.parent->add(
        place.name,
        {.mode = sim::kRegular | mode,
         .owner = ProcessUserId(),
         .contents = {reinterpret_cast<const char*>(contents.data()), contents.size()},
         .group = ProcessGroupId()});
    return 0;
}

}  // namespace platform
