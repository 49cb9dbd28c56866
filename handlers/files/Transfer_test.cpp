#include "handlers/files/Transfer.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"

namespace {

constexpr std::uint32_t kMobile = 501;

class TransferTest : public testing::Test {
protected:
    TransferTest() {
        sim::Reset();
        sim::MakeDirectory("/from", kMobile);
        sim::MakeDirectory("/to");
    }

    static void file(const std::string& path, const std::string& contents = "new") {
        sim::MakeFile(path, {.mode = sim::kRegular | 0644, .owner = kMobile, .contents = contents});
    }

    static int copy(const std::string& source, const std::string& destination) {
        return PerformTransfer({.source = source,
                                .destination = destination,
                                .uid = 0,
                                .gid = 0,
                                .mode = TransferMode::kCopy});
    }

    static int move(const std::string& source, const std::string& destination) {
        return PerformTransfer({.source = source,
                                .destination = destination,
                                .uid = 7,
                                .gid = 8,
                                .mode = TransferMode::kMove});
    }

    static std::string contentsAt(const std::string& path) {
        const auto found = sim::FileAt(path);
        return found ? found->contents : "nothing";
    }

    static bool isAt(const std::string& path) { return sim::FileAt(path).has_value(); }
};

TEST_F(TransferTest, GivesTheSourceAwayAndThenCopiesToNothing) {
    file("/from/file");
    sim::ClearJournal();
    EXPECT_EQ(copy("/from/file", "/to/file"), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"PathAccess.stat /from/file",
                                        "PathAccess.stat /to/file",
                                        "PathAccess.setOwner /from/file",
                                        "FileManager.copyItem /from/file -> /to/file"}));
    EXPECT_EQ(sim::FileAt("/from/file")->owner, 0U) << "of a copy, too";
    EXPECT_EQ(sim::FileAt("/to/file")->owner, 0U);
}

TEST_F(TransferTest, MovesWithTheOwnerAsked) {
    file("/from/file");
    EXPECT_EQ(move("/from/file", "/to/file"), 0);
    EXPECT_EQ(sim::FileAt("/to/file")->owner, 7U);
    EXPECT_EQ(sim::FileAt("/to/file")->groupId(), 8U);
    EXPECT_EQ(sim::JournalCount("FileManager.moveItem"), 1U);
}

TEST_F(TransferTest, GivesALinkAwayAndNotWhatItLeadsTo) {
    file("/from/file");
    sim::MakeLink("/from/link", "file", kMobile);
    EXPECT_EQ(move("/from/link", "/to/link"), 0);
    EXPECT_EQ(sim::FileAt("/to/link")->owner, 7U);
    EXPECT_EQ(sim::FileAt("/from/file")->owner, kMobile);
}

TEST_F(TransferTest, IgnoresThatTheOwnerCouldNotBeSet) {
    file("/from/file");
    sim::FailCall("PathAccess.setOwner", 1);
    EXPECT_EQ(copy("/from/file", "/to/file"), 0);
    EXPECT_EQ(sim::FailedCall(), "PathAccess.setOwner");
    EXPECT_EQ(contentsAt("/to/file"), "new");
}

TEST_F(TransferTest, TellsTheFailureOfACopyToNothing) {
    file("/from/file");
    sim::FailCall("FileManager.copyItem", 1);
    EXPECT_EQ(copy("/from/file", "/to/file"), ENOSPC);
    sim::FailCall("FileManager.moveItem", 1);
    EXPECT_EQ(move("/from/file", "/to/file"), EIO);
    EXPECT_FALSE(isAt("/to/file"));
}

TEST_F(TransferTest, DoesNothingWithoutASource) {
    sim::ClearJournal();
    EXPECT_EQ(copy("/from/missing", "/to/file"), -1);
    EXPECT_EQ(sim::JournalCount("FileManager."), 0U);
    EXPECT_EQ(sim::JournalCount("PathAccess.setOwner"), 0U);
}

TEST_F(TransferTest, RemovesTheFileInADirectoryBeforeItGivesTheSourceAway) {
    file("/from/file");
    file("/to/file", "old");
    sim::ClearJournal();
    EXPECT_EQ(copy("/from/file", "/to"), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"PathAccess.stat /from/file",
                                        "PathAccess.stat /to",
                                        "PathAccess.stat /to/file",
                                        "FileManager.removeItem /to/file",
                                        "PathAccess.setOwner /from/file",
                                        "FileManager.copyItem /from/file -> /to/file"}));
    EXPECT_EQ(contentsAt("/to/file"), "new");
}

TEST_F(TransferTest, RemovesTheFileInTheWayBeforeItGivesTheSourceAway) {
    file("/from/file");
    file("/to/other", "old");
    sim::ClearJournal();
    EXPECT_EQ(copy("/from/file", "/to/other"), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"FileManager.removeItem /to/other",
                                        "PathAccess.setOwner /from/file",
                                        "FileManager.copyItem /from/file -> /to/other"}));
}

TEST_F(TransferTest, CountsWhatSharesTheDirectoryBitAsADirectory) {
    file("/to/file", "old");
    for (const auto type : {sim::kDirectory, sim::kSocket, sim::kBlockDevice}) {
        sim::MakeFile("/from/thing", {.mode = type | 0755});
        EXPECT_EQ(copy("/from/thing", "/to/file"), EEXIST) << type;
        EXPECT_EQ(contentsAt("/to/file"), "old");
    }
    sim::MakeFile("/from/thing", {.mode = sim::kFifo | 0755});
    EXPECT_EQ(copy("/from/thing", "/to/file"), 0) << "and is not told that nothing was copied";
    EXPECT_FALSE(isAt("/to/file"));
}

