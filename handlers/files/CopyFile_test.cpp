#include "handlers/files/FileTest.h"

namespace {

class CopyFile : public FileRoutine {
protected:
    kern_return_t call(std::string_view source,
                       std::string_view destination,
                       std::string_view name) {
        auto sourceField = Field256(source);
        auto destinationField = Field256(destination);
        auto nameField = Field256(name);
        return server_LFMobileHelperCopyFile(7, sourceField, destinationField, nameField, isDone);
    }

    std::int32_t isDone = 7;
};

TEST_F(CopyFile, CopiesAndGivesTheCopyToTheMobileUser) {
    EXPECT_EQ(call("/logs", kBundles, "file"), 0);
    EXPECT_EQ(isDone, 1);
    const auto copy = sim::FileAt(std::string(kBundles) + "/file");
    ASSERT_TRUE(copy.has_value());
    EXPECT_EQ(copy->contents, "new");
    EXPECT_EQ(copy->owner, kMobileUser);
    EXPECT_EQ(copy->groupId(), kMobileUser);
    EXPECT_EQ(contentsAt("/logs/file"), "new");
}

TEST_F(CopyFile, MakesTheMissingDestinationDirectory) {
    EXPECT_EQ(call("/logs", kBundles, "file"), 0);
    const auto directory = sim::FileAt(kBundles);
    ASSERT_TRUE(directory.has_value());
    EXPECT_EQ(directory->mode, sim::kDirectory | 0755);
    EXPECT_EQ(directory->owner, 0U);
}

TEST_F(CopyFile, LogsWhatItWasAskedForAndNothingElseOfItsOwn) {
    EXPECT_EQ(call("/logs", kBundles, "file"), 0);
    EXPECT_EQ(sim::SystemLogLines(),
              SystemLines{Notice("'/logs', '" + std::string(kBundles) + "', 'file'\n")});
    const std::string path = std::string(kBundles) + "/file";
    EXPECT_EQ(sim::UnifiedLog(),
              (std::vector<sim::LogLine>{
                  {platform::LogLevel::kInfo, "Allowing path " + path + " within " + kBundles}}));
}

TEST_F(CopyFile, LogsTheRequestBeforeItJudgesThePath) {
    EXPECT_EQ(call("/logs", "/etc", "file"), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"SystemLog notice '/logs', '/etc', 'file'",
                                        "PathAccess.lstat /etc/file",
                                        "Log error NOT",
                                        "SystemLog error Destination directory /etc/file"}));
}

TEST_F(CopyFile, RefusesADestinationOutsideAndMakesNothing) {
    EXPECT_EQ(call("/logs", "/logs/made", "file"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_FALSE(sim::FileAt("/logs/made").has_value());
    expectRefusal("/logs/made/file");
    EXPECT_EQ(sim::SystemLogLines(),
              (SystemLines{Notice("'/logs', '/logs/made', 'file'\n"),
                           Error("Destination directory /logs/made/file is not within the allowed "
                                 "directories\n")}));
}

TEST_F(CopyFile, TakesABundleLinkPathAndACarrierArchive) {
    sim::MakeDirectory("/private/var/mobile/Library/Preferences", kMobileUser);
    sim::MakeDirectory("/tmp");
    sim::MakeFile("/logs/com.vendra.carrier.plist", {.mode = sim::kRegular | 0644});
    sim::MakeFile("/logs/a.crbn", {.mode = sim::kRegular | 0644});
    EXPECT_EQ(call("/logs", "/var/mobile/Library/Preferences", "com.vendra.carrier.plist"), 0);
    EXPECT_EQ(isDone, 1);
    EXPECT_EQ(call("/logs", "/tmp", "a.crbn"), 0);
    EXPECT_EQ(isDone, 1);
}

TEST_F(CopyFile, SaysThatItCouldNotCopy) {
    EXPECT_EQ(call("/nowhere", kBundles, "file"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(sim::SystemLogLines().back(),
              Error("Failed to copy the file /nowhere to " + std::string(kBundles) + "\n"));
    EXPECT_TRUE(isDirectory(kBundles)) << "made before the source is looked at";
}

TEST_F(CopyFile, SaysSoWhenTheDirectoryCannotBeMade) {
    sim::MakeFile(kBundles, {.mode = sim::kRegular | 0644});
    EXPECT_EQ(call("/logs", std::string(kBundles) + "/below", "file"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(sim::SystemLogLines().back(),
              Error("Failed to copy the file /logs to " + std::string(kBundles) + "/below\n"));
}

TEST_F(CopyFile, LeavesACopyThatCannotBeGivenAway) {
    sim::FailCall("PathAccess.setOwner", 2);
    EXPECT_EQ(call("/logs", kBundles, "file"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(sim::FailedCall(), "PathAccess.setOwner");
    EXPECT_EQ(contentsAt(std::string(kBundles) + "/file"), "new");
    EXPECT_EQ(sim::SystemLogLines().size(), 1U) << "without a word";
}

TEST_F(CopyFile, GivesAwayALinkAndNotWhatItLeadsTo) {
    sim::MakeFile("/secret", {.mode = sim::kRegular | 0600});
    sim::MakeLink("/logs/link", "/secret");
    EXPECT_EQ(call("/logs", kBundles, "link"), 0);
    EXPECT_EQ(isDone, 1);
    EXPECT_EQ(sim::FileAt(std::string(kBundles) + "/link")->owner, kMobileUser);
    EXPECT_EQ(sim::FileAt("/secret")->owner, 0U);
}

TEST_F(CopyFile, ReplacesAFileAndEntersADirectoryOfThatName) {
    sim::MakeDirectory(kBundles);
    sim::MakeFile(std::string(kBundles) + "/file", {.mode = sim::kRegular | 0644});
    EXPECT_EQ(call("/logs", kBundles, "file"), 0);
    EXPECT_EQ(contentsAt(std::string(kBundles) + "/file"), "new");
    sim::MakeDirectory(std::string(kBundles) + "/folder");
    EXPECT_EQ(call("/logs", kBundles, "folder"), 0);
    EXPECT_EQ(contentsAt(std::string(kBundles) + "/folder/folder/inner"), "in");
}

TEST_F(CopyFile, RefusesADirectoryOverAFile) {
    sim::MakeDirectory(kBundles);
    sim::MakeFile(std::string(kBundles) + "/folder", {.mode = sim::kRegular, .contents = "old"});
    EXPECT_EQ(call("/logs", kBundles, "folder"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(contentsAt(std::string(kBundles) + "/folder"), "old");
}

TEST_F(CopyFile, CutsTheLastByteOfFullFields) {
    const std::string full(256, 'a');
    EXPECT_EQ(call(full, full, full), 0);
    EXPECT_EQ(isDone, 0);
    const std::string cut = full.substr(1);
    EXPECT_EQ(sim::SystemLogLines().front(),
              Notice("'" + cut + "', '" + cut + "', '" + cut + "'\n"));
}

TEST_F(CopyFile, TellsTheTruthAtEveryFailure) {
    ExpectTrueFlagAtEveryFailure(
        makePhone,
        [this] { return call("/logs", kBundles, "file"); },
        isDone,
        [] {
            const auto copy = sim::FileAt(std::string(kBundles) + "/file");
            return copy && copy->contents == "new" && copy->owner == kMobileUser;
        });
}

}  // namespace
