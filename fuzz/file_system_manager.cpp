// The file-system manager on the real file system, beside a model of it in memory: equal results,
// and equal trees.
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <fstream>
#include <list>

#include "fuzz/FileModel.h"
#include "fuzz/Fuzz.h"
#include "handlers/files/FileSystemManager.h"

namespace {

namespace fs = std::filesystem;

using Recursive = FileSystemInterface::Recursive;
using Intermediates = FileSystemInterface::Intermediates;

/// A folder of our own that goes with the process.
class Workshop {
public:
    Workshop() {
        umask(022);
        Require(mkdtemp(path_.data()) != nullptr);
    }

    ~Workshop() {
        std::error_code ignored;  // what stays lies among temporary files
        fs::remove_all(path_, ignored);
    }

    Workshop(const Workshop&) = delete;
    Workshop& operator=(const Workshop&) = delete;

    [[nodiscard]] const std::string& path() const { return path_; }

    void clear() const {
        for (const auto& entry : fs::directory_iterator(path_)) {
            fs::remove_all(entry);
        }
    }

private:
    std::string path_ = fs::temp_directory_path().string() + "/fuzz-files.XXXXXX";
};

std::string TextOf(const fs::path& path) {
    if (fs::is_symlink(path)) {
        return fs::read_symlink(path);
    }
    std::ifstream file(path);
    return fs::is_directory(path) ? "" : std::string(std::istreambuf_iterator<char>(file), {});
}

std::vector<std::string> LinesOnDisk(const std::string& top) {
    std::vector<std::string> lines;
    for (const auto& entry : fs::recursive_directory_iterator(top)) {
        struct stat status {};

        Require(lstat(entry.path().c_str(), &status) == 0);
        std::array<char, 16> mode{};
        (void)std::snprintf(mode.data(), mode.size(), "%o ", status.st_mode & 07777);
        const char kind = S_ISDIR(status.st_mode) ? 'd' : S_ISREG(status.st_mode) ? 'f' : 'l';
        lines.push_back(kind + std::string(mode.data()) +
                        entry.path().string().substr(top.size() + 1) + " " + TextOf(entry));
    }
    return lines;
}

/// The input, taken apart into choices.
class Choices {
public:
    Choices(const std::uint8_t* data, std::size_t size) : data_(data), end_(data + size) {}

    [[nodiscard]] bool isOver() const { return data_ == end_; }

    unsigned below(unsigned bound) { return isOver() ? 0 : *data_++ % bound; }

    /// One to three steps below the top's one folder: whatever a link says leads nowhere else.
    std::string path() {
        std::string path = "r";
        for (unsigned steps = 1 + below(3); steps > 0; --steps) {
            path += "/" + name();
        }
        return path;
    }

    std::string name() { return std::string(1, "abc"[below(3)]); }

    std::string target() {
        return std::array{"a", "b", "c", "a/b", "../a", "../b", "nowhere", "."}[below(8)];
    }

    unsigned mode() { return below(2) == 0 ? 0755 : 0700; }

private:
    const std::uint8_t* data_;
    const std::uint8_t* const end_;
};

std::vector<std::byte> Bytes(const std::string& text) {
    const auto bytes = std::as_bytes(std::span(text));
    return {bytes.begin(), bytes.end()};
}

/// The same in both worlds, each with paths of its own.
class Worlds {
public:
    explicit Worlds(const Workshop& workshop) : top_(workshop.path()) {
        Require(manager_.createDirectory(top_ + "/r", 0755, Intermediates::kNo) == 0);
        Require(model_.createDirectory("r", 0755, false) == 0);
    }

    void perform(Choices& choices) {
        const std::string path = choices.path();
        switch (choices.below(12)) {
            case 0:
                return make(path, choices);
            case 1:
                return Require(manager_.createEmptyFile(real(path).c_str()) ==
                               model_.createEmptyFile(path));
            case 2:
                return write(path, choices.name());
            case 3:
                return link(path, choices.target());
            case 4:
                return transfer(path, choices.path(), fuzz::Mode::kCopy);
            case 5:
                return transfer(path, choices.path(), fuzz::Mode::kMove);
            case 6:
                return moveFile(path, choices.path());
            case 7:
                return copyNamed(path, choices.path(), choices.name());
            case 8:
                return Require(manager_.remove(real(path)) == model_.remove(path));
            case 9:
                return setPermissions(path, choices);
            default:
                ask(path);
        }
    }

