// What the contract suite cannot see: the order of the steps, failures on demand, owners.
#include "handlers/files/FileSystemManager.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"

using platform::PropertyList;

namespace {

using Recursive = FileSystemInterface::Recursive;
using Intermediates = FileSystemInterface::Intermediates;

constexpr std::uint32_t kMobile = 501;

class FileSystemManagerTest : public testing::Test {
protected:
    FileSystemManagerTest() {
        sim::Reset();
        sim::MakeDirectory("/from", kMobile);
        sim::MakeDirectory("/to");
    }

    static void file(const std::string& path) {
        sim::MakeFile(path, {.mode = sim::kRegular | 0644, .owner = kMobile, .contents = "text"});
    }

    static std::uint32_t ownerOf(const std::string& path) { return sim::FileAt(path)->owner; }

    static bool isAt(const std::string& path) { return sim::FileAt(path).has_value(); }

    FileSystemManager manager_;
};

TEST_F(FileSystemManagerTest, GivesTransfersToTheProcess) {
    file("/from/a");
    file("/from/b");
    EXPECT_EQ(manager_.moveItem("/from/a", "/to/a"), 0);
    EXPECT_EQ(manager_.copyItem("/from/b", "/to/b"), 0);
    EXPECT_EQ(ownerOf("/to/a"), 0U);
    EXPECT_EQ(ownerOf("/to/b"), 0U);
    EXPECT_EQ(ownerOf("/from/b"), 0U) << "the source of a copy is given away, too";
    file("/from/c");
    EXPECT_EQ(manager_.moveItemWithOwner("/from/c", "/to/c", 20, 30), 0);
    EXPECT_EQ(ownerOf("/to/c"), 20U);
    EXPECT_EQ(sim::FileAt("/to/c")->groupId(), 30U);
}

TEST_F(FileSystemManagerTest, MovesAFileAfterItsWholeTreeWasGivenAway) {
    sim::MakeDirectory("/from/tree", kMobile);
    file("/from/tree/file");
    sim::ClearJournal();
    EXPECT_EQ(manager_.moveFile("/from/tree", "/to/tree"), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"PathAccess.stat /from/tree",
                                        "FileManager.setAttributes /from/tree/file",
                                        "FileManager.setAttributes /from/tree",
                                        "FileManager.moveItem /from/tree -> /to/tree"}));
    EXPECT_EQ(ownerOf("/to/tree"), 0U);
    EXPECT_EQ(ownerOf("/to/tree/file"), 0U);
}

TEST_F(FileSystemManagerTest, MovesAFileThoughItCouldNotBeGivenAway) {
    file("/from/file");
    sim::FailCall("FileManager.setAttributes", 1);
    EXPECT_EQ(manager_.moveFile("/from/file", "/to/file"), 0);
    EXPECT_EQ(sim::FailedCall(), "FileManager.setAttributes");
    EXPECT_EQ(ownerOf("/to/file"), kMobile);
    sim::FailCall("FileManager.moveItem", 1);
    EXPECT_EQ(manager_.moveFile("/to/file", "/from/file"), EIO);
}

TEST_F(FileSystemManagerTest, MakesTheDirectoryOfANamedItemFirst) {
    file("/from/name");
    sim::ClearJournal();
    EXPECT_EQ(manager_.copyNamedItem("/from", "/to/new", "name"), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"PathAccess.stat /to/new",
                                        "FileManager.createDirectory /to/new",
                                        "PathAccess.stat /from/name",
                                        "FileManager.copyItem /from/name -> /to/new/name"}));
    EXPECT_EQ(sim::FileAt("/to/new")->mode, sim::kDirectory | 0755);
}

TEST_F(FileSystemManagerTest, TellsMinusOneWhenTheDirectoryOfANamedItemCannotBeMade) {
    file("/from/name");
    sim::FailCall("FileManager.createDirectory", 1);
    EXPECT_EQ(manager_.copyNamedItem("/from", "/to/new", "name"), -1);
    EXPECT_EQ(sim::JournalCount("FileManager.copyItem"), 0U);
    EXPECT_EQ(manager_.copyNamedItem("/from", "/to/new", "missing"), -1);
    EXPECT_TRUE(isAt("/to/new")) << "made before the source was looked for";
    sim::FailCall("FileManager.copyItem", 1);
    EXPECT_EQ(manager_.copyNamedItem("/from", "/to/new", "name"), ENOSPC);
}

TEST_F(FileSystemManagerTest, TellsMinusOneWhenAnOwnerOrAModeCannotBeSet) {
    file("/from/file");
    sim::FailCall("PathAccess.setOwner", 1);
    EXPECT_EQ(manager_.setOwner("/from/file", 1, 2, Recursive::kNo), -1);
    sim::FailCall("PathAccess.setMode", 1);
    EXPECT_EQ(manager_.setPermissions("/from/file", 0600, Recursive::kNo), -1);
    EXPECT_EQ(manager_.setOwner("/from/file", 1, 2, Recursive::kNo), 0);
    EXPECT_EQ(ownerOf("/from/file"), 1U);
}