TEST_F(TransferTest, CopiesItemByItemWhereTheWholeFails) {
    sim::MakeDirectory("/from/tree");
    sim::MakeDirectory("/from/tree/a");
    file("/from/tree/a/file");
    file("/from/tree/b");
    sim::FailCall("FileManager.copyItem", 1);
    sim::ClearJournal();
    EXPECT_EQ(copy("/from/tree", "/to"), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"FileManager.copyItem /from/tree -> /to/tree",
                                        "DirectoryAccess.subpaths /from/tree",
                                        "FileManager.createDirectory /to/tree",
                                        "FileManager.copyItem /from/tree/a -> /to/tree/a",
                                        "FileManager.removeItem /to/tree/a/file",
                                        "DirectoryAccess.makeDirectories /to/tree/a",
                                        "FileManager.copyItem /from/tree/a/file -> ",
                                        "FileManager.copyItem /from/tree/b -> /to/tree/b",
                                        "PathAccess.removeDirectory /from/tree"}));
    EXPECT_EQ(contentsAt("/to/tree/a/file"), "new");
    EXPECT_EQ(contentsAt("/to/tree/b"), "new");
}

TEST_F(TransferTest, MergesTheRestWhenOneItemFails) {
    sim::MakeDirectory("/from/tree");
    sim::MakeDirectory("/to/tree");
    file("/from/tree/a");
    file("/from/tree/b");
    sim::FailCall("FileManager.moveItem", 2);  // the first is the whole tree
    EXPECT_EQ(move("/from/tree", "/to"), 0);
    EXPECT_EQ(contentsAt("/from/tree/a"), "new");
    EXPECT_FALSE(isAt("/to/tree/a"));
    EXPECT_EQ(contentsAt("/to/tree/b"), "new");
}

TEST_F(TransferTest, LeavesARegularFileWhoseWholeCopyFailed) {
    file("/from/file");
    sim::FailCall("FileManager.moveItem", 1);
    EXPECT_EQ(move("/from/file", "/to"), 0);
    EXPECT_EQ(sim::JournalCount("DirectoryAccess."), 0U) << "there is nothing to walk";
    EXPECT_EQ(sim::JournalCount("FileManager.moveItem"), 1U);
    EXPECT_EQ(contentsAt("/from/file"), "new");
}

TEST_F(TransferTest, SurvivesASourceThatGoesMeanwhile) {
    file("/from/file");
    sim::InterleaveAtCalls(true);
    sim::In(4.5e-6, [] { sim::RemoveFile("/from/file"); });
    EXPECT_EQ(move("/from/file", "/to"), 0);
    EXPECT_EQ(sim::JournalCount("DirectoryAccess.subpaths"), 1U) << "as a source that is not there";
    EXPECT_FALSE(isAt("/to/file"));
}

TEST_F(TransferTest, MergesAcrossFileSystems) {
    sim::MountAt("/to");
    sim::MakeDirectory("/from/tree");
    sim::MakeDirectory("/to/tree");
    sim::MakeFile("/from/tree/file", {.mode = sim::kRegular | 06755, .owner = kMobile});
    EXPECT_EQ(move("/from/tree", "/to"), 0);
    EXPECT_FALSE(isAt("/from/tree"));
    EXPECT_EQ(sim::FileAt("/to/tree/file")->mode, sim::kRegular | 0755) << "it was copied";
    EXPECT_EQ(sim::FileAt("/to/tree/file")->owner, 0U);
}

TEST_F(TransferTest, RemovesWhatIsInTheWayEvenIfItIsTheSource) {
    file("/from/file");
    EXPECT_EQ(copy("/from/file", "/from/file"), 0);
    EXPECT_FALSE(isAt("/from/file"));
}

TEST_F(TransferTest, GoesNowhereByAStrangersLink) {
    sim::MakeDirectory("/roots");
    sim::MakeLink("/to/link", "/roots", kMobile);
    file("/from/file");
    EXPECT_EQ(copy("/from/file", "/to/link"), EEXIST) << "the link is in the way";
    EXPECT_EQ(copy("/from/file", "/to/link/file"), EPERM);
    EXPECT_FALSE(isAt("/roots/file"));
    EXPECT_TRUE(sim::FileAt("/to/link")->is(sim::kLink));
}

TEST_F(TransferTest, LosesNothingWhicheverCallFails) {
    for (unsigned n = 1;; ++n) {
        sim::Reset();
        sim::MakeDirectory("/from");
        sim::MakeDirectory("/from/tree");
        sim::MakeDirectory("/to");
        sim::MakeDirectory("/to/tree");
        file("/from/tree/file");
        sim::FailCall(n);
        (void)move("/from/tree", "/to");
        EXPECT_NE(contentsAt("/from/tree/file"), contentsAt("/to/tree/file"))
            << n << ": " << sim::FailedCall();
        if (sim::FailedCall().empty()) {
            EXPECT_GT(n, 10U) << "every call was tried";
            break;
        }
    }
}

}  // namespace
