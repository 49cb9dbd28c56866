// Files written below folders of strangers. Runs in a private phone root.
#include "platform/OutputFile.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "platform/linux/OwnedFd.h"
#include "tests/support/PhoneRoot.h"

namespace fs = std::filesystem;

namespace {

using platform::OutputFile;

const std::string kFolder = "/tmp/output";

class OutputFileOnLinux : public testing::Test {
protected:
    OutputFileOnLinux() {
        fs::remove_all(kFolder);
        fs::create_directories(kFolder);
    }

    [[nodiscard]] static int open(const std::string& path) { return OutputFile().open(path); }

    static void put(const std::string& path, uid_t owner) {
        std::ofstream(path) << "kept";
        ASSERT_EQ(lchown(path.c_str(), owner, owner), 0);
    }

    static void link(const std::string& path, const std::string& target, uid_t owner) {
        fs::create_symlink(target, path);
        ASSERT_EQ(lchown(path.c_str(), owner, owner), 0);
    }
};

struct stat StatusOf(const std::string& path) {
    struct stat status {};

    (void)lstat(path.c_str(), &status);
    return status;
}

TEST_F(OutputFileOnLinux, RefusesAFileWithSeveralNames) {
    put(kFolder + "/file", phone::kMobileUser);
    fs::create_hard_link(kFolder + "/file", kFolder + "/other");
    EXPECT_EQ(open(kFolder + "/other"), EMLINK);
    EXPECT_EQ(fs::file_size(kFolder + "/file"), 4U);
    fs::remove(kFolder + "/file");
    EXPECT_EQ(open(kFolder + "/other"), 0);
    EXPECT_EQ(StatusOf(kFolder + "/other").st_uid, phone::kMobileUser);
}

TEST_F(OutputFileOnLinux, RefusesWhatIsNoFileAndDoesNotWait) {
    ASSERT_EQ(mkfifo((kFolder + "/fifo").c_str(), 0600), 0);
    EXPECT_EQ(open(kFolder + "/fifo"), EINVAL);
    const platform::OwnedFd reader(
        ::open((kFolder + "/fifo").c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    EXPECT_EQ(open(kFolder + "/fifo"), EINVAL);
    EXPECT_EQ(open("/dev/full"), EINVAL);
    EXPECT_EQ(open("/dev/null"), EINVAL);
    ASSERT_EQ(mknod((kFolder + "/socket").c_str(), S_IFSOCK | 0600, 0), 0);
    EXPECT_EQ(open(kFolder + "/socket"), EINVAL);
}

TEST_F(OutputFileOnLinux, IsNotLedAwayByAStrangersLink) {
    fs::create_directory(kFolder + "/roots");
    fs::create_directory(kFolder + "/mobiles");
    ASSERT_EQ(chown((kFolder + "/mobiles").c_str(), phone::kMobileUser, phone::kMobileUser), 0);
    link(kFolder + "/astray", "roots", phone::kMobileUser);
    link(kFolder + "/own", "mobiles", phone::kMobileUser);
    EXPECT_EQ(open(kFolder + "/astray/file"), EPERM);
    EXPECT_EQ(open(kFolder + "/own/file"), 0);
    EXPECT_TRUE(fs::is_empty(kFolder + "/roots"));
    EXPECT_TRUE(fs::exists(kFolder + "/mobiles/file"));
}

TEST_F(OutputFileOnLinux, SaysThatTheDiskIsFull) {
    ASSERT_EQ(mount("small", kFolder.c_str(), "tmpfs", 0, "size=64k"), 0);
    OutputFile file;
    ASSERT_EQ(file.open(kFolder + "/file"), 0);
    const std::vector<std::byte> bytes(100'000);
    EXPECT_EQ(file.write(bytes), ENOSPC);
    EXPECT_EQ(fs::file_size(kFolder + "/file"), 65536U) << "the short write was continued";
    EXPECT_EQ(file.close(), 0);
    EXPECT_EQ(umount(kFolder.c_str()), 0);
}

TEST_F(OutputFileOnLinux, MakesFilesByTheMaskAndLetsNoChildHaveThem) {
    const mode_t before = umask(077);
    OutputFile file;
    EXPECT_EQ(file.open(kFolder + "/file"), 0);
    umask(before);
    EXPECT_EQ(StatusOf(kFolder + "/file").st_mode & 07777U, 0600U);
    std::size_t closedOnExec = 0;
    for (const auto& entry : fs::directory_iterator("/proc/self/fd")) {
        std::error_code error;
        const bool isOurs = fs::read_symlink(entry.path(), error) == kFolder + "/file";
        const int flags = fcntl(std::atoi(entry.path().filename().c_str()), F_GETFD);
        closedOnExec += isOurs && (flags & FD_CLOEXEC) != 0 ? 1 : 0;
    }
    EXPECT_EQ(closedOnExec, 1U);
}

}  // namespace
