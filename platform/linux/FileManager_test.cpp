// Sources that are not what one hopes for, and places that cannot take them.
#include "platform/FileManager.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <filesystem>
#include <fstream>

#include "platform/DirectoryAccess.h"
#include "platform/linux/OwnedFd.h"

namespace platform {
namespace {

namespace fs = std::filesystem;

constexpr gid_t kMobile = 501;
constexpr off_t kMegabyte = 1 << 20;

class FileManagerTest : public testing::Test {
protected:
    FileManagerTest() {
        fs::remove_all(top_);
        fs::create_directories(at("source"));
    }

    ~FileManagerTest() override {
        (void)umount2(at("mounted").c_str(), MNT_DETACH);  // most tests mount nothing
        fs::remove_all(top_);
    }

    [[nodiscard]] std::string at(const std::string& name) const { return top_ + "/" + name; }

    void file(const std::string& name, const std::string& contents = "") const {
        std::ofstream(at(name), std::ios::binary) << contents;
    }

    [[nodiscard]] int copy(const std::string& source, const std::string& destination) const {
        return FileManagerCopyItem(PathAccess(at(source)), PathAccess(at(destination)));
    }

    [[nodiscard]] int move(const std::string& source, const std::string& destination) const {
        return FileManagerMoveItem(PathAccess(at(source)), PathAccess(at(destination)));
    }

    [[nodiscard]] int remove(const std::string& name) const {
        return FileManagerRemoveItem(PathAccess(at(name)));
    }

    [[nodiscard]] std::string contents(const std::string& name) const {
        std::ifstream stream(at(name), std::ios::binary);
        return {std::istreambuf_iterator<char>(stream), {}};
    }

    [[nodiscard]] struct stat statusOf(const std::string& name) const {
        struct stat status {};

        EXPECT_EQ(lstat(at(name).c_str(), &status), 0) << name;
        return status;
    }

    [[nodiscard]] bool isThere(const std::string& name) const {
        return fs::exists(fs::symlink_status(at(name)));
    }

    /// The names in a folder, sorted.
    [[nodiscard]] std::vector<std::string> names(const std::string& folder) const {
        std::vector<std::string> found;
        for (const auto& entry : fs::directory_iterator(at(folder))) {
            found.push_back(entry.path().filename());
        }
        std::sort(found.begin(), found.end());
        return found;
    }

    /// Another file system of a megabyte, at "mounted".
    void mountSmall() const {
        fs::create_directories(at("mounted"));
        ASSERT_EQ(mount("tmpfs", at("mounted").c_str(), "tmpfs", 0, "size=1m,mode=0755"), 0);
    }

