// Trees that are deeper or wider than any that the phone has.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "platform/DirectoryAccess.h"
#include "platform/FileManager.h"
#include "platform/linux/OwnedFd.h"

namespace platform {
namespace {

namespace fs = std::filesystem;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr int kManyEntries = 10'000;
#else
constexpr int kManyEntries = 100'000;
#endif

/// Holds the process to few descriptors while it lives.
class FewDescriptors {
public:
    FewDescriptors() {
        getrlimit(RLIMIT_NOFILE, &old_);
        const rlimit few{.rlim_cur = 48, .rlim_max = old_.rlim_max};
        setrlimit(RLIMIT_NOFILE, &few);
    }

    ~FewDescriptors() { setrlimit(RLIMIT_NOFILE, &old_); }

    FewDescriptors(const FewDescriptors&) = delete;
    FewDescriptors& operator=(const FewDescriptors&) = delete;

private:
    rlimit old_{};
};

class LargeTrees : public testing::Test {
protected:
    LargeTrees() {
        (void)FileManagerRemoveItem(PathAccess(top_));  // usually nothing is there
        fs::create_directory(top_);
    }

    ~LargeTrees() override { (void)FileManagerRemoveItem(PathAccess(top_)); }

    [[nodiscard]] std::string at(const std::string& name) const { return top_ + "/" + name; }

    /// One folder in the other, with a file in each; the last file has another name at the top.
    void makeDeep(const std::string& name, int levels) const {
        ASSERT_EQ(mkdir(at(name).c_str(), 0755), 0);
        const OwnedFd top(open(at(name).c_str(), O_PATH | O_CLOEXEC));
        OwnedFd folder(open(at(name).c_str(), O_PATH | O_CLOEXEC));
        for (int i = 0; i < levels; ++i) {
            const OwnedFd file(openat(folder.get(), "file", O_WRONLY | O_CREAT | O_CLOEXEC, 0644));
            ASSERT_TRUE(file.isOpen());
            ASSERT_EQ(mkdirat(folder.get(), kName, 0755), 0);
            folder.reset(openat(folder.get(), kName, O_PATH | O_CLOEXEC));
        }
        ASSERT_EQ(linkat(top.get(), "file", folder.get(), "linked", 0), 0);
    }

    /// Folders and files below a path, whatever its length.
    [[nodiscard]] std::size_t countBelow(const std::string& name) const {
        std::vector<std::string> paths;
        EXPECT_EQ(DirectoryAccess(PathAccess(at(name))).subpaths(&paths), 0);
        return paths.size();
    }

    static constexpr const char* kName = "a-folder";

private:
    const std::string top_ = "/tmp/large-trees";
};

TEST_F(LargeTrees, OfAThousandLevelsAreCopiedAndRemoved) {
    constexpr int kLevels = 1000;
    makeDeep("deep", kLevels);
    const FewDescriptors few;
    EXPECT_EQ(FileManagerCopyItem(PathAccess(at("deep")), PathAccess(at("copy"))), 0);
    EXPECT_EQ(countBelow("deep"), 2U * kLevels + 1);
    EXPECT_EQ(countBelow("copy"), 2U * kLevels + 1);

    struct stat status {};

    EXPECT_EQ(stat(at("copy/file").c_str(), &status), 0);
    EXPECT_EQ(status.st_nlink, 2U) << "its second name is a thousand levels below";
    EXPECT_EQ(FileManagerRemoveItem(PathAccess(at("deep"))), 0);
    EXPECT_EQ(FileManagerRemoveItem(PathAccess(at("copy"))), 0);
    EXPECT_TRUE(fs::is_empty(at(".")));
}

TEST_F(LargeTrees, OfAThousandLevelsAreReachedItemByItem) {
    constexpr int kLevels = 1000;
    makeDeep("deep", kLevels);
    const FewDescriptors few;
    const DirectoryAccess top{PathAccess(at("deep"))};
    std::vector<std::string> paths;
    ASSERT_EQ(top.subpaths(&paths), 0);
    for (const auto& path : paths) {
        EXPECT_EQ(FileManagerSetAttributes({.permissions = 0700}, top.item(path)), 0);
    }
    const std::string deepest = *std::max_element(
        paths.begin(), paths.end(), [](auto& a, auto& b) { return a.size() < b.size(); });
    EXPECT_GT(deepest.size(), std::size_t{PATH_MAX});
    FileStatus status;
    EXPECT_EQ(top.item(deepest).lstat(&status), 0);
    EXPECT_EQ(status.mode & 0777U, 0700U);
    EXPECT_EQ(top.makeDirectories(deepest.substr(0, deepest.rfind('/')) + "/new/er"), 0);
    EXPECT_EQ(top.item(deepest.substr(0, deepest.rfind('/')) + "/new/er").lstat(&status), 0);
}

TEST_F(LargeTrees, OfManyEntriesAreCopiedListedAndRemoved) {
    ASSERT_EQ(mkdir(at("wide").c_str(), 0755), 0);
    for (int i = 0; i < kManyEntries; ++i) {
        const std::string name = at("wide/" + std::to_string(i));
        ASSERT_EQ(i % 10 == 0 ? mkdir(name.c_str(), 0755) : mknod(name.c_str(), S_IFREG | 0644, 0),
                  0);
    }
    EXPECT_EQ(FileManagerCopyItem(PathAccess(at("wide")), PathAccess(at("copy"))), 0);
    EXPECT_EQ(countBelow("copy"), static_cast<std::size_t>(kManyEntries));
    EXPECT_EQ(FileManagerRemoveItem(PathAccess(at("wide"))), 0);
    EXPECT_EQ(FileManagerRemoveItem(PathAccess(at("copy"))), 0);
    EXPECT_TRUE(fs::is_empty(at(".")));
}

TEST_F(LargeTrees, KeepManyHardLinks) {
    ASSERT_EQ(mkdir(at("source").c_str(), 0755), 0);
    for (int i = 0; i < 3000; ++i) {
        const std::string name = at("source/" + std::to_string(i));
        const std::string pair = at("source/" + std::to_string(i - i % 3));
        ASSERT_EQ(
            i % 3 == 0 ? mknod(name.c_str(), S_IFREG | 0644, 0) : link(pair.c_str(), name.c_str()),
            0);
    }
    ASSERT_EQ(FileManagerCopyItem(PathAccess(at("source")), PathAccess(at("copy"))), 0);
    for (const auto& entry : fs::directory_iterator(at("copy"))) {
        EXPECT_EQ(entry.hard_link_count(), 3U) << entry.path();
    }
}

TEST_F(LargeTrees, ThatNeverEndAreRefused) {
    // Few of the long paths of these many levels fit into what a list may take.
    makeDeep("deep", 12'000);
    std::vector<std::string> paths;
    EXPECT_EQ(DirectoryAccess(PathAccess(at("deep"))).subpaths(&paths), E2BIG);
    EXPECT_TRUE(paths.empty());
    EXPECT_EQ(FileManagerRemoveItem(PathAccess(at("deep"))), 0);
}

}  // namespace
}  // namespace platform
