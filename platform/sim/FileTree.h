// The tree behind SimFiles.h: its nodes, and how paths lead to them.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <string_view>

#include "platform/sim/SimFiles.h"

namespace sim {

struct Node {
    FileNode file;
    Node* parent = nullptr;
    std::map<std::string, std::unique_ptr<Node>, std::less<>> children;

    /// Puts something into a directory, in place of what has the name.
    Node* add(std::string_view name, FileNode made);

    [[nodiscard]] Node* child(std::string_view name) const;
};

/// The top of the tree.
[[nodiscard]] Node* TreeRoot();

enum class Links : bool { kByRule, kAll };

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

/// What stands at a place, or null.
[[nodiscard]] Node* NodeAt(const Place& place);

inline constexpr std::size_t kPathMax = 4096;

}  // namespace sim
