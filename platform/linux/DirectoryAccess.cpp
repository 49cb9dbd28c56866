#include "platform/DirectoryAccess.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

#include "platform/linux/Folder.h"
#include "platform/linux/PathState.h"
#include "platform/linux/PathWalk.h"

namespace platform {
namespace {

/// All that lies below a folder, listed without following a link.
class SubpathWalk {
public:
    explicit SubpathWalk(std::vector<std::string>& paths) : paths_(paths) {}

    int walk(int top);

private:
    struct Level {
        Folder folder{};
        std::size_t pathLength = 0;  ///< of path_, without this folder
    };

    int enter(int parent, const std::string& name);
    int finish();

    std::vector<std::string>& paths_;
    std::vector<Level> levels_;
    PendingFolders pending_;
    std::string path_;  ///< of the folder that the walk is in
    std::size_t bytes_ = 0;
};

int SubpathWalk::walk(int top) {
    int error = enter(top, ".");
    std::string name;
    while (error == 0 && !levels_.empty()) {
        error = pending_.next(&name) ? enter(levels_.back().folder.file().get(), name) : finish();
    }
    return error;
}

int SubpathWalk::enter(int parent, const std::string& name) {
    Level level{.pathLength = path_.size()};
    if (const int error = level.folder.open(parent, name.c_str()); error != 0) {
        return error;
    }
    path_ += levels_.empty() ? "" : name + "/";
    levels_.push_back(std::move(level));
    if (levels_.size() > kOpenFoldersMax) {
        if (const int error = levels_[levels_.size() - 1 - kOpenFoldersMax].folder.leave();
            error != 0) {
            return error;
        }
    }
    if (const int error = pending_.enter(); error != 0) {
        return error;
    }
    return ForEachEntry(levels_.back().folder.file(),
                        [this](const char* entry, unsigned char type) {
                            constexpr std::size_t kBytesMax = 128U << 20;
                            constexpr std::size_t kOverhead = 64;
                            paths_.push_back(path_ + entry);
                            bytes_ += paths_.back().size() + kOverhead;
                            if (bytes_ > kBytesMax) {
                                return E2BIG;
                            }
                            return type == DT_DIR ? pending_.add(entry) : 0;
                        });
}

int SubpathWalk::finish() {
    const Level level = std::move(levels_.back());
    levels_.pop_back();
    pending_.leave();
    path_.resize(level.pathLength);
    return levels_.empty() ? 0 : levels_.back().folder.comeBackFrom(level.folder);
}

/// The folders on a path that is not longer than the system takes at once: most are not.
int MakeDirectoriesBelow(const OwnedFd& top, std::string_view path) {
    Folder at;
    int error = at.open(top.get(), ".");
    while (error == 0 && !path.empty()) {
        const std::string name(path.substr(0, path.find('/')));
        path.remove_prefix(std::min(name.size() + 1, path.size()));
        Folder next;
        error = next.open(at.file().get(), name.c_str());
        if (error == ENOENT && mkdirat(at.file().get(), name.c_str(), 0755) == 0) {
            error = next.open(at.file().get(), name.c_str());
        }
        at = std::move(next);
    }
    return error;
}

}  // namespace

struct DirectoryAccess::State {
    OwnedFd folder;
    int error = 0;
};

DirectoryAccess::DirectoryAccess(const PathAccess& path) : state_(std::make_unique<State>()) {
    const PathAccess::State& place = path.state();
    if (place.error != 0) {
        state_->error = place.error;
        return;
    }
    Opened found = PathWalk().step(place.parent, place.name);
    Folder folder;
    state_->error = found.error != 0 ? found.error : folder.open(found.file.get(), ".");
    state_->folder = std::move(found.file);
}

DirectoryAccess::DirectoryAccess(DirectoryAccess&&) noexcept = default;
DirectoryAccess& DirectoryAccess::operator=(DirectoryAccess&&) noexcept = default;
DirectoryAccess::~DirectoryAccess() = default;

int DirectoryAccess::list(std::vector<std::string>* names) const {
    Folder folder;
    int error = state_->error;
    if (error == 0) {
        error = folder.open(state_->folder.get(), ".");
    }
    std::vector<std::string> found;
    if (error == 0) {
        error = ForEachEntry(folder.file(), [&found](const char* name, unsigned char /*type*/) {
            found.emplace_back(name);
            return 0;
        });
    }
    if (error == 0) {
        *names = std::move(found);
    }
    return error;
}

int DirectoryAccess::subpaths(std::vector<std::string>* paths) const {
    std::vector<std::string> found;
    const int error =
        state_->error != 0 ? state_->error : SubpathWalk(found).walk(state_->folder.get());
    if (error == 0) {
        *paths = std::move(found);
    }
    return error;
}

PathAccess DirectoryAccess::item(std::string_view subpath) const {
    auto item = std::make_unique<PathAccess::State>();
    const SplitPath split = Split(subpath);
    item->name = split.last.substr(0, split.last.find('/'));
    item->endsInSlash = split.endsInSlash;
    item->error = state_->error;
    if (item->error == 0) {
        Opened parent = OpenBelow(state_->folder.get(), split.parent);
        item->parent = std::move(parent.file);
        item->error = parent.error;
    }
    return PathAccess(std::move(item));
}

int DirectoryAccess::makeDirectories(std::string_view subpath) const {
    if (state_->error != 0) {
        return state_->error;
    }
    const Opened found = OpenBelow(state_->folder.get(), subpath);
    return found.error == ENOENT ? MakeDirectoriesBelow(state_->folder, subpath) : found.error;
}

}  // namespace platform
