// The tree behind SimFiles.h: its nodes, and how paths lead to them.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>

#include "platform/sim/SimFiles.h"

namespace sim {

struct Node {
    Node() : Node(std::make_shared<FileNode>()) {}

    explicit Node(std::shared_ptr<FileNode> shared) : inode(std::move(shared)), file(*inode) {}

    std::shared_ptr<FileNode> inode;  ///< hard links share it
    FileNode& file;
    Node* parent = nullptr;
    bool isMountPoint = false;
    std::map<std::string, std::unique_ptr<Node>, std::less<>> children;

    /// Puts something into a directory, in place of what has the name.
    Node* add(std::string_view name, FileNode made);
    Node* add(std::string_view name, std::unique_ptr<Node> node);

    [[nodiscard]] Node* child(std::string_view name) const;
};

/// The folder that begins the file system on which something lies.
[[nodiscard]] const Node* FileSystemOf(const Node& node);

/// Whether `node` is `folder` or lies somewhere below it.
[[nodiscard]] bool IsWithin(const Node& node, const Node& folder);

/// The top of the tree.
[[nodiscard]] Node* TreeRoot();

enum class Links : std::uint8_t { kByRule, kAll, kNone };

/// One resolution: the links that it has followed are counted from end to end.
class Walk {
public:
    explicit Walk(Links links) : links_(links) {}

    /// Where a path leads, links in the last step followed as well. 0 or an errno value.
    int walk(Node* from, std::string_view path, Node** end);

private:
    int step(Node** at, std::string_view name);
    int follow(const Node& link, Node** at);

    const Links links_;
    int followed_ = 0;
};

/// A path up to its last step, and that step.
struct Place {
    Node* parent = nullptr;
    std::string name;
    bool mustBeDirectory = false;  ///< a slash stands behind it
};

/// 0 or an errno value.
int Resolve(std::string_view path, Links links, Place* place);

/// The same for a path below a folder; no link on the way there is followed.
int ResolveBelow(Node* folder, std::string_view subpath, Place* place);

/// What stands at a place, or null.
[[nodiscard]] Node* NodeAt(const Place& place);

inline constexpr std::size_t kPathMax = 4096;

}  // namespace sim
