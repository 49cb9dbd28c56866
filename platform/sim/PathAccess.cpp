// The file tree in memory, with the rules of the road for links that strangers own.
#include "platform/PathAccess.h"

#include <cerrno>
#include <map>
#include <utility>
#include <vector>

#include "platform/sim/SimFiles.h"
#include "platform/sim/World.h"

using sim::FileNode;

namespace {

constexpr int kLinksMax = 40;
constexpr std::size_t kPathMax = 4096;
constexpr std::size_t kNameMax = 255;

struct Node {
    FileNode file;
    Node* parent = nullptr;
    std::map<std::string, std::unique_ptr<Node>, std::less<>> children;

    Node* add(std::string_view name, FileNode made) {
        auto node = std::make_unique<Node>();
        node->file = std::move(made);
        node->parent = this;
        auto& place = children[std::string(name)];
        place = std::move(node);
        return place.get();
    }

    [[nodiscard]] Node* child(std::string_view name) const {
        const auto found = children.find(name);
        return found == children.end() ? nullptr : found->second.get();
    }
};

FileNode DirectoryOf(std::uint32_t owner) {
    return {.mode = sim::kDirectory | 0755, .owner = owner, .contents = {}};
}

std::unique_ptr<Node> MakeTree() {
    constexpr std::uint32_t kMobile = 501;
    auto root = std::make_unique<Node>();
    root->file = DirectoryOf(0);
    root->parent = root.get();
    Node* const privateVar = root->add("private", DirectoryOf(0))->add("var", DirectoryOf(0));
    Node* const library =
        privateVar->add("mobile", DirectoryOf(kMobile))->add("Library", DirectoryOf(kMobile));
    library->add("Preferences", DirectoryOf(kMobile));
    root->add("var", DirectoryOf(0))
        ->add("mobile", {.mode = sim::kLink | 0777, .contents = "../private/var/mobile"});
    root->add("tmp", {.mode = sim::kDirectory | 01777, .contents = {}});
    return root;
}

std::unique_ptr<Node>& Root() {
    static auto& root = *new std::unique_ptr<Node>(MakeTree());
    return root;
}

enum class Links : bool { kByRule, kAll };

/// One resolution: the links that it has followed are counted from end to end.
class Walk {
public:
    explicit Walk(Links links) : links_(links) {}

    int walk(Node* from, std::string_view path, Node** end) {
        Node* at = path.starts_with('/') ? Root().get() : from;
        while (!path.empty()) {
            const std::size_t slash = path.find('/');
            const auto name = path.substr(0, slash);
            path.remove_prefix(slash == std::string_view::npos ? path.size() : slash + 1);
            if (const int error = step(&at, name); error != 0) {
                return error;
            }
        }
        *end = at;
        return 0;
    }

private:
    int step(Node** at, std::string_view name) {
        if (!(*at)->file.is(sim::kDirectory)) {
            return ENOTDIR;
        }
        if (name.size() > kNameMax) {
            return ENAMETOOLONG;
        }
        if (name == "..") {
            *at = (*at)->parent;
        }
        if (name.empty() || name == "." || name == "..") {
            return 0;
        }
        Node* const next = (*at)->child(name);
        if (next == nullptr) {
            return ENOENT;
        }
        return next->file.is(sim::kLink) ? follow(*next, at) : (*at = next, 0);
    }

    int follow(const Node& link, Node** at) {
        if (++followed_ > kLinksMax) {
            return ELOOP;
        }
        Node* end = nullptr;
        if (const int error = walk(link.parent, link.file.contents, &end); error != 0) {
            return error;
        }
        const bool isAllowed =
            links_ == Links::kAll || link.file.owner == 0 || link.file.owner == end->file.owner;
        if (!isAllowed) {
            return EPERM;
        }
        *at = end;
        return 0;
    }

    const Links links_;
    int followed_ = 0;
};

struct Place {
    Node* parent = nullptr;
    std::string name;
    bool mustBeDirectory = false;  // a slash stands behind it
};

int Resolve(std::string_view path, Links links, Place* place) {
    if (path.empty()) {
        return ENOENT;
    }
    if (path.size() >= kPathMax) {
        return ENAMETOOLONG;
    }
    while (path.size() > 1 && path.ends_with('/')) {
        path.remove_suffix(1);
        place->mustBeDirectory = true;
    }
    const std::size_t slash = path.rfind('/');
    const std::size_t folder = slash == std::string_view::npos ? 0 : slash + 1;
    place->name = path.substr(folder);
    if (place->name.size() > kNameMax) {
        return ENAMETOOLONG;
    }
    const int error = Walk(links).walk(Root().get(), path.substr(0, folder), &place->parent);
    return error == 0 && !place->parent->file.is(sim::kDirectory) ? ENOTDIR : error;
}

/// What stands at a place, or null.
Node* NodeAt(const Place& place) {
    if (place.name.empty() || place.name == ".") {
        return place.parent;
    }
    return place.name == ".." ? place.parent->parent : place.parent->child(place.name);
}

Place PlaceInWorld(std::string_view path) {
    Place place;
    if (Resolve(path, Links::kAll, &place) != 0) {
        throw std::invalid_argument("no such folder: " + std::string(path));
    }
    return place;
}

}  // namespace

namespace sim {

void ResetFiles() {
    Root() = MakeTree();
}

void MakeFile(std::string_view path, FileNode node) {
    const Place place = PlaceInWorld(path);
    place.parent->add(place.name, std::move(node));
}

void MakeDirectory(std::string_view path, std::uint32_t owner) {
    MakeFile(path, DirectoryOf(owner));
}

void MakeLink(std::string_view path, std::string_view target, std::uint32_t owner) {
    MakeFile(path, {.mode = kLink | 0777, .owner = owner, .contents = std::string(target)});
}

void RemoveFile(std::string_view path) {
    const Place place = PlaceInWorld(path);
    place.parent->children.erase(place.name);
}

std::optional<FileNode> FileAt(std::string_view path) {
    Place place;
    if (Resolve(path, Links::kAll, &place) != 0) {
        return std::nullopt;
    }
    const Node* const node = NodeAt(place);
    return node == nullptr ? std::nullopt : std::optional(node->file);
}

}  // namespace sim

namespace platform {

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

    /// The same, where a link with a slash behind it means what it leads to.
    int findBehindSlash(const Node** found) const {
        const Node* const node = error == 0 ? NodeAt(place) : nullptr;
        if (node == nullptr || !place.mustBeDirectory || !node->file.is(sim::kLink)) {
            return find(found);
        }
        Node* end = nullptr;
        if (const int failure = Walk(Links::kByRule).walk(place.parent, place.name, &end);
            failure != 0) {
            return failure;
        }
        *found = end;
        return end->file.is(sim::kDirectory) ? 0 : ENOTDIR;
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
    if (const int error = state_->findBehindSlash(&node); error != 0) {
        return error;
    }
    *status = {.mode = node->file.mode, .uid = node->file.owner, .gid = node->file.owner};
    return 0;
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
    if (state_->error != 0 || contents.empty() || contents.size() >= kPathMax) {
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

}  // namespace platform
