#include <fcntl.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <array>
#include <filesystem>
#include <fstream>
#include <stdexcept>

#include "tests/contract/FileTwin.h"

namespace twin {
namespace {

namespace fs = std::filesystem;

constexpr std::int64_t kNanosecondsOfSecond = 1'000'000'000;

void Expect(bool holds, const std::string& what) {
    if (!holds) {
        throw std::runtime_error("cannot " + what);
    }
}

/// Beside the test binary's other files, on a disk: not every system keeps attributes elsewhere.
class TestFolder {
public:
    TestFolder() { Expect(mkdtemp(path_.data()) != nullptr, "make " + path_); }

    ~TestFolder() {
        std::error_code ignored;  // what stays is a folder of the build's
        fs::remove_all(path_, ignored);
    }

    TestFolder(const TestFolder&) = delete;
    TestFolder& operator=(const TestFolder&) = delete;

    [[nodiscard]] const std::string& path() const { return path_; }

private:
    std::string path_ = fs::current_path().string() + "/contract-files.XXXXXX";
};

void Make(const std::string& path, const Item& item) {
    const auto permissions = item.mode & ~kTypeBits;
    switch (item.mode & kTypeBits) {
        case kFolder:
            Expect(mkdir(path.c_str(), 0700) == 0, "make the folder " + path);
            break;
        case kLink:
            Expect(symlink(item.contents.c_str(), path.c_str()) == 0, "make the link " + path);
            return;
        case kFifo:
            Expect(mkfifo(path.c_str(), 0600) == 0, "make the FIFO " + path);
            break;
        default:
            std::ofstream(path, std::ios::binary) << item.contents;
    }
    Expect(chmod(path.c_str(), permissions) == 0, "set the mode of " + path);
}

std::string ContentsOf(const std::string& path, std::uint32_t mode) {
    if ((mode & kTypeBits) == kLink) {
        return fs::read_symlink(path);
    }
    if ((mode & kTypeBits) != kFile) {
        return {};
    }
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

std::map<std::string, std::string> AttributesOf(const std::string& path) {
    std::array<char, 4096> names{};
    std::array<char, 4096> value{};
    std::map<std::string, std::string> attributes;
    const ssize_t length = llistxattr(path.c_str(), names.data(), names.size());
    for (ssize_t at = 0; at < length;) {
        const std::string name(names.data() + at);
        const ssize_t size = lgetxattr(path.c_str(), name.c_str(), value.data(), value.size());
        if (name.starts_with("user.")) {
            attributes[name].assign(value.data(), static_cast<std::size_t>(size));
        }
        at += static_cast<ssize_t>(name.size()) + 1;
    }
    return attributes;
}

Item ItemAt(const std::string& path) {
    struct stat status {};

    Expect(lstat(path.c_str(), &status) == 0, "look at " + path);
    return {.mode = status.st_mode,
            .contents = ContentsOf(path, status.st_mode),
            .attributes = AttributesOf(path),
            .modified = status.st_mtim.tv_sec * kNanosecondsOfSecond + status.st_mtim.tv_nsec,
            .owner = status.st_uid,
            .group = status.st_gid};
}

}  // namespace

std::string FreshFolder() {
    static const TestFolder folder;
    static int tests = 0;
    const std::string path = folder.path() + "/" + std::to_string(++tests);
    fs::create_directory(path);
    return path;
}

void Put(const std::string& path, const Item& item) {
    Make(path, item);
    for (const auto& [name, value] : item.attributes) {
        Expect(lsetxattr(path.c_str(), name.c_str(), value.data(), value.size(), 0) == 0,
               "set an attribute of " + path);
    }
    if (item.modified != 0) {
        timespec time{};
        time.tv_sec = item.modified / kNanosecondsOfSecond;
        time.tv_nsec = item.modified % kNanosecondsOfSecond;
        const std::array times{time, time};
        Expect(utimensat(AT_FDCWD, path.c_str(), times.data(), AT_SYMLINK_NOFOLLOW) == 0,
               "set the time of " + path);
    }
}

void PutName(const std::string& path, const std::string& secondPath) {
    Expect(link(path.c_str(), secondPath.c_str()) == 0, "link " + secondPath);
}

bool AreOneFile(const std::string& path, const std::string& other) {
    struct stat one {};

    struct stat two {};

    return lstat(path.c_str(), &one) == 0 && lstat(other.c_str(), &two) == 0 &&
           one.st_dev == two.st_dev && one.st_ino == two.st_ino;
}

std::map<std::string, Item> Tree(const std::string& path) {
    std::map<std::string, Item> tree;
    if (fs::symlink_status(path).type() == fs::file_type::not_found) {
        return tree;
    }
    tree[""] = ItemAt(path);
    if ((tree[""].mode & kTypeBits) != kFolder) {
        return tree;
    }
    for (const auto& entry : fs::recursive_directory_iterator(path)) {
        const std::string subpath = entry.path().string().substr(path.size() + 1);
        tree[subpath] = ItemAt(entry.path());
    }
    return tree;
}

}  // namespace twin
