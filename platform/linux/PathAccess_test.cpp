#include "platform/PathAccess.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>

namespace platform {
namespace {

namespace fs = std::filesystem;

constexpr uid_t kMobile = 501;
constexpr std::uint32_t kTypeBits = S_IFMT;

/// A folder of root's with a file and a folder of each of the two owners.
class PathAccessTest : public testing::Test {
protected:
    PathAccessTest() {
        fs::remove_all(top_);
        for (const char* owner : {"root", "mobile"}) {
            fs::create_directories(path(owner) + "/folder");
            std::ofstream(path(owner) + "/file") << owner;
        }
        for (const char* name : {"mobile", "mobile/folder", "mobile/file"}) {
            giveToMobile(name);
        }
    }

    ~PathAccessTest() override { fs::remove_all(top_); }

    [[nodiscard]] std::string path(const std::string& name) const { return top_ + "/" + name; }

    void giveToMobile(const std::string& name) const {
        ASSERT_EQ(lchown(path(name).c_str(), kMobile, kMobile), 0);
    }

    void rootsLink(const std::string& name, const std::string& target) const {
        fs::create_symlink(target, path(name));
    }

    void mobilesLink(const std::string& name, const std::string& target) const {
        rootsLink(name, target);
        giveToMobile(name);
    }

    /// The code of lstat below the folder; 0 tells that the way there is free.
    [[nodiscard]] int look(const std::string& name) const {
        FileStatus status;
        return PathAccess(path(name)).lstat(&status);
    }

    /// The same of stat.
    [[nodiscard]] int lookBehind(const std::string& name) const {
        FileStatus status;
        return PathAccess(path(name)).stat(&status);
    }

    [[nodiscard]] int move(const std::string& from, const std::string& to) const {
        return PathAccess(path(from)).moveOnto(PathAccess(path(to)));
    }

    [[nodiscard]] std::uint32_t typeOf(const std::string& name) const {
        FileStatus status;
        EXPECT_EQ(PathAccess(path(name)).lstat(&status), 0) << name;
        return status.mode & kTypeBits;
    }

    [[nodiscard]] bool isThere(const std::string& name) const {
        return fs::exists(fs::symlink_status(path(name)));
    }