    void compare() const {
        auto disk = LinesOnDisk(top_);
        auto model = model_.lines();
        std::sort(disk.begin(), disk.end());
        std::sort(model.begin(), model.end());
        Require(disk == model);
    }

private:
    [[nodiscard]] std::string real(const std::string& path) const { return top_ + "/" + path; }

    void make(const std::string& path, Choices& choices) {
        const unsigned mode = choices.mode();
        const bool intermediates = choices.below(2) == 1;
        Require(
            manager_.createDirectory(
                real(path), mode, intermediates ? Intermediates::kCreate : Intermediates::kNo) ==
            model_.createDirectory(path, mode, intermediates));
    }

    void write(const std::string& path, const std::string& text) {
        const auto bytes = Bytes(text);
        Require(manager_.writeData(real(path), &bytes) == model_.writeData(path, text));
    }

    void link(const std::string& path, const std::string& target) {
        Require(manager_.createSymlink(real(path).c_str(), target.c_str()) ==
                model_.createSymlink(path, target));
    }

    void transfer(const std::string& source, const std::string& destination, fuzz::Mode mode) {
        if (model_.dependsOnOrder(source, destination)) {
            return;
        }
        const auto from = real(source);
        const auto to = real(destination);
        const int result = mode == fuzz::Mode::kCopy ? manager_.copyItem(from.c_str(), to.c_str())
                                                     : manager_.moveItem(from.c_str(), to.c_str());
        Require(result == model_.transfer(source, destination, mode));
    }

    void moveFile(const std::string& source, const std::string& destination) {
        Require(manager_.moveFile(real(source).c_str(), real(destination).c_str()) ==
                model_.moveFile(source, destination));
    }

    void copyNamed(const std::string& source,
                   const std::string& destination,
                   const std::string& name) {
        if (model_.dependsOnOrder(source + "/" + name, destination + "/" + name)) {
            return;
        }
        Require(manager_.copyNamedItem(real(source), real(destination), name) ==
                model_.copyNamedItem(source, destination, name));
    }

    void setPermissions(const std::string& path, Choices& choices) {
        const unsigned mode = choices.mode();
        const bool recursive = choices.below(2) == 1;
        Require(manager_.setPermissions(
                    real(path).c_str(), mode, recursive ? Recursive::kYes : Recursive::kNo) ==
                model_.setPermissions(path, mode, recursive));
    }

    void ask(const std::string& path) {
        const fuzz::Item* const item = model_.at(path);
        const fuzz::Item* const end = model_.followed(path);
        const bool isLink = item != nullptr && item->kind == fuzz::Item::Kind::kLink;
        Require(manager_.exists(real(path)) == (end != nullptr));
        Require(manager_.isDirectory(real(path).c_str()) == (end != nullptr && end->isFolder()));
        Require(manager_.isSymlink(real(path)) == isLink);
        Require(manager_.readLink(real(path)) == (isLink ? item->text : ""));
        std::list<std::string> names;
        std::vector<std::string> expected;
        Require(manager_.listDirectory(real(path), &names, FileSystemInterface::Paths::kNames) ==
                model_.list(path, &expected));
        names.sort();
        Require(std::equal(names.begin(), names.end(), expected.begin(), expected.end()));
    }

    const std::string top_;
    FileSystemManager manager_;
    fuzz::FileModel model_;
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const Workshop workshop;
    constexpr std::size_t kBytesMax = 400;
    Choices choices(data, std::min(size, kBytesMax));
    Worlds worlds(workshop);
    while (!choices.isOver()) {
        worlds.perform(choices);
    }
    worlds.compare();
    workshop.clear();
    return 0;
}
