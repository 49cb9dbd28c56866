// Files of the tree in memory that are written from their start.
#include "platform/OutputFile.h"

#include <cerrno>
#include <string>

#include "platform/sim/FileTree.h"
#include "platform/sim/World.h"

using sim::Node;
using sim::Place;

namespace platform {
namespace {

int ErrorOf(const Node& node) {
    if (node.file.is(sim::kLink)) {
        return ELOOP;
    }
    if (node.file.is(sim::kDirectory)) {
        return EISDIR;
    }
    return node.file.is(sim::kRegular) ? 0 : EINVAL;
}

int Open(std::string_view path) {
    Place place;
    if (const int error = Resolve(path, sim::Links::kByRule, &place); error != 0) {
        return error;
    }
    if (place.mustBeDirectory) {
        return EISDIR;
    }
    Node* const node = NodeAt(place);
    if (node == nullptr) {
        place.parent->add(place.name, {.mode = sim::kRegular | 0644, .owner = 0, .contents = {}});
        return 0;
    }
    const int error = ErrorOf(*node);
    if (error == 0) {
        node->file.contents.clear();
    }
    return error;
}

}  // namespace

struct OutputFile::State {
    bool isOpen = false;
    std::string path;

    /// The file, or null: what was removed meanwhile is written all the same, and nobody sees it.
    [[nodiscard]] Node* file() const {
        Place place;
        Node* const node =
            Resolve(path, sim::Links::kByRule, &place) == 0 ? NodeAt(place) : nullptr;
        return node != nullptr && node->file.is(sim::kRegular) ? node : nullptr;
    }
};

OutputFile::OutputFile() : state_(std::make_unique<State>()) {}

OutputFile::OutputFile(OutputFile&&) noexcept = default;
OutputFile& OutputFile::operator=(OutputFile&&) noexcept = default;
OutputFile::~OutputFile() = default;

int OutputFile::open(std::string_view path) {
    *state_ = {.isOpen = false, .path = std::string(path)};
    const int error = sim::CallFails("OutputFile.open", path) ? EMFILE : Open(path);
    state_->isOpen = error == 0;
    return error;
}

int OutputFile::write(std::span<const std::byte> bytes) {
    if (!state_->isOpen) {
        return EBADF;
    }
    // A full file system takes what still fits.
    const bool fails = sim::CallFails("OutputFile.write", state_->path);
    const auto taken = fails ? bytes.first(bytes.size() / 2) : bytes;
    if (Node* const node = state_->file(); node != nullptr) {
        node->file.contents.append(reinterpret_cast<const char*>(taken.data()), taken.size());
    }
    return fails ? ENOSPC : 0;
}

int OutputFile::close() {
    if (!state_->isOpen) {
        return EBADF;
    }
    state_->isOpen = false;
    return sim::CallFails("OutputFile.close", state_->path) ? EIO : 0;
}

}  // namespace platform
