#include "handlers/files/RecursiveAttributes.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"

namespace {

constexpr std::uint32_t kMobile = 501;

class RecursiveAttributesTest : public testing::Test {
protected:
    RecursiveAttributesTest() {
        sim::Reset();
        for (const char* name : {"/tree", "/tree/a", "/tree/a/b"}) {
            sim::MakeDirectory(name, kMobile);
        }
        sim::MakeFile("/tree/a/file", {.mode = sim::kRegular | 0600, .owner = kMobile});
        sim::MakeFile("/outside", {.mode = sim::kRegular | 0600, .owner = kMobile});
        sim::MakeLink("/tree/link", "/outside", kMobile);
        sim::ClearJournal();
    }
};

TEST_F(RecursiveAttributesTest, ReachAllBelowAndTheDirectoryLast) {
    EXPECT_EQ(SetAttributesRecursively("/tree", {.owner = 7, .group = 8}), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"DirectoryAccess.subpaths /tree",
                                        "FileManager.setAttributes /tree/a",
                                        "FileManager.setAttributes /tree/a/b",
                                        "FileManager.setAttributes /tree/a/file",
                                        "FileManager.setAttributes /tree/link",
                                        "FileManager.setAttributes /tree"}));
    for (const char* name : {"/tree", "/tree/a", "/tree/a/b", "/tree/a/file", "/tree/link"}) {
        EXPECT_EQ(sim::FileAt(name)->owner, 7U) << name;
        EXPECT_EQ(sim::FileAt(name)->groupId(), 8U) << name;
    }
    EXPECT_EQ(sim::FileAt("/outside")->owner, kMobile);
}

TEST_F(RecursiveAttributesTest, LeaveOutThePermissionsOfLinks) {
    EXPECT_EQ(SetAttributesRecursively("/tree", {.permissions = 0711}), 0);
    EXPECT_EQ(sim::FileAt("/tree/a/file")->mode, sim::kRegular | 0711);
    EXPECT_EQ(sim::FileAt("/outside")->mode, sim::kRegular | 0600);
}

TEST_F(RecursiveAttributesTest, SayFiveWhereNothingIs) {
    EXPECT_EQ(SetAttributesRecursively("/missing", {.permissions = 0711}), 5);
    EXPECT_EQ(sim::JournalCount("FileManager."), 0U);
}

TEST_F(RecursiveAttributesTest, ReachOneItemThatIsNoDirectory) {
    EXPECT_EQ(SetAttributesRecursively("/tree/a/file", {.permissions = 0711}), 0);
    EXPECT_EQ(sim::JournalCount("DirectoryAccess."), 0U);
    EXPECT_EQ(sim::JournalCount("FileManager.setAttributes"), 1U);
    sim::FailCall("FileManager.setAttributes", 1);
    EXPECT_EQ(SetAttributesRecursively("/tree/a/file", {.permissions = 0711}), EPERM);
}

TEST_F(RecursiveAttributesTest, RememberAFailureBelowAndGoOn) {
    sim::FailCall("FileManager.setAttributes", 1);
    EXPECT_EQ(SetAttributesRecursively("/tree", {.owner = 7}), EPERM);
    EXPECT_EQ(sim::FileAt("/tree/a")->owner, kMobile);
    EXPECT_EQ(sim::FileAt("/tree/a/b")->owner, 7U);
    EXPECT_EQ(sim::FileAt("/tree")->owner, 7U);
}

TEST_F(RecursiveAttributesTest, TellTheDirectorysOwnFailure) {
    sim::FailCall("FileManager.setAttributes", 5);
    EXPECT_EQ(SetAttributesRecursively("/tree", {.owner = 7}), EPERM);
    EXPECT_EQ(sim::FileAt("/tree")->owner, kMobile);
    EXPECT_EQ(sim::FileAt("/tree/a")->owner, 7U);
}

TEST_F(RecursiveAttributesTest, ReachTheDirectoryThoughItCannotBeListed) {
    sim::FailCall("DirectoryAccess.subpaths", 1);
    EXPECT_EQ(SetAttributesRecursively("/tree", {.owner = 7}), 0);
    EXPECT_EQ(sim::FileAt("/tree")->owner, 7U);
    EXPECT_EQ(sim::FileAt("/tree/a")->owner, kMobile);
}

}  // namespace
