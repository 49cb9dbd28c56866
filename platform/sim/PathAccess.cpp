// The file tree in memory, with the rules of the road for links that strangers own.
#include "platform/PathAccess.h"

#include <cerrno>
#include <utility>

#include "platform/sim/FileTree.h"
#include "platform/sim/World.h"

using sim::Links;
using sim::Node;
using sim::Place;
using sim::Walk;

namespace platform {
namespace {

FileStatus StatusOf(const Node& node) {
    return {.mode = node.file.mode, .uid = node.file.owner, .gid = node.file.owner};
}

bool NamesAnEntry(const Place& place) {
    return !place.name.empty() && place.name != "." && place.name != "..";
}

/// Whether something may take the place of what stands there: 0 or why not.
int ReplacementError(const Node& node, const Place& place) {
    for (const Node* above = place.parent; above != sim::TreeRoot(); above = above->parent) {
        if (above == &node) {
            return EINVAL;
        }
    }
    const Node* const replaced = NodeAt(place);
    if (replaced == nullptr || replaced == &node) {
        return 0;
    }
    const bool isDirectory = node.file.is(sim::kDirectory);
    if (isDirectory != replaced->file.is(sim::kDirectory)) {
        return isDirectory ? ENOTDIR : EISDIR;
    }
    return replaced->children.empty() ? 0 : ENOTEMPTY;
}

}  // namespace

struct PathAccess::State {
    std::string path;
    Place place;
    int error = 0;

    int find(const Node** found) const {
        if (error != 0) {
            return error;
        }
        *found = NodeAt(place);
        if (*found == nullptr) {
            return ENOENT;
        }
        return place.mustBeDirectory && !(*found)->file.is(sim::kDirectory) ? ENOTDIR : 0;
    }

    /// The same, where a link means what it leads to.
    int findBehindLink(const Node** found) const {
        const Node* const node = error == 0 ? NodeAt(place) : nullptr;
        if (node == nullptr || !node->file.is(sim::kLink)) {
            return find(found);
        }
        Node* end = nullptr;
        if (const int failure = Walk(Links::kByRule).walk(place.parent, place.name, &end);
            failure != 0) {
            return failure;
        }
        *found = end;
        return place.mustBeDirectory && !end->file.is(sim::kDirectory) ? ENOTDIR : 0;
    }
};

PathAccess::PathAccess(std::string_view path) : state_(std::make_unique<State>()) {
    state_->path = path;
    state_->error = sim::CallFails("PathAccess.open", path)
                        ? EMFILE
                        : Resolve(path, Links::kByRule, &state_->place);
}

PathAccess::PathAccess(PathAccess&&) noexcept = default;
PathAccess& PathAccess::operator=(PathAccess&&) noexcept = default;
PathAccess::~PathAccess() = default;

int PathAccess::lstat(FileStatus* status) const {
    if (sim::CallFails("PathAccess.lstat", state_->path)) {
        return EIO;
    }
    const Node* node = nullptr;
    // With a slash behind it the last step means what a link there leads to.
    const int error =
        state_->place.mustBeDirectory ? state_->findBehindLink(&node) : state_->find(&node);
    if (error == 0) {
        *status = StatusOf(*node);
    }
    return error;
}

int PathAccess::stat(FileStatus* status) const {
    if (sim::CallFails("PathAccess.stat", state_->path)) {
        return EIO;
    }
    const Node* node = nullptr;
    const int error = state_->findBehindLink(&node);
    if (error == 0) {
        *status = StatusOf(*node);
    }
    return error;
}

int PathAccess::remove() const {
    if (sim::CallFails("PathAccess.remove", state_->path)) {
        return EIO;
    }
    const Node* node = nullptr;
    if (const int error = state_->find(&node); error != 0) {
        return error;
    }
    const auto& [parent, name, mustBeDirectory] = state_->place;
    if (name.empty() || name == ".") {
        return EINVAL;
    }
    if (name == ".." || !node->children.empty()) {
        return ENOTEMPTY;
    }
    parent->children.erase(name);
    return 0;
}

int PathAccess::symlink(std::string_view contents) const {
    if (sim::CallFails("PathAccess.symlink", state_->path + " -> " + std::string(contents))) {
        return EIO;
    }
    if (state_->error != 0 || contents.empty() || contents.size() >= sim::kPathMax) {
        return state_->error != 0 ? state_->error : contents.empty() ? ENOENT : ENAMETOOLONG;
    }
    if (NodeAt(state_->place) != nullptr) {
        return EEXIST;
    }
    if (state_->place.mustBeDirectory) {
        return ENOENT;
    }
    state_->place.parent->add(
        state_->place.name,
        {.mode = sim::kLink | 0777, .owner = 0, .contents = std::string(contents)});
    return 0;
}

int PathAccess::makeDirectory(std::uint32_t mode) const {
    constexpr std::uint32_t kMask = 022;
    if (sim::CallFails("PathAccess.makeDirectory", state_->path)) {
        return EIO;
    }
    if (state_->error != 0) {
        return state_->error;
    }
    if (NodeAt(state_->place) != nullptr) {
        return EEXIST;
    }
    state_->place.parent->add(state_->place.name,
                              {.mode = sim::kDirectory | (mode & 07777 & ~kMask), .owner = 0});
    return 0;
}

int PathAccess::moveOnto(const PathAccess& destination) const {
    if (sim::CallFails("PathAccess.moveOnto", state_->path + " -> " + destination.state_->path)) {
        return EIO;
    }
    const State& end = *destination.state_;
    if (state_->error != 0 || end.error != 0) {
        return state_->error != 0 ? state_->error : end.error;
    }
    if (!NamesAnEntry(state_->place) || !NamesAnEntry(end.place)) {
        return EBUSY;
    }
    const Node* node = nullptr;
    if (const int error = state_->find(&node); error != 0) {
        return error;
    }
    if (end.place.mustBeDirectory && !node->file.is(sim::kDirectory)) {
        return ENOTDIR;
    }
    if (const int error = ReplacementError(*node, end.place); error != 0) {
        return error;
    }
    if (NodeAt(end.place) == node) {
        return 0;
    }
    auto& siblings = state_->place.parent->children;
    const auto at = siblings.find(state_->place.name);
    auto moved = std::move(at->second);
    siblings.erase(at);
    moved->parent = end.place.parent;
    end.place.parent->children[end.place.name] = std::move(moved);
    return 0;
}

int PathAccess::synchronize() const {
    if (sim::CallFails("PathAccess.synchronize", state_->path)) {
        return EIO;
    }
    const Node* node = nullptr;
    if (const int error = state_->find(&node); error != 0) {
        return error;
    }
    if (node->file.is(sim::kLink)) {
        return ELOOP;
    }
    return node->file.is(sim::kRegular) || node->file.is(sim::kDirectory) ? 0 : EINVAL;
}

}  // namespace platform