TEST_F(FileSystemManagerTest, MovesEntriesUntilOneFails) {
    for (const char* name : {"/from/a1", "/from/a2", "/from/a3", "/from/b"}) {
        file(name);
    }
    sim::FailCall("FileManager.moveItem", 2);
    EXPECT_EQ(manager_.moveEntriesWithPrefix("a", "/from/", "/to/"), EIO);
    EXPECT_TRUE(isAt("/to/a1"));
    EXPECT_TRUE(isAt("/from/a2") && isAt("/from/a3"));
    sim::FailCall("DirectoryAccess.list", 1);
    EXPECT_EQ(manager_.moveEntriesWithPrefix("a", "/from/", "/to/"), EIO);
    EXPECT_EQ(manager_.moveEntriesWithPrefix("a", "/from/", "/to/"), 0);
    EXPECT_TRUE(isAt("/to/a2") && isAt("/to/a3") && isAt("/from/b"));
}

TEST_F(FileSystemManagerTest, CreatesDirectoriesForOwnersByName) {
    EXPECT_EQ(manager_.createDirectoryWithOwner("/to/a", 0700, "mobile", "", Intermediates::kNo),
              0);
    EXPECT_EQ(ownerOf("/to/a"), kMobile);
    EXPECT_EQ(sim::FileAt("/to/a")->groupId(), 0U);
    EXPECT_EQ(manager_.createDirectoryWithOwner("/to/b", 0700, "", "mobile", Intermediates::kNo),
              0);
    EXPECT_EQ(ownerOf("/to/b"), 0U);
    EXPECT_EQ(sim::FileAt("/to/b")->groupId(), kMobile);
    EXPECT_EQ(manager_.createDirectory("/to/c", 0711, Intermediates::kNo), 0);
    EXPECT_EQ(sim::FileAt("/to/c")->mode, sim::kDirectory | 0711);
}

TEST_F(FileSystemManagerTest, TellsWhyADirectoryWasNotCreated) {
    sim::FailCall("FileManager.createDirectory", 1);
    EXPECT_EQ(manager_.createDirectory("/to/a", 0755, Intermediates::kNo), ENOSPC);
    EXPECT_EQ(
        manager_.createDirectoryWithOwner("/to/a", 0755, "nobody", "mobile", Intermediates::kNo),
        EINVAL);
    EXPECT_FALSE(isAt("/to/a"));
}

TEST_F(FileSystemManagerTest, TellsWhyAnItemWasNotRemovedOrListed) {
    file("/from/file");
    sim::FailCall("FileManager.removeItem", 1);
    EXPECT_EQ(manager_.remove("/from/file"), EIO);
    std::list<std::string> entries{"from before"};
    sim::FailCall("DirectoryAccess.list", 1);
    EXPECT_EQ(manager_.listDirectory("/from", &entries, FileSystemInterface::Paths::kNames), EIO);
    EXPECT_TRUE(entries.empty());
}

TEST_F(FileSystemManagerTest, SaysFalseWhenAFileIsNotWrittenWhole) {
    const PropertyList list(PropertyList::Dictionary{{"key", PropertyList("value")}});
    const std::vector<std::byte> data(3);
    for (const char* call : {"OutputFile.open", "OutputFile.write", "OutputFile.close"}) {
        sim::FailCall(call, 1);
        EXPECT_FALSE(manager_.writePropertyList("/to/file", &list)) << call;
    }
    for (const char* call : {"OutputFile.open", "OutputFile.close"}) {
        sim::FailCall(call, 1);
        EXPECT_FALSE(manager_.createEmptyFile("/to/file")) << call;
    }
    sim::FailCall("FileManager.replaceContents", 1);
    EXPECT_FALSE(manager_.writeData("/to/file", &data));
    sim::FailCall("FileManager.replaceContents", 1);
    EXPECT_FALSE(manager_.writeDictionary("/to/file", &list));
}

TEST_F(FileSystemManagerTest, SaysNothingOfWhatCannotBeRead) {
    file("/from/file");
    sim::MakeLink("/from/link", "file");
    sim::FailCall("PathAccess.read", 1);
    EXPECT_EQ(manager_.loadData("/from/file"), std::nullopt);
    sim::FailCall("PathAccess.read", 1);
    EXPECT_EQ(manager_.loadDictionary("/from/file"), std::nullopt);
    sim::FailCall("PathAccess.readLink", 1);
    EXPECT_EQ(manager_.readLink("/from/link"), "");
    sim::FailCall("PathAccess.realPath", 1);
    EXPECT_EQ(manager_.realPath("/from/link"), "");
    sim::FailCall("PathAccess.lstat", 1);
    EXPECT_FALSE(manager_.isSymlink("/from/link"));
    EXPECT_EQ(manager_.realPath("/from/link"), "/from/file");
}

TEST_F(FileSystemManagerTest, CutsPathsApart) {
    EXPECT_EQ(manager_.baseName("/from/file/"), "file");
    EXPECT_EQ(manager_.dirName("/from/file/"), "/from");
    EXPECT_EQ(manager_.createSymlink("/from/link", "file"), 0);
    sim::FailCall("PathAccess.symlink", 1);
    EXPECT_EQ(manager_.createSymlink("/from/other", "file"), EIO);
}

}  // namespace
