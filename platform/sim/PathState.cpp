#include "platform/sim/PathState.h"

#include <cerrno>

using sim::Links;
using sim::Node;

namespace platform {

int PathAccess::State::find(Node** found) const {
    if (error != 0) {
        return error;
    }
    *found = NodeAt(place);
    if (*found == nullptr) {
        return ENOENT;
    }
    return place.mustBeDirectory && !(*found)->file.is(sim::kDirectory) ? ENOTDIR : 0;
}

int PathAccess::State::find(const Node** found) const {
    Node* node = nullptr;
    const int failure = find(&node);
    *found = node;
    return failure;
}

int PathAccess::State::findBehindLink(const Node** found) const {
    const Node* const node = error == 0 ? NodeAt(place) : nullptr;
    if (node == nullptr || !node->file.is(sim::kLink)) {
        return find(found);
    }
    Node* end = nullptr;
    if (const int failure = sim::Walk(Links::kByRule).walk(place.parent, place.name, &end);
        failure != 0) {
        return failure;
    }
    *found = end;
    return place.mustBeDirectory && !end->file.is(sim::kDirectory) ? ENOTDIR : 0;
}

int PathAccess::State::removeEntry(const Node& node) const {
    if (place.name.empty() || place.name == ".") {
        return EINVAL;
    }
    if (place.name == ".." || !node.children.empty()) {
        return ENOTEMPTY;
    }
    place.parent->children.erase(place.name);
    return 0;
}

bool PathAccess::State::namesAnEntry() const {
    return !place.name.empty() && place.name != "." && place.name != "..";
}

}  // namespace platform
