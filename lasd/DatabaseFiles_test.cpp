#include "lasd/DatabaseFiles.h"

#include "lasd/Updater_test.h"

using namespace updater_test;

namespace {

const std::string kUrl = kServer + "x.db.gz";
const std::string kFile = kFolder + "/x.db";
const std::string kTemporary = kFile + ".tmp";
constexpr std::uint32_t kMobile = 501;

class DatabaseFolder : public testing::Test {
protected:
    DatabaseFolder() { sim::Reset(); }
};

TEST_F(DatabaseFolder, IsMadeWhenItIsMissing) {
    EXPECT_TRUE(MakeDatabaseFolder());
    EXPECT_EQ(sim::FileAt(kFolder)->mode, sim::kDirectory | 0755U);
    EXPECT_EQ(sim::FileAt(kFolder)->owner, 0U);
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

TEST_F(DatabaseFolder, IsLeftAsItIs) {
    sim::MakeFile(kFolder, {.mode = sim::kDirectory | 0700, .owner = kMobile});
    EXPECT_TRUE(MakeDatabaseFolder());
    EXPECT_EQ(sim::FileAt(kFolder)->mode, sim::kDirectory | 0700U);
    EXPECT_EQ(sim::JournalCount("PathAccess.makeDirectory"), 0U);
}

TEST_F(DatabaseFolder, CannotBeMadeOverWhatIsNoFolder) {
    sim::MakeFile(kFolder, {.mode = sim::kRegular | 0644, .contents = "kept"});
    EXPECT_FALSE(MakeDatabaseFolder());
    EXPECT_EQ(
        sim::UnifiedLog(),
        std::vector{Error("Cannot create /var/mobile/Library/LASD errno set to File exists")});
    EXPECT_EQ(FileContents(kFolder), "kept");
}

TEST_F(DatabaseFolder, CannotBeMadeWhereItsLinkLeadsNowhere) {
    sim::MakeLink(kFolder, "missing", kMobile);
    EXPECT_FALSE(MakeDatabaseFolder());
    EXPECT_EQ(
        sim::UnifiedLog(),
        std::vector{Error("Cannot create /var/mobile/Library/LASD errno set to File exists")});
}

TEST_F(DatabaseFolder, TellsWhyItCannotBeMade) {
    sim::FailCall("PathAccess.makeDirectory", 1);
    EXPECT_FALSE(MakeDatabaseFolder());
    EXPECT_EQ(sim::UnifiedLog(),
              std::vector{
                  Error("Cannot create /var/mobile/Library/LASD errno set to Input/output error")});
}

TEST_F(DatabaseFolder, IsNotMadeWhenNobodyCanTellWhetherItIsThere) {
    sim::FailCall("PathAccess.stat", 1);
    EXPECT_TRUE(MakeDatabaseFolder());
    EXPECT_EQ(sim::JournalCount("PathAccess.makeDirectory"), 0U);
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

TEST_F(DatabaseFolder, MayBeALinkToWhatItsOwnerOwns) {
    sim::MakeDirectory("/var/mobile/Library/Elsewhere", kMobile);
    sim::MakeLink(kFolder, "Elsewhere", kMobile);
    EXPECT_TRUE(MakeDatabaseFolder());
    sim::MakeDirectory("/tmp/roots");
    sim::MakeLink(kFolder, "/tmp/roots", kMobile);
    EXPECT_TRUE(MakeDatabaseFolder()) << "the installation fails then";
}

TEST(DatabaseFileName, IsTheLastComponentUpToItsFirstGz) {
    const std::vector<std::pair<std::string, std::string>> names{
        {"https://h/x.db.gz", "x.db"},
        {"https://h/x.db", "x.db"},
        {"https://h/x.gz.old", "x"},
        {"https://h/x.gz.gz", "x"},
        {"https://h/x.gzip", "x"},
        {"https://h/x.GZ", "x.GZ"},
        {"https://h/xgz", "xgz"},
        {"https://h/a.gz/b.db", "b.db"},
        {"https://h/a/b/c", "c"},
        {"https://h/x.db.gz?v=2", "x.db"},
        {"https://h/x?v=2.gz", "x?v=2"},
        {"https://h/x?path=a/y.gz", "y"},
        {"https://h", "h"},
        {"https://h/%2e%2e%2fx.gz", "%2e%2e%2fx"},
        {"https://h/.gz", ""},
        {"https://h/", ""},
        {"https://h/.", "."},
        {"https://h/..", ".."},
        {"https://h/..gz", "."},
        {"https://h/...gz", ".."},
        {"/", ""},
        {"/x", "x"}};
    for (const auto& [url, name] : names) {
        EXPECT_EQ(DatabaseFileName(url), name) << url;
    }
}

TEST(DatabaseFileName, IsNoneWithoutASlash) {
    for (const char* url : {"", "x.db.gz", "."}) {
        EXPECT_EQ(DatabaseFileName(url), std::nullopt) << url;
    }
}

class DatabaseFile : public testing::Test {
protected:
    DatabaseFile() {
        sim::Reset();
        ServeDatabase(kUrl, "new");
        EXPECT_TRUE(fetched.fetch(kUrl, Networks::kWifiOnly));
        sim::MakeDirectory(kFolder);
        sim::ClearLogs();
        sim::ClearJournal();
    }

    static void makeOld() {
        sim::MakeFile(kFile, {.mode = sim::kRegular | 0600, .owner = kMobile, .contents = "old"});
    }

    /// The lines of an installation whose temporary file was written.
    static std::vector<sim::LogLine> linesBehind(std::vector<sim::LogLine> lines) {
        lines.insert(lines.begin(), Info("uncompressing to " + kTemporary));
        return lines;
    }

    HttpFetcher fetched;
};

TEST_F(DatabaseFile, IsWrittenBesideItsPlaceAndThenMoved) {
    EXPECT_TRUE(InstallDatabaseFile(fetched, "x.db"));
    EXPECT_EQ(FileContents(kFile), "new");
    EXPECT_FALSE(sim::FileAt(kTemporary));
    EXPECT_EQ(sim::UnifiedLog(), linesBehind({Info("Moving " + kTemporary + " to " + kFile)}));
    EXPECT_EQ(sim::FileAt(kFile)->mode, sim::kRegular | 0644U);
    EXPECT_EQ(sim::FileAt(kFile)->owner, 0U);
}

TEST_F(DatabaseFile, TakesThePlaceOfTheOldOne) {
    makeOld();
    EXPECT_TRUE(InstallDatabaseFile(fetched, "x.db"));
    EXPECT_EQ(FileContents(kFile), "new");
    EXPECT_EQ(sim::UnifiedLog(),
              linesBehind({Info("Removed old database " + kFile),
                           Info("Moving " + kTemporary + " to " + kFile)}));
}

TEST_F(DatabaseFile, IsOnTheDiskBeforeAnybodyIsTold) {
    EXPECT_TRUE(InstallDatabaseFile(fetched, "x.db"));
    EXPECT_TRUE(sim::JournalHasInOrder({"OutputFile.close " + kTemporary,
                                        "PathAccess.stat " + kFile,
                                        "PathAccess.moveOnto " + kTemporary + " -> " + kFile,
                                        "PathAccess.synchronize " + kFile}));
}

TEST_F(DatabaseFile, IsNotInstalledWhenItCannotBeWritten) {
    makeOld();
    sim::FailCall("OutputFile.open", 1);
    EXPECT_FALSE(InstallDatabaseFile(fetched, "x.db"));
    EXPECT_EQ(FileContents(kFile), "old");
    EXPECT_EQ(sim::UnifiedLog(),
              linesBehind({Error("Cannot open output file " + kTemporary + ": Too many open files"),
                           Error("Failed to commit the data to file for " + kTemporary)}));
}

TEST_F(DatabaseFile, StaysBesideAnOldOneThatCannotBeRemoved) {
    makeOld();
    sim::FailCall("PathAccess.remove", 1);
    EXPECT_FALSE(InstallDatabaseFile(fetched, "x.db"));
    EXPECT_EQ(FileContents(kFile), "old");
    EXPECT_EQ(FileContents(kTemporary), "new");
    EXPECT_EQ(sim::UnifiedLog(),
              linesBehind({Error("Failed to remove the previous download at location " + kFile)}));
}

TEST_F(DatabaseFile, DoesNotReplaceAFolderThatHoldsSomething) {
    sim::MakeDirectory(kFile);
    sim::MakeDirectory(kFile + "/inner");
    EXPECT_FALSE(InstallDatabaseFile(fetched, "x.db"));
    EXPECT_EQ(sim::UnifiedLog().back(),
              Error("Failed to remove the previous download at location " + kFile));
    EXPECT_TRUE(sim::FileAt(kFile + "/inner"));
}

TEST_F(DatabaseFile, ReplacesAFolderThatIsEmpty) {
    sim::MakeDirectory(kFile);
    EXPECT_TRUE(InstallDatabaseFile(fetched, "x.db"));
    EXPECT_EQ(FileContents(kFile), "new");
}

TEST_F(DatabaseFile, StaysBesideItsPlaceWhenItCannotBeMoved) {
    makeOld();
    sim::FailCall("PathAccess.moveOnto", 1);
    EXPECT_FALSE(InstallDatabaseFile(fetched, "x.db"));
    EXPECT_EQ(FileContents(kFile), "(no file)") << "the old one is gone by then";
    EXPECT_EQ(FileContents(kTemporary), "new");
    EXPECT_EQ(sim::UnifiedLog(),
              linesBehind({Info("Removed old database " + kFile),
                           Info("Moving " + kTemporary + " to " + kFile),
                           Error("Could not rename " + kTemporary + " to " + kFile +
                                 ": Input/output error")}));
}

TEST_F(DatabaseFile, IsNotInstalledBeforeTheDiskHasIt) {
    sim::FailCall("PathAccess.synchronize", 1);
    EXPECT_FALSE(InstallDatabaseFile(fetched, "x.db"));
    EXPECT_EQ(FileContents(kFile), "new") << "and stays: the next check installs it again";
}

TEST_F(DatabaseFile, IsTriedToBeMovedWhenNobodyCanTellWhetherAnOldOneIsThere) {
    makeOld();
    sim::FailCall("PathAccess.stat", 1);
    EXPECT_TRUE(InstallDatabaseFile(fetched, "x.db"));
    EXPECT_EQ(sim::JournalCount("PathAccess.remove"), 0U);
    EXPECT_EQ(FileContents(kFile), "new");
}

TEST_F(DatabaseFile, IsNotWrittenThroughALinkAtItsTemporaryName) {
    sim::MakeFile("/tmp/precious", {.mode = sim::kRegular | 0600, .contents = "kept"});
    sim::MakeLink(kTemporary, "/tmp/precious", kMobile);
    EXPECT_FALSE(InstallDatabaseFile(fetched, "x.db"));
    EXPECT_EQ(FileContents("/tmp/precious"), "kept");
    EXPECT_EQ(sim::UnifiedLog(),
              linesBehind({Error("Cannot open output file " + kTemporary +
                                 ": Too many levels of symbolic links"),
                           Error("Failed to commit the data to file for " + kTemporary)}));
}

TEST_F(DatabaseFile, TakesThePlaceOfALinkAndNotOfWhatItLeadsTo) {
    sim::MakeFile("/tmp/precious", {.mode = sim::kRegular | 0600, .contents = "kept"});
    for (const std::uint32_t owner : {0U, kMobile}) {
        for (const char* target : {"/tmp/precious", "missing", "x.db"}) {
            sim::MakeLink(kFile, target, owner);
            EXPECT_TRUE(InstallDatabaseFile(fetched, "x.db"));
            EXPECT_TRUE(sim::FileAt(kFile)->is(sim::kRegular));
            EXPECT_EQ(FileContents(kFile), "new");
            EXPECT_EQ(FileContents("/tmp/precious"), "kept");
        }
    }
}

TEST_F(DatabaseFile, IsNotWrittenBehindAFolderThatIsAStrangersLink) {
    sim::RemoveFile(kFolder);
    sim::MakeDirectory("/tmp/roots");
    sim::MakeLink(kFolder, "/tmp/roots", kMobile);
    EXPECT_FALSE(InstallDatabaseFile(fetched, "x.db"));
    EXPECT_EQ(sim::UnifiedLog().at(1),
              Error("Cannot open output file " + kTemporary + ": Operation not permitted"));
    EXPECT_FALSE(sim::FileAt("/tmp/roots/x.db.tmp"));
}

TEST_F(DatabaseFile, OfANameThatIsAFolderIsRefusedWhenTheFolderIsToBeRemoved) {
    for (const std::string name : {"", ".", ".."}) {
        sim::ClearLogs();
        const std::string path = kFolder + "/" + name;
        EXPECT_FALSE(InstallDatabaseFile(fetched, name));
        EXPECT_EQ(FileContents(kFolder + "/" + name + ".tmp"), "new");
        const std::vector expected{
            Info("uncompressing to " + path + ".tmp"),
            Error("Failed to remove the previous download at location " + path)};
        EXPECT_EQ(sim::UnifiedLog(), expected);
    }
    EXPECT_TRUE(sim::FileAt(kFolder)->is(sim::kDirectory));
}

TEST_F(DatabaseFile, OfANameThatIsTooLongIsNotWritten) {
    EXPECT_FALSE(InstallDatabaseFile(fetched, std::string(252, 'x')));
    EXPECT_TRUE(sim::UnifiedLog().at(1).text.ends_with("xxx.tmp: File name too long"));
    EXPECT_TRUE(InstallDatabaseFile(fetched, std::string(251, 'x')));
}

}  // namespace
