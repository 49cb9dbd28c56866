// The file tree in memory, with the rules of the road for links that strangers own.
#include "platform/PathAccess.h"

#include <algorithm>
#include <cerrno>
#include <span>
#include <utility>

#include "platform/sim/PathState.h"
#include "platform/sim/World.h"

using sim::Links;
using sim::Node;
using sim::Place;

namespace platform {
namespace {

constexpr std::uint32_t kUnchanged = 0xFFFFFFFF;

FileStatus StatusOf(const Node& node) {
    return {.mode = node.file.mode, .uid = node.file.owner, .gid = node.file.groupId()};
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

PathAccess::PathAccess(std::string_view path) : state_(std::make_unique<State>()) {
    state_->path = path;
    state_->error = sim::CallFails("PathAccess.open", path)
                        ? EMFILE
                        : Resolve(path, Links::kByRule, &state_->place);
}

PathAccess::PathAccess(std::unique_ptr<State> state) : state_(std::move(state)) {}

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
    return state_->removeEntry(*node);
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

int PathAccess::removeDirectory() const {
    if (sim::CallFails("PathAccess.removeDirectory", state_->path)) {
        return EIO;
    }
    const Node* node = nullptr;
    if (const int error = state_->find(&node); error != 0) {
        return error;
    }
    return node->file.is(sim::kDirectory) ? state_->removeEntry(*node) : ENOTDIR;
}

int PathAccess::readLink(std::string* contents) const {
    if (sim::CallFails("PathAccess.readLink", state_->path)) {
        return EIO;
    }
    const Node* node = nullptr;
    if (const int error = state_->find(&node); error != 0) {
        return error;
    }
    if (!node->file.is(sim::kLink)) {
        return EINVAL;
    }
    *contents = node->file.contents;
    return 0;
}

int PathAccess::realPath(std::string* path) const {
    if (sim::CallFails("PathAccess.realPath", state_->path)) {
        return EIO;
    }
    const Node* node = nullptr;
    if (const int error = state_->findBehindLink(&node); error != 0) {
        return error;
    }
    std::string text;
    for (; node != sim::TreeRoot(); node = node->parent) {
        const auto& siblings = node->parent->children;
        const auto self = std::ranges::find_if(
            siblings, [node](const auto& sibling) { return sibling.second.get() == node; });
        text.insert(0, "/" + self->first);
    }
    *path = text.empty() ? "/" : text;
    return 0;
}

int PathAccess::read(std::size_t most, std::vector<std::byte>* contents) const {
    if (sim::CallFails("PathAccess.read", state_->path)) {
        return EIO;
    }
    const Node* node = nullptr;
    if (const int error = state_->findBehindLink(&node); error != 0) {
        return error;
    }
    if (!node->file.is(sim::kRegular) || node->file.contents.size() > most) {
        return node->file.is(sim::kRegular) ? EFBIG : EINVAL;
    }
    const auto bytes = std::as_bytes(std::span(node->file.contents));
    contents->assign(bytes.begin(), bytes.end());
    return 0;
}

int PathAccess::setOwner(std::uint32_t uid, std::uint32_t gid) const {
    if (sim::CallFails("PathAccess.setOwner", state_->path)) {
        return EPERM;
    }
    Node* node = nullptr;
    const int error = state_->find(&node);
    if (error == 0) {
        const std::uint32_t oldGroup = node->file.groupId();
        node->file.owner = uid != kUnchanged ? uid : node->file.owner;
        node->file.group = gid != kUnchanged ? gid : oldGroup;
    }
    return error;
}

int PathAccess::setMode(std::uint32_t mode) const {
    if (sim::CallFails("PathAccess.setMode", state_->path)) {
        return EPERM;
    }
    Node* node = nullptr;
    const int error = state_->find(&node);
    if (error != 0 || node->file.is(sim::kLink)) {
        return error != 0 ? error : EOPNOTSUPP;
    }
    node->file.mode = (node->file.mode & 0170000) | (mode & 07777);
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
