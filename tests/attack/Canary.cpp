#include "tests/attack/Canary.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <stdexcept>

namespace attack {
namespace {

namespace fs = std::filesystem;

constexpr const char* kGuarded[] = {
    kCanary, "/etc", "/Library", "/usr/lib/linefold", "/private/var/db", "/private/var/root"};

std::string ContentsOf(const std::string& path, const struct stat& status) {
    if (S_ISLNK(status.st_mode)) {
        return fs::read_symlink(path);
    }
    if (!S_ISREG(status.st_mode)) {
        return {};
    }
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

void FillFiles(const std::string& root) {
    for (const auto& entry : fs::recursive_directory_iterator(root)) {
        if (entry.is_regular_file() && !entry.is_symlink()) {
            std::ofstream(entry.path()) << kCanaryContents;
        }
    }
}

void GiveToCanaryGroup(const std::string& root) {
    for (const auto& entry : fs::recursive_directory_iterator(root)) {
        if (lchown(entry.path().c_str(), 0, kCanaryGroup) != 0) {
            throw std::runtime_error("cannot give away " + entry.path().string());
        }
    }
    fs::permissions(root, fs::perms(0755));
}

}  // namespace

void MakeRemovableThings(const std::string& folder) {
    for (const char* name : {"file", "com.vendra.carrier.plist"}) {
        std::ofstream(folder + "/" + name) << "contents of " << name;
    }
    for (const char* name : {"link", "Carrier Bundle.bundle"}) {
        fs::create_symlink("file", folder + "/" + name);
    }
    fs::create_directory(folder + "/empty");
    fs::create_directories(folder + "/full/inner");
}

void MakeLibraryLikeFolder(const std::string& folder) {
    for (const char* below : {"", "/Preferences", "/Carrier Bundles", "/a", "/a/b"}) {
        fs::create_directories(folder + below);
        MakeRemovableThings(folder + below);
    }
}

void MakeCanary() {
    fs::remove_all(kCanary);
    for (const char* name : {"/open", "/secret"}) {
        MakeLibraryLikeFolder(std::string(kCanary) + name);
    }
    FillFiles(kCanary);
    GiveToCanaryGroup(kCanary);
    fs::permissions(std::string(kCanary) + "/secret", fs::perms(0700));
}

Snapshot Snapshot::take() {
    Snapshot snapshot;
    for (const char* root : kGuarded) {
        snapshot.add(root);
        for (const auto& entry : fs::recursive_directory_iterator(root)) {
            snapshot.add(entry.path());
        }
    }
    for (const auto& entry : fs::directory_iterator("/")) {
        snapshot.entries_.emplace(entry.path(), "there");
    }
    return snapshot;
}

void Snapshot::add(const std::string& path) {
    struct stat status {};

    if (lstat(path.c_str(), &status) != 0) {
        throw std::runtime_error("cannot look at " + path);
    }
    std::ostringstream text;
    text << status.st_dev << ' ' << status.st_ino << ' ' << status.st_mode << ' ' << status.st_uid
         << ' ' << status.st_gid << ' ' << status.st_size << ' ' << status.st_mtim.tv_sec << '.'
         << status.st_mtim.tv_nsec << ' ' << ContentsOf(path, status);
    entries_.emplace(path, text.str());
}

std::vector<std::string> Snapshot::differencesTo(const Snapshot& later) const {
    std::vector<std::string> differences;
    for (const auto& [path, text] : entries_) {
        const auto found = later.entries_.find(path);
        if (found == later.entries_.end()) {
            differences.push_back("gone: " + path);
        } else if (found->second != text) {
            differences.push_back("changed: " + path);
        }
    }
    for (const auto& [path, text] : later.entries_) {
        if (!entries_.contains(path)) {
            differences.push_back("new: " + path);
        }
    }
    return differences;
}

}  // namespace attack
