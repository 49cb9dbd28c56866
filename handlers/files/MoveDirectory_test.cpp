#include "handlers/files/FileTest.h"

namespace {

class MoveDirectory : public FileRoutine {
protected:
    kern_return_t call(std::string_view source,
                       std::string_view destination,
                       std::string_view name) {
        auto sourceField = Field256(source);
        auto destinationField = Field256(destination);
        auto nameField = Field256(name);
        return server_LFMobileHelperMoveDirectory(
            7, sourceField, destinationField, nameField, isDone);
    }

    static std::string bundle(const std::string& path) { return kBundles + ("/" + path); }

    std::int32_t isDone = 7;
};

TEST_F(MoveDirectory, MovesAndKeepsWhatIsMovedTheServicesOwn) {
    EXPECT_EQ(call("/logs/folder", kBundles, "new.bundle"), 0);
    EXPECT_EQ(isDone, 1);
    EXPECT_EQ(contentsAt(bundle("new.bundle/inner")), "in");
    EXPECT_EQ(sim::FileAt(bundle("new.bundle"))->owner, 0U);
    EXPECT_FALSE(sim::FileAt("/logs/folder").has_value());
    EXPECT_EQ(sim::FileAt(kBundles)->mode, sim::kDirectory | 0755);
}

TEST_F(MoveDirectory, LogsTwiceWhatItWasAskedFor) {
    EXPECT_EQ(call("/logs/folder", kBundles, "new.bundle"), 0);
    const std::string start = "'/logs/folder', '" + std::string(kBundles) + "'";
    EXPECT_EQ(sim::SystemLogLines(),
              (SystemLines{Notice(start + "\n"), Notice(start + ", 'new.bundle'\n")}));
    EXPECT_TRUE(sim::JournalHasInOrder({"SystemLog notice '/logs/folder', '/private",
                                        "FileManager.createDirectory",
                                        "SystemLog notice '/logs/folder', '/private",
                                        "Log info Allowing path",
                                        "FileManager.moveItem"}));
}

TEST_F(MoveDirectory, MakesTheDirectoryOfADestinationThatItRefuses) {
    EXPECT_EQ(call("/logs/folder", "/logs/deep/made", "new.bundle"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(sim::FileAt("/logs/deep/made")->mode, sim::kDirectory | 0755);
    EXPECT_TRUE(isDirectory("/logs/folder"));
    expectRefusal("/logs/deep/made/new.bundle");
    EXPECT_EQ(sim::SystemLogLines(),
              (SystemLines{Notice("'/logs/folder', '/logs/deep/made'\n"),
                           Notice("'/logs/folder', '/logs/deep/made', 'new.bundle'\n"),
                           Error("Destination directory /logs/deep/made/new.bundle is not within "
                                 "the allowed directories\n")}));
}

TEST_F(MoveDirectory, SaysThatItCouldNotMakeTheDirectoryByANotice) {
    EXPECT_EQ(call("/logs/folder", "/logs/file/below", "x"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(sim::SystemLogLines(),
              (SystemLines{Notice("'/logs/folder', '/logs/file/below'\n"),
                           Notice("Failed to create CarrierBundles Dir  to /logs/file/below. "
                                  "Error: 20\n")}));
    EXPECT_TRUE(sim::UnifiedLog().empty()) << "the path is not judged any more";
}

TEST_F(MoveDirectory, SaysThatItCouldNotMove) {
    EXPECT_EQ(call("/nowhere", kBundles, "x"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(sim::SystemLogLines().back(),
              Error("Failed to move the directory /nowhere to " + std::string(kBundles) +
                    ". Error: -1\n"));
}

TEST_F(MoveDirectory, DoesNotReplaceWhatIsThere) {
    sim::MakeDirectory(kBundles);
    sim::MakeFile(bundle("file"), {.mode = sim::kRegular, .contents = "old"});
    EXPECT_EQ(call("/logs/folder", kBundles, "file"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(contentsAt(bundle("file")), "old");
    EXPECT_EQ(sim::SystemLogLines().back(),
              Error("Failed to move the directory /logs/folder to " + std::string(kBundles) +
                    ". Error: 17\n"));
    EXPECT_EQ(sim::FileAt("/logs/folder")->owner, 0U) << "given away before the move";
}

TEST_F(MoveDirectory, TakesAFileForTheDestinationDirectoryThatExists) {
    EXPECT_EQ(call("/logs/folder", "/logs/file", "x"), 0);
    EXPECT_EQ(sim::SystemLogLines().back(),
              Error("Destination directory /logs/file/x is not within the allowed directories\n"))
        << "it exists, so it is not made";
}

TEST_F(MoveDirectory, CutsTheLastByteOfFullFields) {
    const std::string full(256, 'a');
    EXPECT_EQ(call(full, "/logs", full), 0);
    const std::string cut = full.substr(1);
    EXPECT_EQ(sim::SystemLogLines()[1], Notice("'" + cut + "', '/logs', '" + cut + "'\n"));
    EXPECT_EQ(call("/logs", full, "x"), 0);
    EXPECT_EQ(sim::SystemLogLines()[3], Notice("'/logs', '" + cut + "'\n"));
}

TEST_F(MoveDirectory, TellsTheTruthAtEveryFailure) {
    ExpectTrueFlagAtEveryFailure(
        makePhone,
        [this] { return call("/logs/folder", kBundles, "new.bundle"); },
        isDone,
        [] { return contentsAt(bundle("new.bundle/inner")) == "in"; });
}

}  // namespace
