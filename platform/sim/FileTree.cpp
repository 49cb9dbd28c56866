#include "platform/sim/FileTree.h"

#include <cerrno>
#include <stdexcept>
#include <utility>

#include "platform/sim/World.h"

namespace sim {
namespace {

constexpr int kLinksMax = 40;
constexpr std::size_t kNameMax = 255;

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

int ResolveFrom(Node* start, std::string_view path, Links links, Place* place) {
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
    const int error = Walk(links).walk(start, path.substr(0, folder), &place->parent);
    return error == 0 && !place->parent->file.is(sim::kDirectory) ? ENOTDIR : error;
}

Place PlaceInWorld(std::string_view path) {
    Place place;
    if (Resolve(path, Links::kAll, &place) != 0) {
        throw std::invalid_argument("no such folder: " + std::string(path));
    }
    return place;
}

}  // namespace

Node* Node::add(std::string_view name, FileNode made) {
    auto node = std::make_unique<Node>();
    node->file = std::move(made);
    return add(name, std::move(node));
}

Node* Node::add(std::string_view name, std::unique_ptr<Node> node) {
    node->parent = this;
    auto& place = children[std::string(name)];
    place = std::move(node);
    return place.get();
}

Node* Node::child(std::string_view name) const {
    const auto found = children.find(name);
    return found == children.end() ? nullptr : found->second.get();
}

const Node* FileSystemOf(const Node& node) {
    const Node* at = &node;
    while (!at->isMountPoint && at != TreeRoot()) {
        at = at->parent;
    }
    return at;
}

bool IsWithin(const Node& node, const Node& folder) {
    const Node* at = &node;
    while (at != &folder && at != TreeRoot()) {
        at = at->parent;
    }
    return at == &folder;
}

Node* TreeRoot() {
    return Root().get();
}

int Walk::walk(Node* from, std::string_view path, Node** end) {
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

int Walk::step(Node** at, std::string_view name) {
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

int Walk::follow(const Node& link, Node** at) {
    if (links_ == Links::kNone) {
        return ENOTDIR;
    }
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

int Resolve(std::string_view path, Links links, Place* place) {
    if (path.empty()) {
        return ENOENT;
    }
    return path.size() >= kPathMax ? ENAMETOOLONG : ResolveFrom(TreeRoot(), path, links, place);
}

int ResolveBelow(Node* folder, std::string_view subpath, Place* place) {
    return ResolveFrom(folder, subpath, Links::kNone, place);
}

/// What stands at a place, or null.
Node* NodeAt(const Place& place) {
    if (place.name.empty() || place.name == ".") {
        return place.parent;
    }
    return place.name == ".." ? place.parent->parent : place.parent->child(place.name);
}

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

void LinkFile(std::string_view path, std::string_view secondPath) {
    const Place second = PlaceInWorld(secondPath);
    second.parent->add(second.name, std::make_unique<Node>(NodeAt(PlaceInWorld(path))->inode));
}

bool AreOneFile(std::string_view path, std::string_view otherPath) {
    const Node* const node = NodeAt(PlaceInWorld(path));
    const Node* const other = NodeAt(PlaceInWorld(otherPath));
    return node != nullptr && other != nullptr && node->inode == other->inode;
}

void MountAt(std::string_view path) {
    NodeAt(PlaceInWorld(path))->isMountPoint = true;
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
