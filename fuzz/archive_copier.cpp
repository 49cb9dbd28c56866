// Archives: whatever one says, what comes of it is files, folders and links, below the destination
// and leading nowhere else.
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <string>

#include "fuzz/Fuzz.h"
#include "platform/linux/ArchiveExpansion.h"
#include "platform/linux/OwnedFd.h"

namespace {

namespace fs = std::filesystem;

/// A folder that is gone with the process, and in it the destination beside what nobody may touch.
class Place {
public:
    Place() {
        std::string path = fs::temp_directory_path() / "archive-fuzz-XXXXXX";
        Require(mkdtemp(path.data()) != nullptr);
        root_ = path;
        fs::create_directories(root_ / "canary");
    }

    ~Place() { fs::remove_all(root_); }

    Place(const Place&) = delete;
    Place& operator=(const Place&) = delete;

    void clear() const {
        fs::remove_all(destination());
        fs::create_directory(destination());
    }

    [[nodiscard]] fs::path destination() const { return root_ / "destination"; }

    void requireNothingOutside() const {
        Require(fs::is_empty(root_ / "canary") &&
                std::distance(fs::directory_iterator(root_), {}) == 2);
    }

private:
    fs::path root_;
};

void RequireInside(const fs::path& link, const fs::path& destination) {
    const fs::path target = fs::read_symlink(link);
    const fs::path end = (link.parent_path() / target).lexically_normal();
    Require(!target.is_absolute() && *end.lexically_relative(destination).begin() != "..");
}

void RequireHarmless(const fs::path& path, const fs::path& destination) {
    struct stat status {};

    Require(lstat(path.c_str(), &status) == 0);
    if (S_ISLNK(status.st_mode)) {
        RequireInside(path, destination);
        return;
    }
    Require(S_ISREG(status.st_mode) || S_ISDIR(status.st_mode));
    Require((status.st_mode & 07777U & ~0755U) == 0);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const Place place;
    place.clear();
    const platform::OwnedFd archive(memfd_create("archive", MFD_CLOEXEC));
    Require(write(archive.get(), data, size) == static_cast<ssize_t>(size));
    const platform::OwnedFd folder(
        open(place.destination().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    int fatal = 0;
    const int result = platform::ExpandArchive(
        archive.get(),
        folder.get(),
        {.entryFailed = [](const auto& /*name*/, const auto& error) { return error.code > 0; },
         .archiveFailed = [&](const auto& error) { fatal = error.code; }});
    Require(result == fatal);
    place.requireNothingOutside();
    for (const auto& entry : fs::recursive_directory_iterator(place.destination())) {
        RequireHarmless(entry.path(), place.destination());
    }
    return 0;
}