    /// `count` links of one owner, each to the one before; the first leads to `target`.
    void chain(const std::string& target, int count, uid_t owner) const {
        std::string last = target;
        for (int i = 1; i <= count; ++i) {
            const std::string name = "chain" + std::to_string(i);
            rootsLink(name, last);
            ASSERT_EQ(lchown(path(name).c_str(), owner, owner), 0);
            last = name;
        }
    }

private:
    const std::string top_ = "/tmp/path-access";
};

TEST_F(PathAccessTest, FollowsALinkOfRootsAnywhere) {
    rootsLink("toRoot", "root");
    rootsLink("toMobile", path("mobile"));
    EXPECT_EQ(look("toRoot/file"), 0);
    EXPECT_EQ(look("toMobile/file"), 0);
}

TEST_F(PathAccessTest, FollowsALinkOfTheMobileUsersToTheMobileUsersOwn) {
    mobilesLink("link", "mobile/folder");
    EXPECT_EQ(PathAccess(path("link/new")).symlink("contents"), 0);
    EXPECT_TRUE(isThere("mobile/folder/new"));
}

TEST_F(PathAccessTest, RefusesALinkOfTheMobileUsersToWhatIsRoots) {
    mobilesLink("link", "root");
    EXPECT_EQ(look("link/file"), EPERM);
    EXPECT_EQ(PathAccess(path("link/file")).remove(), EPERM);
    EXPECT_EQ(PathAccess(path("link/new")).symlink("contents"), EPERM);
    EXPECT_TRUE(isThere("root/file"));
    EXPECT_FALSE(isThere("root/new"));
}

TEST_F(PathAccessTest, RefusesALinkOfTheMobileUsersToWhatIsAnotherUsers) {
    ASSERT_EQ(chown(path("root").c_str(), kMobile + 1, kMobile + 1), 0);
    mobilesLink("link", "root");
    EXPECT_EQ(look("link/file"), EPERM);
}

TEST_F(PathAccessTest, JudgesALinkByWhereItEndsNotByItsFirstStep) {
    mobilesLink("throughRoots", "root/../mobile/folder");
    mobilesLink("throughOwn", "mobile/folder/../../root");
    EXPECT_EQ(look("throughRoots/."), 0);
    EXPECT_EQ(look("throughOwn/file"), EPERM);
}

TEST_F(PathAccessTest, JudgesEachLinkOfAChain) {
    rootsLink("trusted", "mobile");
    mobilesLink("toTrusted", "trusted");
    mobilesLink("toRoot", "root");
    rootsLink("toPlanted", "toRoot");
    EXPECT_EQ(look("toTrusted/file"), 0);
    EXPECT_EQ(look("toPlanted/file"), EPERM);
}

TEST_F(PathAccessTest, FollowsFortyLinksAndNotOneMore) {
    chain("root", 41, 0);
    EXPECT_EQ(look("chain40/file"), 0);
    EXPECT_EQ(look("chain41/file"), ELOOP);
}

TEST_F(PathAccessTest, CountsTheLinksOfAllStepsTogether) {
    chain("root", 20, 0);
    rootsLink("root/folder/back", "../..");
    EXPECT_EQ(look("chain20/folder/back/chain19/file"), 0);
    EXPECT_EQ(look("chain20/folder/back/chain20/file"), ELOOP);
}

TEST_F(PathAccessTest, EndsAtALinkToItself) {
    rootsLink("self", "self");
    EXPECT_EQ(look("self/file"), ELOOP);
    EXPECT_EQ(look("self"), 0);
}

TEST_F(PathAccessTest, TakesDotsInThePathAsTheyStand) {
    EXPECT_EQ(look("root/folder/../file"), 0);
    EXPECT_EQ(look("root/./././file"), 0);
    EXPECT_EQ(look("root/missing/../file"), ENOENT);
    EXPECT_EQ(look("root/file/../file"), ENOTDIR);
    EXPECT_EQ(typeOf("root/folder/.."), S_IFDIR);
    EXPECT_EQ(typeOf("root/."), S_IFDIR);
}

TEST_F(PathAccessTest, GoesUpFromWhereALinkHasLed) {
    rootsLink("link", "mobile/folder");
    EXPECT_EQ(PathAccess(path("link/../new")).symlink("contents"), 0);
    EXPECT_TRUE(isThere("mobile/new"));
}

TEST_F(PathAccessTest, TakesManySlashesAsOne) {
    EXPECT_EQ(look("root///folder"), 0);
    EXPECT_EQ(look("/root//file"), 0);
}

TEST_F(PathAccessTest, ASlashAtTheEndWantsAFolder) {
    EXPECT_EQ(typeOf("root/folder/"), S_IFDIR);
    EXPECT_EQ(look("root/file/"), ENOTDIR);
    EXPECT_EQ(look("missing/"), ENOENT);
    EXPECT_EQ(PathAccess(path("root/file/")).remove(), ENOTDIR);
    EXPECT_EQ(PathAccess(path("root/folder//")).remove(), 0);
    EXPECT_FALSE(isThere("root/folder"));
}

TEST_F(PathAccessTest, ASlashAtTheEndOfALinkMeansWhereItLeadsUnderTheSameRule) {
    rootsLink("toFolder", "root/folder");
    rootsLink("toFile", "root/file");
    mobilesLink("planted", "root/folder");
    EXPECT_EQ(typeOf("toFolder/"), S_IFDIR);
    EXPECT_EQ(look("toFile/"), ENOTDIR);
    EXPECT_EQ(look("planted/"), EPERM);
}

TEST_F(PathAccessTest, ASlashAtTheEndOfALinkRemovesNothing) {
    mobilesLink("planted", "root/folder");
    EXPECT_NE(PathAccess(path("planted/")).remove(), 0);
    EXPECT_TRUE(isThere("planted"));
    EXPECT_TRUE(isThere("root/folder"));
}

TEST_F(PathAccessTest, AnEmptyPathNamesNothing) {
    FileStatus status;
    EXPECT_EQ(PathAccess("").lstat(&status), ENOENT);
    EXPECT_EQ(PathAccess("").remove(), ENOENT);
    EXPECT_EQ(PathAccess("").symlink("contents"), ENOENT);
}

TEST_F(PathAccessTest, TheRootIsAFolderThatStays) {
    FileStatus status;
    for (const char* root : {"/", "//", "/.", "/.."}) {
        EXPECT_EQ(PathAccess(root).lstat(&status), 0) << root;
        EXPECT_EQ(status.mode & kTypeBits, kTypeBits & S_IFDIR) << root;
        EXPECT_NE(PathAccess(root).remove(), 0) << root;
        EXPECT_NE(PathAccess(root).symlink("contents"), 0) << root;
    }
}

TEST_F(PathAccessTest, DotsAloneAreFoldersThatStay) {
    fs::current_path(path("root/folder"));
    FileStatus status;
    EXPECT_EQ(PathAccess(".").lstat(&status), 0);
    EXPECT_EQ(PathAccess("..").lstat(&status), 0);
    EXPECT_EQ(PathAccess(".").remove(), EINVAL);
    EXPECT_EQ(PathAccess("..").remove(), ENOTEMPTY);
    fs::current_path("/");
}

TEST_F(PathAccessTest, ARelativePathBeginsAtTheWorkingFolder) {
    fs::current_path(path("root"));
    FileStatus status;
    EXPECT_EQ(PathAccess("file").lstat(&status), 0);
    EXPECT_EQ(PathAccess("folder/../file").lstat(&status), 0);
    EXPECT_EQ(PathAccess("../mobile/file").lstat(&status), 0);
    EXPECT_EQ(status.uid, kMobile);
    fs::current_path("/");
}

TEST_F(PathAccessTest, ADanglingLinkOnTheWayLeadsNowhere) {
    rootsLink("roots", "missing");
    mobilesLink("mobiles", "missing");
    EXPECT_EQ(look("roots/file"), ENOENT);
    EXPECT_EQ(look("mobiles/file"), ENOENT);
    EXPECT_EQ(typeOf("roots"), S_IFLNK);
}

TEST_F(PathAccessTest, AFileInTheMiddleIsNoFolder) {
    rootsLink("link", "root/file");
    EXPECT_EQ(look("root/file/below"), ENOTDIR);
    EXPECT_EQ(look("link/below"), ENOTDIR);
    EXPECT_EQ(PathAccess(path("root/file/below")).symlink("contents"), ENOTDIR);
    EXPECT_EQ(PathAccess(path("root/file/below/deeper")).remove(), ENOTDIR);
}

TEST_F(PathAccessTest, ANameOf256BytesIsTooLong) {
    const std::string longest(255, 'n');
    EXPECT_EQ(PathAccess(path(longest)).symlink("contents"), 0);
    EXPECT_EQ(look(longest), 0);
    EXPECT_EQ(look(longest + "n"), ENAMETOOLONG);
    EXPECT_EQ(look(longest + "n/file"), ENAMETOOLONG);
    EXPECT_EQ(PathAccess(path(longest + "n")).symlink("contents"), ENAMETOOLONG);
}

TEST_F(PathAccessTest, RemovesAFileALinkAndAnEmptyFolder) {
    rootsLink("link", "root/file");
    EXPECT_EQ(PathAccess(path("link")).remove(), 0);
    EXPECT_TRUE(isThere("root/file"));
    EXPECT_EQ(PathAccess(path("root/file")).remove(), 0);
    EXPECT_EQ(PathAccess(path("root/folder")).remove(), 0);
    EXPECT_FALSE(isThere("link") || isThere("root/file") || isThere("root/folder"));
}

TEST_F(PathAccessTest, RemovesALinkToAFolderAndNotTheFolder) {
    mobilesLink("link", "root/folder");
    EXPECT_EQ(PathAccess(path("link")).remove(), 0);
    EXPECT_FALSE(isThere("link"));
    EXPECT_TRUE(isThere("root/folder"));
}

TEST_F(PathAccessTest, DoesNotRemoveAFolderThatHoldsSomething) {
    EXPECT_EQ(PathAccess(path("root")).remove(), ENOTEMPTY);
    EXPECT_TRUE(isThere("root/file"));
    EXPECT_EQ(PathAccess(path("missing")).remove(), ENOENT);
}

TEST_F(PathAccessTest, MakesALinkOnlyWhereNothingIs) {
    rootsLink("dangling", "missing");
    for (const char* taken : {"root/file", "root/folder", "dangling"}) {
        EXPECT_EQ(PathAccess(path(taken)).symlink("contents"), EEXIST) << taken;
    }
    EXPECT_FALSE(isThere("missing"));
    EXPECT_EQ(PathAccess(path("new")).symlink("any contents, with ../ in them"), 0);
    EXPECT_EQ(fs::read_symlink(path("new")), "any contents, with ../ in them");
}

TEST_F(PathAccessTest, DoesNotMakeALinkWithoutContentsOrWithTooMany) {
    EXPECT_EQ(PathAccess(path("new")).symlink(""), ENOENT);
    EXPECT_EQ(PathAccess(path("new")).symlink(std::string(4096, 'c')), ENAMETOOLONG);
    EXPECT_EQ(PathAccess(path("new")).symlink(std::string(4095, 'c')), 0);
}

TEST_F(PathAccessTest, TellsEachKindOfFile) {
    rootsLink("link", "root");
    ASSERT_EQ(mkfifo(path("fifo").c_str(), 0600), 0);
    ASSERT_EQ(mknod(path("socket").c_str(), S_IFSOCK | 0600, 0), 0);
    EXPECT_EQ(typeOf("root/file"), S_IFREG);
    EXPECT_EQ(typeOf("root"), S_IFDIR);
    EXPECT_EQ(typeOf("link"), S_IFLNK);
    EXPECT_EQ(typeOf("fifo"), S_IFIFO);
    EXPECT_EQ(typeOf("socket"), S_IFSOCK);
}

TEST_F(PathAccessTest, TellsOwnerGroupAndPermissions) {
    fs::permissions(path("mobile/file"), fs::perms(0640));
    ASSERT_EQ(chown(path("mobile/file").c_str(), kMobile, 7), 0);
    FileStatus status;
    ASSERT_EQ(PathAccess(path("mobile/file")).lstat(&status), 0);
    EXPECT_EQ(status.mode, std::uint32_t{S_IFREG | 0640});
    EXPECT_EQ(status.uid, kMobile);
    EXPECT_EQ(status.gid, 7U);
}

TEST_F(PathAccessTest, LeavesTheStatusAloneWhenItFails) {
    FileStatus status{.mode = 1, .uid = 2, .gid = 3};
    EXPECT_EQ(PathAccess(path("missing")).lstat(&status), ENOENT);
    EXPECT_EQ(status.mode + status.uid + status.gid, 6U);
}

TEST_F(PathAccessTest, StaysInTheFolderItWasResolvedTo) {
    const PathAccess access(path("mobile/folder/new"));
    fs::rename(path("mobile/folder"), path("mobile/elsewhere"));
    mobilesLink("mobile/folder", path("root/folder"));
    EXPECT_EQ(access.symlink("contents"), 0);
    EXPECT_TRUE(isThere("mobile/elsewhere/new"));
    EXPECT_FALSE(isThere("root/folder/new"));
}

TEST_F(PathAccessTest, TellsWhatALinkInTheLastStepLeadsTo) {
    rootsLink("toFile", "mobile/file");
    rootsLink("toFolder", "root");
    FileStatus status;
    ASSERT_EQ(PathAccess(path("toFile")).stat(&status), 0);
    EXPECT_EQ(status.uid, kMobile);
    EXPECT_EQ(status.mode & kTypeBits, std::uint32_t{S_IFREG});
    ASSERT_EQ(PathAccess(path("toFolder")).stat(&status), 0);
    EXPECT_EQ(status.mode & kTypeBits, std::uint32_t{S_IFDIR});
    EXPECT_EQ(lookBehind("toFolder/"), 0);
    EXPECT_EQ(lookBehind("toFile/"), ENOTDIR);
    EXPECT_EQ(lookBehind("root/file"), 0);
}

TEST_F(PathAccessTest, LooksBehindNoLinkToWhatItsOwnerDoesNotOwn) {
    mobilesLink("mobile/toRoots", "../root/file");
    mobilesLink("mobile/toOwn", "file");
    mobilesLink("mobile/dangling", "missing");
    mobilesLink("mobile/loop", "loop");
    EXPECT_EQ(lookBehind("mobile/toRoots"), EPERM);
    EXPECT_EQ(lookBehind("mobile/toOwn"), 0);
    EXPECT_EQ(lookBehind("mobile/dangling"), ENOENT);
    EXPECT_EQ(lookBehind("mobile/loop"), ELOOP);
    EXPECT_EQ(lookBehind("mobile/missing"), ENOENT);
}

TEST_F(PathAccessTest, MakesFoldersWhereNothingIs) {
    rootsLink("dangling", "missing");
    EXPECT_EQ(PathAccess(path("new")).makeDirectory(0700), 0);
    EXPECT_EQ(fs::status(path("new")).permissions(), fs::perms(0700));
    EXPECT_EQ(PathAccess(path("other/")).makeDirectory(0755), 0);
    for (const char* taken : {"new", "root/file", "dangling", "root/.", "root/.."}) {
        EXPECT_EQ(PathAccess(path(taken)).makeDirectory(0755), EEXIST) << taken;
    }
    EXPECT_EQ(PathAccess("/").makeDirectory(0755), EEXIST);
    EXPECT_EQ(PathAccess(path("nowhere/new")).makeDirectory(0755), ENOENT);
    EXPECT_EQ(PathAccess(path("root/file/new")).makeDirectory(0755), ENOTDIR);
    EXPECT_FALSE(isThere("missing"));
}

TEST_F(PathAccessTest, MakesFoldersWithTheModeLessTheMask) {
    const mode_t mask = umask(027);
    EXPECT_EQ(PathAccess(path("new")).makeDirectory(0777), 0);
    umask(mask);
    EXPECT_EQ(fs::status(path("new")).permissions(), fs::perms(0750));
}

TEST_F(PathAccessTest, MakesNoFolderBehindAPlantedLink) {
    mobilesLink("mobile/link", "../root");
    EXPECT_EQ(PathAccess(path("mobile/link/new")).makeDirectory(0755), EPERM);
    EXPECT_FALSE(isThere("root/new"));
}

TEST_F(PathAccessTest, MovesInPlaceOfWhatIsThere) {
    rootsLink("link", "root/file");
    EXPECT_EQ(move("mobile/file", "root/file"), 0);
    FileStatus status;
    ASSERT_EQ(PathAccess(path("root/file")).lstat(&status), 0);
    EXPECT_EQ(status.uid, kMobile);
    EXPECT_EQ(move("link", "mobile/new"), 0);
    EXPECT_EQ(typeOf("mobile/new"), S_IFLNK) << "a link moves as itself";
    EXPECT_EQ(move("root/file", "mobile/new"), 0);
    EXPECT_EQ(typeOf("mobile/new"), S_IFREG) << "and is replaced as itself";
    EXPECT_EQ(move("mobile/new", "mobile/new"), 0);
    EXPECT_TRUE(isThere("mobile/new"));
}

TEST_F(PathAccessTest, MovesFoldersOntoEmptyOnesOnly) {
    fs::create_directory(path("empty"));
    EXPECT_EQ(move("empty", "root"), ENOTEMPTY);
    EXPECT_EQ(move("root/file", "empty"), EISDIR);
    EXPECT_EQ(move("empty", "root/file"), ENOTDIR);
    EXPECT_EQ(move("root", "root/folder/deeper"), EINVAL);
    EXPECT_EQ(move("root/folder", "root"), ENOTEMPTY) << "it holds what is moved";
    EXPECT_EQ(move("mobile", "empty"), 0);
    EXPECT_TRUE(isThere("empty/file"));
}

TEST_F(PathAccessTest, DoesNotMoveWhatHasNoEntryOfItsOwn) {
    EXPECT_EQ(move("missing", "new"), ENOENT);
    EXPECT_EQ(move("root/file", "nowhere/new"), ENOENT);
    EXPECT_EQ(move("root/file", "new/"), ENOTDIR) << "a slash wants a folder";
    EXPECT_EQ(move("root/file/", "new"), ENOTDIR);
    for (const char* entry : {"root/.", "root/.."}) {
        EXPECT_EQ(move(entry, "new"), EBUSY) << entry;
        EXPECT_EQ(move("mobile", entry), EBUSY) << entry;
    }
}

TEST_F(PathAccessTest, MovesNothingThroughAPlantedLink) {
    mobilesLink("mobile/link", "../root");
    EXPECT_EQ(move("mobile/file", "mobile/link/file"), EPERM);
    EXPECT_EQ(move("mobile/link/file", "mobile/new"), EPERM);
    std::ifstream file(path("root/file"));
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(file), {}), "root");
    EXPECT_FALSE(isThere("mobile/new"));
}

