#include "platform/PathAccess.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"

using platform::FileStatus;
using platform::PathAccess;

namespace {

constexpr std::uint32_t kMobile = 501;
constexpr std::uint32_t kOther = 502;

class SimPathAccess : public testing::Test {
protected:
    SimPathAccess() {
        sim::Reset();
        sim::MakeDirectory("/etc");
        sim::MakeDirectory("/mobiles", kMobile);
        sim::MakeFile("/etc/file", {.mode = sim::kRegular | 0640});
        sim::MakeFile("/mobiles/file", {.mode = sim::kRegular | 0600, .owner = kMobile});
    }

    static int lstatOf(std::string_view path) {
        FileStatus status;
        return PathAccess(path).lstat(&status);
    }

    static int statOf(std::string_view path) {
        FileStatus status;
        return PathAccess(path).stat(&status);
    }

    static int move(std::string_view from, std::string_view to) {
        return PathAccess(from).moveOnto(PathAccess(to));
    }
};

TEST_F(SimPathAccess, TellsModeAndOwner) {
    FileStatus status;
    EXPECT_EQ(PathAccess("/mobiles/file").lstat(&status), 0);
    EXPECT_EQ(status.mode, sim::kRegular | 0600U);
    EXPECT_EQ(status.uid, kMobile);
    EXPECT_EQ(PathAccess("/").lstat(&status), 0);
    EXPECT_EQ(status.mode & 0170000, sim::kDirectory);
}

TEST_F(SimPathAccess, FailsAsTheSystemCallsDo) {
    EXPECT_EQ(lstatOf(""), ENOENT);
    EXPECT_EQ(lstatOf("/nowhere"), ENOENT);
    EXPECT_EQ(lstatOf("/nowhere/file"), ENOENT);
    EXPECT_EQ(lstatOf("/etc/file/x"), ENOTDIR);
    EXPECT_EQ(lstatOf("/etc/file/"), ENOTDIR);
    EXPECT_EQ(lstatOf("/" + std::string(256, 'x')), ENAMETOOLONG);
    EXPECT_EQ(lstatOf(std::string(5000, '/')), ENAMETOOLONG);
}

TEST_F(SimPathAccess, TakesDotsAndSlashesAsTheyStand) {
    EXPECT_EQ(lstatOf("//etc///file"), 0);
    EXPECT_EQ(lstatOf("/etc/./file"), 0);
    EXPECT_EQ(lstatOf("/etc/../mobiles/file"), 0);
    EXPECT_EQ(lstatOf("/../../etc/file"), 0);
    EXPECT_EQ(lstatOf("/nowhere/../etc/file"), ENOENT);
}

TEST_F(SimPathAccess, FollowsALinkOfRootAnywhere) {
    sim::MakeLink("/link", "/mobiles");
    EXPECT_EQ(lstatOf("/link/file"), 0);
    EXPECT_EQ(lstatOf("/var/mobile/Library"), 0);
}

TEST_F(SimPathAccess, FollowsALinkToWhatItsOwnOwnerOwns) {
    sim::MakeLink("/link", "/mobiles", kMobile);
    EXPECT_EQ(lstatOf("/link/file"), 0);
}

TEST_F(SimPathAccess, RefusesALinkToWhatItsOwnerDoesNotOwn) {
    sim::MakeLink("/link", "/etc", kMobile);
    EXPECT_EQ(lstatOf("/link/file"), EPERM);
    sim::MakeLink("/link", "/mobiles", kOther);
    EXPECT_EQ(lstatOf("/link/file"), EPERM);
    EXPECT_EQ(PathAccess("/link/file").remove(), EPERM);
    EXPECT_EQ(PathAccess("/link/new").symlink("x"), EPERM);
}

TEST_F(SimPathAccess, JudgesEveryLinkOfAChain) {
    sim::MakeLink("/mobiles/inner", "/etc", kMobile);
    sim::MakeLink("/outer", "/mobiles/inner");
    EXPECT_EQ(lstatOf("/outer/file"), EPERM);
}

TEST_F(SimPathAccess, GivesUpAfterFortyLinks) {
    sim::MakeLink("/l0", "/etc");
    for (int i = 1; i < 41; ++i) {
        sim::MakeLink("/l" + std::to_string(i), "/l" + std::to_string(i - 1));
    }
    EXPECT_EQ(lstatOf("/l39/file"), 0);
    EXPECT_EQ(lstatOf("/l40/file"), ELOOP);
    sim::MakeLink("/loop", "/loop");
    EXPECT_EQ(lstatOf("/loop/file"), ELOOP);
}

TEST_F(SimPathAccess, FollowsNoLinkInTheLastStep) {
    sim::MakeLink("/link", "/etc/file");
    FileStatus status;
    EXPECT_EQ(PathAccess("/link").lstat(&status), 0);
    EXPECT_EQ(status.mode & 0170000, sim::kLink);
    EXPECT_EQ(PathAccess("/link").remove(), 0);
    EXPECT_TRUE(sim::FileAt("/etc/file").has_value());
}

TEST_F(SimPathAccess, LooksBehindALinkWithASlashByTheSameRule) {
    sim::MakeLink("/ours", "/mobiles");
    sim::MakeLink("/theirs", "/etc", kMobile);
    sim::MakeLink("/toFile", "/etc/file");
    FileStatus status;
    EXPECT_EQ(PathAccess("/ours/").lstat(&status), 0);
    EXPECT_EQ(status.uid, kMobile);
    EXPECT_EQ(lstatOf("/theirs/"), EPERM);
    EXPECT_EQ(lstatOf("/toFile/"), ENOTDIR);
    EXPECT_EQ(PathAccess("/ours/").remove(), ENOTDIR);
}

TEST_F(SimPathAccess, RemovesFilesAndEmptyDirectories) {
    EXPECT_EQ(PathAccess("/etc").remove(), ENOTEMPTY);
    EXPECT_EQ(PathAccess("/etc/file").remove(), 0);
    EXPECT_EQ(PathAccess("/etc/file").remove(), ENOENT);
    EXPECT_EQ(PathAccess("/etc").remove(), 0);
    EXPECT_EQ(PathAccess("/").remove(), EINVAL);
}

TEST_F(SimPathAccess, MakesLinksWhereNothingIs) {
    EXPECT_EQ(PathAccess("/etc/link").symlink("anything"), 0);
    EXPECT_EQ(sim::FileAt("/etc/link")->contents, "anything");
    EXPECT_EQ(PathAccess("/etc/link").symlink("else"), EEXIST);
    EXPECT_EQ(PathAccess("/etc/empty").symlink(""), ENOENT);
    EXPECT_EQ(PathAccess("/nowhere/link").symlink("x"), ENOENT);
}

TEST_F(SimPathAccess, TellsWhatALinkInTheLastStepLeadsTo) {
    sim::MakeLink("/toFile", "/mobiles/file");
    sim::MakeLink("/toFolder", "/etc");
    EXPECT_EQ(statOf("/mobiles/file"), 0);
    EXPECT_EQ(statOf("/toFile"), 0);
    FileStatus status;
    ASSERT_EQ(PathAccess("/toFolder").stat(&status), 0);
    EXPECT_EQ(status.mode & 0170000, sim::kDirectory);
    EXPECT_EQ(PathAccess("/toFolder/").stat(&status), 0);
    EXPECT_EQ(statOf("/toFile/"), ENOTDIR);
}

TEST_F(SimPathAccess, LooksBehindNoLinkToWhatItsOwnerDoesNotOwn) {
    sim::MakeLink("/mobiles/toRoots", "/etc/file", kMobile);
    sim::MakeLink("/mobiles/toOwn", "file", kMobile);
    sim::MakeLink("/mobiles/dangling", "missing", kMobile);
    sim::MakeLink("/mobiles/loop", "loop", kMobile);
    EXPECT_EQ(statOf("/mobiles/toRoots"), EPERM);
    EXPECT_EQ(statOf("/mobiles/toOwn"), 0);
    EXPECT_EQ(statOf("/mobiles/dangling"), ENOENT);
    EXPECT_EQ(statOf("/mobiles/loop"), ELOOP);
    EXPECT_EQ(statOf("/mobiles/missing"), ENOENT);
}

TEST_F(SimPathAccess, MakesDirectoriesWhereNothingIs) {
    EXPECT_EQ(PathAccess("/etc/new").makeDirectory(0777), 0);
    EXPECT_EQ(sim::FileAt("/etc/new")->mode, sim::kDirectory | 0755U);
    EXPECT_EQ(PathAccess("/etc/other/").makeDirectory(0700), 0);
    sim::MakeLink("/etc/dangling", "missing");
    for (const char* taken : {"/etc/new", "/etc/file", "/etc/dangling", "/", "/etc/.", "/etc/.."}) {
        EXPECT_EQ(PathAccess(taken).makeDirectory(0755), EEXIST) << taken;
    }
    EXPECT_EQ(PathAccess("/nowhere/new").makeDirectory(0755), ENOENT);
    EXPECT_EQ(PathAccess("/etc/file/new").makeDirectory(0755), ENOTDIR);
    EXPECT_FALSE(sim::FileAt("/etc/missing").has_value());
}

TEST_F(SimPathAccess, MovesInPlaceOfWhatIsThere) {
    sim::MakeLink("/link", "/etc/file");
    EXPECT_EQ(move("/mobiles/file", "/etc/file"), 0);
    EXPECT_EQ(sim::FileAt("/etc/file")->owner, kMobile);
    EXPECT_EQ(move("/link", "/mobiles/new"), 0);
    EXPECT_TRUE(sim::FileAt("/mobiles/new")->is(sim::kLink)) << "a link moves as itself";
    EXPECT_EQ(move("/etc/file", "/mobiles/new"), 0);
    EXPECT_TRUE(sim::FileAt("/mobiles/new")->is(sim::kRegular)) << "and is replaced as itself";
    EXPECT_EQ(move("/mobiles/new", "/mobiles/new"), 0);
    EXPECT_TRUE(sim::FileAt("/mobiles/new").has_value());
}

TEST_F(SimPathAccess, MovesFoldersOntoEmptyOnesOnly) {
    sim::MakeDirectory("/empty");
    sim::MakeDirectory("/etc/inner");
    EXPECT_EQ(move("/empty", "/etc"), ENOTEMPTY);
    EXPECT_EQ(move("/etc/file", "/empty"), EISDIR);
    EXPECT_EQ(move("/empty", "/etc/file"), ENOTDIR);
    EXPECT_EQ(move("/etc", "/etc/inner/deeper"), EINVAL);
    EXPECT_EQ(move("/etc/inner", "/etc"), ENOTEMPTY) << "it holds what is moved";
    EXPECT_EQ(move("/mobiles", "/empty"), 0);
    EXPECT_TRUE(sim::FileAt("/empty/file").has_value());
}

TEST_F(SimPathAccess, DoesNotMoveWhatHasNoEntryOfItsOwn) {
    EXPECT_EQ(move("/etc/missing", "/etc/new"), ENOENT);
    EXPECT_EQ(move("/etc/file", "/nowhere/new"), ENOENT);
    EXPECT_EQ(move("/etc/file", "/etc/new/"), ENOTDIR) << "a slash wants a folder";
    EXPECT_EQ(move("/etc/file/", "/etc/new"), ENOTDIR);
    for (const char* entry : {"/etc/.", "/etc/.."}) {
        EXPECT_EQ(move(entry, "/new"), EBUSY) << entry;
        EXPECT_EQ(move("/mobiles", entry), EBUSY) << entry;
    }
}

TEST_F(SimPathAccess, SynchronizesFilesAndFolders) {
    EXPECT_EQ(PathAccess("/etc/file").synchronize(), 0);
    EXPECT_EQ(PathAccess("/etc").synchronize(), 0);
    EXPECT_EQ(PathAccess("/etc/missing").synchronize(), ENOENT);
    sim::MakeLink("/etc/link", "/etc/file");
    EXPECT_EQ(PathAccess("/etc/link").synchronize(), ELOOP);
    sim::MakeFile("/etc/fifo", {.mode = sim::kFifo | 0600});
    EXPECT_EQ(PathAccess("/etc/fifo").synchronize(), EINVAL);
}

TEST_F(SimPathAccess, FailsWhenTold) {
    FileStatus status;
    sim::FailCall("PathAccess.stat", 1);
    EXPECT_EQ(PathAccess("/etc").stat(&status), EIO);
    sim::FailCall("PathAccess.makeDirectory", 1);
    EXPECT_EQ(PathAccess("/etc/new").makeDirectory(0755), EIO);
    sim::FailCall("PathAccess.moveOnto", 1);
    EXPECT_EQ(move("/etc/file", "/etc/new"), EIO);
    sim::FailCall("PathAccess.synchronize", 1);
    EXPECT_EQ(PathAccess("/etc/file").synchronize(), EIO);
    EXPECT_FALSE(sim::FileAt("/etc/new").has_value());
}

TEST_F(SimPathAccess, AnswersEveryOperationWithTheErrorOfItsResolution) {
    sim::FailCall("PathAccess.open", 1);
    const PathAccess path("/etc/file");
    FileStatus status;
    EXPECT_EQ(path.lstat(&status), EMFILE);
    EXPECT_EQ(path.remove(), EMFILE);
    EXPECT_EQ(path.symlink("x"), EMFILE);
    EXPECT_EQ(path.stat(&status), EMFILE);
    EXPECT_EQ(path.makeDirectory(0755), EMFILE);
    EXPECT_EQ(path.moveOnto(PathAccess("/etc/new")), EMFILE);
    EXPECT_EQ(PathAccess("/etc/file").moveOnto(path), EMFILE);
    EXPECT_EQ(path.synchronize(), EMFILE);
}

}  // namespace