    using Names = std::vector<std::string>;

private:
    const std::string top_ = "/tmp/file-manager";
};

void MakeSocket(const std::string& path) {
    const OwnedFd socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    ASSERT_EQ(bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
}

TEST_F(FileManagerTest, CopiesNothingThatIsNoFile) {
    ASSERT_EQ(mkfifo(at("source/fifo").c_str(), 0666), 0);
    MakeSocket(at("source/socket"));
    file("source/file", "1");
    EXPECT_EQ(copy("source", "copy"), 0);
    EXPECT_EQ(names("copy"), (Names{"file"}));
    EXPECT_EQ(copy("source/fifo", "other"), EOPNOTSUPP);
    EXPECT_EQ(copy("source/socket", "other"), EOPNOTSUPP);
    const PathAccess device("/dev/null");
    EXPECT_EQ(FileManagerCopyItem(device, PathAccess(at("other"))), EOPNOTSUPP);
    EXPECT_FALSE(isThere("other"));
}

TEST_F(FileManagerTest, CopiesNoDeviceNodesOfATree) {
    EXPECT_EQ(FileManagerCopyItem(PathAccess("/dev"), PathAccess(at("copy"))), 0);
    EXPECT_TRUE(fs::is_symlink(at("copy/stdin")));
    int items = 0;
    for (const auto& entry : fs::recursive_directory_iterator(at("copy"))) {
        const auto type = entry.symlink_status().type();
        EXPECT_TRUE(type == fs::file_type::symlink || type == fs::file_type::directory ||
                    type == fs::file_type::regular)
            << entry.path();
        ++items;
    }
    EXPECT_GT(items, 3);
}

TEST_F(FileManagerTest, DoesNotWaitForALeaseToBeGivenBack) {
    file("source/file", "1");
    const OwnedFd holder(open(at("source/file").c_str(), O_RDWR | O_CLOEXEC));
    ASSERT_EQ(fcntl(holder.get(), F_SETSIG, SIGURG), 0) << "a signal that does nothing";
    ASSERT_EQ(fcntl(holder.get(), F_SETLEASE, F_WRLCK), 0);
    EXPECT_EQ(copy("source/file", "copy"), EAGAIN);
    EXPECT_EQ(copy("source", "copy"), EAGAIN);
    std::vector<std::byte> bytes;
    EXPECT_EQ(PathAccess(at("source/file")).read(100, &bytes), EAGAIN);
    EXPECT_FALSE(isThere("copy"));
}

TEST_F(FileManagerTest, KeepsHoles) {
    constexpr off_t kSize = 1024 * kMegabyte;
    const std::string path = at("source/sparse");
    const OwnedFd file(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
    ASSERT_EQ(ftruncate(file.get(), kSize), 0);
    for (const off_t place : {off_t{0}, 100 * kMegabyte + 5, 700 * kMegabyte}) {
        ASSERT_EQ(pwrite(file.get(), "data", 4, place), 4);
    }
    ASSERT_EQ(copy("source/sparse", "copy"), 0);
    EXPECT_EQ(statusOf("copy").st_size, kSize);
    EXPECT_LE(statusOf("copy").st_blocks, statusOf("source/sparse").st_blocks + 64);
    const OwnedFd copied(open(at("copy").c_str(), O_RDONLY | O_CLOEXEC));
    for (const off_t place : {off_t{0}, 100 * kMegabyte + 5, 700 * kMegabyte}) {
        std::array<char, 4> bytes{};
        EXPECT_EQ(pread(copied.get(), bytes.data(), bytes.size(), place), 4);
        EXPECT_EQ(std::string(bytes.data(), 4), "data") << place;
    }
}

TEST_F(FileManagerTest, KeepsHolesThatWerePunched) {
    std::string text(4 * kMegabyte, 'x');
    file("source/file", text);
    const OwnedFd punched(open(at("source/file").c_str(), O_RDWR | O_CLOEXEC));
    ASSERT_EQ(
        fallocate(
            punched.get(), FALLOC_FL_PUNCH_HOLE | FALLOC_FL_KEEP_SIZE, kMegabyte, 3 * kMegabyte),
        0);
    text.replace(kMegabyte, 3 * kMegabyte, 3 * kMegabyte, '\0');
    ASSERT_EQ(copy("source/file", "copy"), 0);
    EXPECT_TRUE(contents("copy") == text);
    EXPECT_LT(statusOf("copy").st_blocks * 512, 2 * kMegabyte);
}

TEST_F(FileManagerTest, CopiesFilesOfEverySizeWhole) {
    for (const std::size_t size :
         {std::size_t{1}, std::size_t{65'536}, std::size_t{65'537}, std::size_t{1'000'003}}) {
        std::string text(size, '\0');
        for (std::size_t i = 0; i < size; ++i) {
            text[i] = static_cast<char>(i * 31 + i / 997);
        }
        const std::string name = std::to_string(size);
        file("source/" + name, text);
        ASSERT_EQ(copy("source/" + name, name), 0);
        EXPECT_TRUE(contents(name) == text) << name;
    }
}

TEST_F(FileManagerTest, CopiesNamesOfAnyBytes) {
    const std::string strange = "\xFF\xFE not \x80 text\n\t\"'\\";
    const std::string longest(255, '\xC3');
    fs::create_directory(at("source/" + strange));
    file("source/" + strange + "/" + longest, "1");
    EXPECT_EQ(copy("source", "copy"), 0);
    EXPECT_EQ(contents("copy/" + strange + "/" + longest), "1");
    std::vector<std::string> paths;
    ASSERT_EQ(DirectoryAccess(PathAccess(at("copy"))).subpaths(&paths), 0);
    EXPECT_EQ(paths, (Names{strange, strange + "/" + longest}));
    EXPECT_EQ(remove("copy"), 0);
}

TEST_F(FileManagerTest, CopiesUserAttributesAlone) {
    file("source/file");
    const std::string path = at("source/file");
    // Version 2, effective, cap_net_raw: what a hostile program would like to have copied.
    const std::array<unsigned char, 20> capability{1, 0, 0, 2, 0, 0x20};
    ASSERT_EQ(
        setxattr(path.c_str(), "security.capability", capability.data(), capability.size(), 0), 0);
    // Refused to those who are root in their own namespace only, and before Linux 6.6.
    (void)setxattr(path.c_str(), "trusted.x", "y", 1, 0);
    const bool hasUserAttribute = setxattr(path.c_str(), "user.x", "y", 1, 0) == 0;
    ASSERT_EQ(copy("source", "copy"), 0);
    std::array<char, 4096> list{};
    const ssize_t length = listxattr(at("copy/file").c_str(), list.data(), list.size());
    ASSERT_GE(length, 0);
    EXPECT_EQ(std::string(list.data(), static_cast<std::size_t>(length)),
              hasUserAttribute ? std::string("user.x", 7) : "");
}

TEST_F(FileManagerTest, KeepsBothTimesToTheNanosecond) {
    file("source/file", "1");
    const std::array<timespec, 2> times{{{.tv_sec = 1, .tv_nsec = 2}, {.tv_sec = 3, .tv_nsec = 4}}};
    ASSERT_EQ(utimensat(AT_FDCWD, at("source/file").c_str(), times.data(), 0), 0);
    ASSERT_EQ(utimensat(AT_FDCWD, at("source").c_str(), times.data(), 0), 0);
    ASSERT_EQ(copy("source", "copy"), 0);
    const struct stat copied = statusOf("copy/file");
    EXPECT_EQ(copied.st_atim.tv_sec, 1);
    EXPECT_EQ(copied.st_atim.tv_nsec, 2);
    EXPECT_EQ(copied.st_mtim.tv_sec, 3);
    EXPECT_EQ(copied.st_mtim.tv_nsec, 4);
    EXPECT_EQ(statusOf("copy").st_mtim.tv_nsec, 4);
}

TEST_F(FileManagerTest, MakesCopiesTheProcesssOwnEverywhere) {
    fs::create_directories(at("source/a"));
    file("source/a/file");
    fs::create_symlink("x", at("source/link"));
    fs::create_directory(at("shared"));
    ASSERT_EQ(chown(at("shared").c_str(), kMobile, kMobile), 0);
    ASSERT_EQ(chmod(at("shared").c_str(), 02777), 0) << "new things get its group";
    ASSERT_EQ(copy("source", "shared/tree"), 0);
    ASSERT_EQ(copy("source/a/file", "shared/file"), 0);
    ASSERT_EQ(copy("source/link", "shared/link"), 0);
    for (const char* name : {"shared/tree",
                             "shared/tree/a",
                             "shared/tree/a/file",
                             "shared/tree/link",
                             "shared/file"}) {
        EXPECT_EQ(statusOf(name).st_gid, getegid()) << name;
        EXPECT_EQ(statusOf(name).st_mode & (S_ISGID | S_ISUID), 0U) << name;
    }
    EXPECT_EQ(statusOf("shared/link").st_gid, getegid());
}

TEST_F(FileManagerTest, LeavesNothingOnAFullDisk) {
    mountSmall();
    file("source/small", "1");
    file("source/large", std::string(3 * kMegabyte, 'x'));
    EXPECT_EQ(copy("source/large", "mounted/copy"), ENOSPC);
    EXPECT_EQ(copy("source", "mounted/copy"), ENOSPC);
    EXPECT_EQ(names("mounted"), Names());
    EXPECT_EQ(copy("source/small", "mounted/copy"), 0);
    const std::vector<std::byte> large(3 * kMegabyte);
    EXPECT_EQ(FileManagerReplaceContents(PathAccess(at("mounted/copy")), large), ENOSPC);
    EXPECT_EQ(names("mounted"), (Names{"copy"}));
    EXPECT_EQ(contents("mounted/copy"), "1");
}

TEST_F(FileManagerTest, MovesToAnotherFileSystem) {
    mountSmall();
    fs::create_directories(at("source/a"));
    file("source/a/file", "1");
    fs::create_hard_link(at("source/a/file"), at("source/second"));
    fs::create_symlink("a/file", at("source/link"));
    EXPECT_EQ(move("source", "mounted/moved"), 0);
    EXPECT_FALSE(isThere("source"));
    EXPECT_EQ(contents("mounted/moved/a/file"), "1");
    EXPECT_EQ(statusOf("mounted/moved/second").st_ino, statusOf("mounted/moved/a/file").st_ino);
    EXPECT_EQ(fs::read_symlink(at("mounted/moved/link")), "a/file");
    EXPECT_EQ(move("mounted/moved/a/file", "file"), 0);
    EXPECT_EQ(contents("file"), "1");
    EXPECT_EQ(names("mounted/moved/a"), Names());
}

TEST_F(FileManagerTest, LosesNothingThatDoesNotFitOnTheOtherFileSystem) {
    mountSmall();
    file("source/a", "1");
    file("source/large", std::string(3 * kMegabyte, 'x'));
    EXPECT_EQ(move("source", "mounted/moved"), ENOSPC);
    EXPECT_EQ(names("mounted"), Names());
    EXPECT_EQ(names("source"), (Names{"a", "large"}));
    EXPECT_EQ(statusOf("source/large").st_size, 3 * kMegabyte);
}

TEST_F(FileManagerTest, TellsWhatCannotBeRemoved) {
    mountSmall();
    file("mounted/file", "1");
    ASSERT_EQ(mount("", at("mounted").c_str(), "", MS_REMOUNT | MS_RDONLY, ""), 0);
    EXPECT_EQ(remove("mounted"), EROFS);
    EXPECT_EQ(remove("mounted/file"), EROFS);
    EXPECT_EQ(move("mounted/file", "file"), EROFS) << "the copy stays, and so does the source";
    EXPECT_EQ(contents("file"), "1");
    EXPECT_EQ(contents("mounted/file"), "1");
    EXPECT_EQ(copy("file", "mounted/new"), EROFS);
    ASSERT_EQ(mount("", at("mounted").c_str(), "", MS_REMOUNT, ""), 0);
    EXPECT_EQ(remove("mounted"), EBUSY) << "a mount point";
}

TEST_F(FileManagerTest, RemovesWhatAnInterruptedCopyLeft) {
    const std::string leftover = at(".linefold-mobile-helper.copy-0");
    fs::create_directories(leftover + "/half/a/tree");
    file("source/file", "1");
    file(".linefold-mobile-helper.new-0", "half a fi");
    EXPECT_EQ(copy("source", "copy"), 0);
    EXPECT_EQ(FileManagerReplaceContents(PathAccess(at("new")), {}), 0);
    EXPECT_EQ(names("."), (Names{"copy", "new", "source"}));
    fs::create_symlink("source", leftover);
    EXPECT_EQ(copy("source/file", "file"), 0);
    EXPECT_EQ(names("."), (Names{"copy", "file", "new", "source"}));
    EXPECT_EQ(names("source"), (Names{"file"}));
}

TEST_F(FileManagerTest, WritesThroughNothingThatWasPutInItsWay) {
    file("victim", "untouched");
    fs::create_hard_link(at("victim"), at(".linefold-mobile-helper.new-0"));
    fs::create_hard_link(at("victim"), at(".linefold-mobile-helper.copy-0"));
    file("source/file", "1");
    const auto bytes = std::as_bytes(std::span("new", 3));
    EXPECT_EQ(FileManagerReplaceContents(PathAccess(at("new")), bytes), 0);
    EXPECT_EQ(copy("source/file", "copy"), 0);
    EXPECT_EQ(contents("victim"), "untouched");
    EXPECT_EQ(contents("new"), "new");
    EXPECT_EQ(statusOf("victim").st_nlink, 1U);
}

TEST_F(FileManagerTest, CopiesFilesOfTheSystemsOwnThatHaveNoSize) {
    EXPECT_EQ(FileManagerCopyItem(PathAccess("/proc/version"), PathAccess(at("copy"))), 0);
    EXPECT_EQ(contents("copy"), "");
}

TEST_F(FileManagerTest, GivesNewDirectoriesTheModeThatWasAsked) {
    const mode_t old = umask(077);
    fs::create_directory(at("shared"));
    ASSERT_EQ(chmod(at("shared").c_str(), 02777), 0);
    ASSERT_EQ(chown(at("shared").c_str(), kMobile, kMobile), 0);
    EXPECT_EQ(FileManagerCreateDirectory(at("shared/a/b"),
                                         IntermediateDirectories::kAreMade,
                                         {.permissions = 0775, .owner = kMobile}),
              0);
    umask(old);
    for (const char* name : {"shared/a", "shared/a/b"}) {
        EXPECT_EQ(statusOf(name).st_mode, S_IFDIR | mode_t{0775}) << name;
        EXPECT_EQ(statusOf(name).st_uid, kMobile) << name;
        EXPECT_EQ(statusOf(name).st_gid, getegid()) << name;
    }
}

TEST_F(FileManagerTest, FollowsNoLinkOfAStrangersToRootsFiles) {
    file("secret", "root's");
    fs::create_symlink("secret", at("link"));
    fs::create_symlink("source", at("folder-link"));
    for (const char* name : {"link", "folder-link"}) {
        ASSERT_EQ(lchown(at(name).c_str(), kMobile, kMobile), 0);
    }
    std::vector<std::byte> bytes;
    std::string real;
    EXPECT_EQ(PathAccess(at("link")).read(100, &bytes), EPERM);
    EXPECT_EQ(PathAccess(at("link")).realPath(&real), EPERM);
    EXPECT_EQ(copy("secret", "folder-link/copy"), EPERM);
    EXPECT_EQ(
        FileManagerCreateDirectory(at("folder-link/new"), IntermediateDirectories::kAreMade, {}),
        EPERM);
    std::vector<std::string> found;
    EXPECT_EQ(DirectoryAccess(PathAccess(at("folder-link"))).list(&found), EPERM);
    EXPECT_EQ(copy("link", "copy"), 0) << "the link itself";
    EXPECT_TRUE(fs::is_symlink(at("copy")));
}

}  // namespace
}  // namespace platform
