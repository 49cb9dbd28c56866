// Folders of the tree in memory.
#include "platform/DirectoryAccess.h"

#include <cerrno>
#include <utility>

#include "platform/sim/PathState.h"
#include "platform/sim/World.h"

using sim::Node;

namespace platform {
namespace {

void AddSubpaths(const Node& folder, const std::string& prefix, std::vector<std::string>& paths) {
    for (const auto& [name, child] : folder.children) {
        paths.push_back(prefix + name);
        AddSubpaths(*child, prefix + name + "/", paths);
    }
}

}  // namespace

struct DirectoryAccess::State {
    std::string path;
    Node* folder = nullptr;
    int error = 0;
};

DirectoryAccess::DirectoryAccess(const PathAccess& path) : state_(std::make_unique<State>()) {
    state_->path = path.state().path;
    const Node* found = nullptr;
    state_->error = sim::CallFails("DirectoryAccess.open", state_->path)
                        ? EMFILE
                        : path.state().findBehindLink(&found);
    if (state_->error == 0 && !found->file.is(sim::kDirectory)) {
        state_->error = ENOTDIR;
    }
    state_->folder = const_cast<Node*>(found);
}

DirectoryAccess::DirectoryAccess(DirectoryAccess&&) noexcept = default;
DirectoryAccess& DirectoryAccess::operator=(DirectoryAccess&&) noexcept = default;
DirectoryAccess::~DirectoryAccess() = default;

int DirectoryAccess::list(std::vector<std::string>* names) const {
    if (sim::CallFails("DirectoryAccess.list", state_->path)) {
        return EIO;
    }
    if (state_->error == 0) {
        names->clear();
        for (const auto& [name, child] : state_->folder->children) {
            names->push_back(name);
        }
    }
    return state_->error;
}

int DirectoryAccess::subpaths(std::vector<std::string>* paths) const {
    if (sim::CallFails("DirectoryAccess.subpaths", state_->path)) {
        return EIO;
    }
    if (state_->error == 0) {
        paths->clear();
        AddSubpaths(*state_->folder, "", *paths);
    }
    return state_->error;
}

PathAccess DirectoryAccess::item(std::string_view subpath) const {
    auto state = std::make_unique<PathAccess::State>();
    state->path = state_->path + "/" + std::string(subpath);
    state->error =
        state_->error != 0 ? state_->error : ResolveBelow(state_->folder, subpath, &state->place);
    return PathAccess(std::move(state));
}

int DirectoryAccess::makeDirectories(std::string_view subpath) const {
    if (sim::CallFails("DirectoryAccess.makeDirectories",
                       state_->path + "/" + std::string(subpath))) {
        return ENOSPC;
    }
    if (state_->error != 0) {
        return state_->error;
    }
    Node* at = state_->folder;
    while (!subpath.empty()) {
        const std::string name(subpath.substr(0, subpath.find('/')));
        subpath.remove_prefix(std::min(name.size() + 1, subpath.size()));
        Node* const next = at->child(name);
        at = next != nullptr ? next : at->add(name, {.mode = sim::kDirectory | 0755});
        if (!at->file.is(sim::kDirectory)) {
            return ENOTDIR;
        }
    }
    return 0;
}

}  // namespace platform