TEST_F(PathAccessTest, SynchronizesFilesAndFolders) {
    EXPECT_EQ(PathAccess(path("root/file")).synchronize(), 0);
    EXPECT_EQ(PathAccess(path("root/folder")).synchronize(), 0);
    EXPECT_EQ(PathAccess(path("missing")).synchronize(), ENOENT);
    rootsLink("link", "root/file");
    EXPECT_EQ(PathAccess(path("link")).synchronize(), ELOOP);
    mobilesLink("mobile/link", "../root");
    EXPECT_EQ(PathAccess(path("mobile/link/file")).synchronize(), EPERM);
}

TEST_F(PathAccessTest, DoesNotWaitForAFifoThatItSynchronizes) {
    ASSERT_EQ(mkfifo(path("fifo").c_str(), 0600), 0);
    EXPECT_EQ(PathAccess(path("fifo")).synchronize(), EINVAL);
}

TEST_F(PathAccessTest, AnswersEveryOperationWithTheErrorOfItsResolution) {
    const PathAccess lost(path("nowhere/file"));
    FileStatus status;
    EXPECT_EQ(lost.lstat(&status), ENOENT);
    EXPECT_EQ(lost.stat(&status), ENOENT);
    EXPECT_EQ(lost.remove(), ENOENT);
    EXPECT_EQ(lost.makeDirectory(0755), ENOENT);
    EXPECT_EQ(lost.moveOnto(PathAccess(path("new"))), ENOENT);
    EXPECT_EQ(PathAccess(path("root/file")).moveOnto(lost), ENOENT);
    EXPECT_EQ(lost.synchronize(), ENOENT);
}

TEST_F(PathAccessTest, MovesWithItsResolution) {
    PathAccess first(path("root/file"));
    PathAccess second(std::move(first));
    EXPECT_EQ(second.remove(), 0);
    second = PathAccess(path("mobile/file"));
    EXPECT_EQ(second.remove(), 0);
    EXPECT_FALSE(isThere("root/file") || isThere("mobile/file"));
}

}  // namespace
}  // namespace platform
