#include "platform/MIRCopier.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <filesystem>
#include <fstream>

#include "tests/support/HostileArchives.h"
#include "tests/support/ZipWriter.h"

namespace fs = std::filesystem;

namespace platform {
namespace {

using Lines = std::vector<std::string>;

const std::string kPlace = "/private/copier";
const std::string kSource = kPlace + "/source.zip";
const std::string kDestination = kPlace + "/destination";

const PropertyList kAllOptions(PropertyList::Dictionary{
    {kMIRCopierExtractPKZip, PropertyList(true)},
    {kMIRCopierCopyExtendedAttributes, PropertyList(true)},
    {kMIRCopierCopyResources, PropertyList(true)}});

/// What the handlers of this test were told, and what they answer.
Lines calls;
int answer = kMIRCopierSkipFile;

int FileError(MIRCopier* /*copier*/, const char* path, int error) {
    calls.push_back("left out " + std::to_string(error) + " " + path);
    return answer;
}

void FatalError(MIRCopier* /*copier*/, const char* /*path*/, int error) {
    calls.push_back("fatal " + std::to_string(error));
}

void WriteFile(const std::string& path, const std::string& contents) {
    std::ofstream(path, std::ios::binary) << contents;
}

std::string Read(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

class ArchiveCopier : public testing::Test {
protected:
    ArchiveCopier() {
        fs::remove_all(kPlace);
        fs::create_directories(kPlace);
        calls.clear();
        answer = kMIRCopierSkipFile;
        MIRCopierSetFileErrorHandler(copier_.get(), FileError);
        MIRCopierSetFatalFileErrorHandler(copier_.get(), FatalError);
    }

    int copy(const std::string& source = kSource, const std::string& destination = kDestination) {
        return MIRCopierCopyWithOptions(
            copier_.get(), source.c_str(), destination.c_str(), kAllOptions);
    }

    int expand(const std::string& archive) {
        WriteFile(kSource, archive);
        return copy();
    }

    const OwnedMIRCopier copier_{MIRCopierNew()};
};

TEST_F(ArchiveCopier, ExpandsAnArchiveIntoAFolderThatItMakes) {
    EXPECT_EQ(expand(zip::Write({zip::Folder("Example.bundle/"),
                                 zip::File("Example.bundle/Info.plist", "<plist/>"),
                                 zip::Zeros("Example.bundle/zeros", 3),
                                 zip::Link("Example.bundle/link", "Info.plist"),
                                 zip::File("made/on/the/way", "x", 0600)})),
              0);
    EXPECT_EQ(calls, Lines());
    EXPECT_EQ(zip::Listing(kDestination),
              (Lines{"d 0755 Example.bundle ",
                     "f 0644 Example.bundle/Info.plist <plist/>",
                     "l 0777 Example.bundle/link Info.plist",
                     "f 0644 Example.bundle/zeros " + std::string(3, '\0'),
                     "d 0755 made ",
                     "d 0755 made/on ",
                     "d 0755 made/on/the ",
                     "f 0600 made/on/the/way x"}));
}

TEST_F(ArchiveCopier, IsNotHurtByHostileArchives) {
    for (const zip::HostileArchive& archive : zip::HostileArchives()) {
        calls.clear();
        fs::remove_all(kDestination);
        const int result = expand(archive.bytes);
        Lines outcome = zip::Listing(kDestination);
        outcome.insert(outcome.end(), calls.begin(), calls.end());
        EXPECT_EQ(outcome, archive.outcome) << archive.name;
        const bool isFatal = !calls.empty() && calls.back().starts_with("fatal");
        EXPECT_EQ(result != 0, isFatal) << archive.name;
        EXPECT_EQ(zip::Listing(kPlace).size(), 2 + zip::Listing(kDestination).size())
            << archive.name;
    }
}

TEST_F(ArchiveCopier, LeavesWhatIsInTheDestinationButForFilesOfTheSameName) {
    fs::create_directories(kDestination + "/folder");
    WriteFile(kDestination + "/folder/kept", "kept");
    WriteFile(kDestination + "/replaced", "old");
    fs::permissions(kDestination + "/folder", fs::perms(0700));
    EXPECT_EQ(expand(zip::Write({zip::Folder("folder/"),
                                 zip::File("folder/new", "new"),
                                 zip::File("replaced", "new")})),
              0);
    EXPECT_EQ(zip::Listing(kDestination),
              (Lines{"d 0700 folder ",
                     "f 0644 folder/kept kept",
                     "f 0644 folder/new new",
                     "f 0644 replaced new"}));
}

TEST_F(ArchiveCopier, KeepsTheOldFileWhenTheNewOneIsDamaged) {
    fs::create_directories(kDestination);
    WriteFile(kDestination + "/file", "old");
    zip::Entry damaged = zip::File("file", "new");
    damaged.crc = 1;
    EXPECT_EQ(expand(zip::Write({damaged})), 0);
    EXPECT_EQ(zip::Listing(kDestination), Lines{"f 0644 file old"});
    EXPECT_EQ(calls, Lines{"left out 84 file"});
}

TEST_F(ArchiveCopier, GoesThroughNoLinkInTheDestination) {
    fs::create_directories(kDestination);
    fs::create_directories(kPlace + "/outside");
    fs::create_symlink("../outside", kDestination + "/link");
    WriteFile(kPlace + "/outside/file", "old");
    fs::create_symlink("../outside/file", kDestination + "/file");
    EXPECT_EQ(expand(zip::Write({zip::File("link/new", "evil"), zip::File("file", "new")})), 0);
    EXPECT_EQ(calls, Lines{"left out 20 link/new"});
    EXPECT_EQ(zip::Listing(kPlace + "/outside"), Lines{"f 0644 file old"});
    EXPECT_EQ(Read(kDestination + "/file"), "new");
    EXPECT_FALSE(fs::is_symlink(kDestination + "/file"));
}

/// A link of root's is one that leads us.
TEST_F(ArchiveCopier, GivesLinksOfAnArchiveToTheOwnerOfTheDestination) {
    fs::create_directories(kDestination);
    ASSERT_EQ(chown(kDestination.c_str(), 501, 501), 0);
    const std::string archive =
        zip::Write({zip::Link("a/link", "../b"), zip::File("b", "x"), zip::Link("link", "b")});
    for (int time = 0; time < 2; ++time) {
        EXPECT_EQ(expand(archive), 0);
        EXPECT_EQ(
            zip::Listing(kDestination),
            (Lines{
                "d 0755 a ", "l 0777 a/link ../b of 501", "f 0644 b x", "l 0777 link b of 501"}));
    }
}

TEST_F(ArchiveCopier, LeavesLinksThatItCopiesToTheirOwners) {
    fs::create_directories(kPlace + "/tree/folder");
    for (const char* link : {"/tree/folder/link", "/tree/link"}) {
        fs::create_symlink("/etc", kPlace + link);
        ASSERT_EQ(lchown((kPlace + link).c_str(), 501, 501), 0);
    }
    EXPECT_EQ(copy(kPlace + "/tree"), 0);
    EXPECT_EQ(
        zip::Listing(kDestination),
        (Lines{"d 0755 folder ", "l 0777 folder/link /etc of 501", "l 0777 link /etc of 501"}));
}

TEST_F(ArchiveCopier, KeepsTheTimesOfFiles) {
    ASSERT_EQ(expand(zip::Write({zip::File("file", "x")})), 0);
    const auto age = fs::file_time_type::clock::now() - fs::last_write_time(kDestination + "/file");
    EXPECT_GT(age, std::chrono::hours(24));
}

TEST_F(ArchiveCopier, StopsWhenTheHandlerDoesNotSkip) {
    answer = 0;
    EXPECT_EQ(
        expand(zip::Write({zip::File("a", "x"), zip::File("../b", "x"), zip::File("c", "x")})),
        EPERM);
    EXPECT_EQ(calls, Lines{"left out 1 ../b"});
    EXPECT_EQ(zip::Listing(kDestination), Lines{"f 0644 a x"});
}

TEST_F(ArchiveCopier, NeedsNoHandlers) {
    const OwnedMIRCopier bare(MIRCopierNew());
    WriteFile(kSource, zip::Write({zip::File("../b", "x")}));
    const auto copyBare = [&](const std::string& source) {
        return MIRCopierCopyWithOptions(
            bare.get(), source.c_str(), kDestination.c_str(), kAllOptions);
    };
    EXPECT_EQ(copyBare(kSource), EPERM);
    EXPECT_EQ(copyBare("/nowhere"), ENOENT);
}

TEST_F(ArchiveCopier, CopiesAnArchiveAsItIsWithoutTheOption) {
    const std::string bytes = zip::Write({zip::File("file", "x")});
    WriteFile(kSource, bytes);
    for (const bool isFalse : {true, false}) {
        const PropertyList options = isFalse ? PropertyList(PropertyList::Dictionary{
                                                   {kMIRCopierExtractPKZip, PropertyList(false)}})
                                             : PropertyList(PropertyList::Dictionary());
        EXPECT_EQ(
            MIRCopierCopyWithOptions(copier_.get(), kSource.c_str(), kDestination.c_str(), options),
            0);
        EXPECT_EQ(Read(kDestination), bytes);
    }
}

TEST_F(ArchiveCopier, CopiesAFileToThePathOrIntoTheFolder) {
    WriteFile(kPlace + "/file", "contents");
    ASSERT_EQ(setxattr((kPlace + "/file").c_str(), "user.kept", "value", 5, 0), 0);
    fs::create_directories(kDestination);
    for (const char* place : {"/destination", "/destination/", "/copy", "/destination/file"}) {
        EXPECT_EQ(copy(kPlace + "/file", kPlace + place), 0) << place;
    }
    EXPECT_EQ(zip::Listing(kDestination), Lines{"f 0644 file contents"});
    std::array<char, 8> value{};
    EXPECT_EQ(getxattr((kPlace + "/copy").c_str(), "user.kept", value.data(), value.size()), 5);
    EXPECT_EQ(calls, Lines());
}

TEST_F(ArchiveCopier, PutsAFileInPlaceOfAnotherOrOfALink) {
    WriteFile(kPlace + "/file", "new");
    WriteFile(kPlace + "/old", "old");
    fs::create_symlink("old", kPlace + "/link");
    for (const char* place : {"/link", "/old"}) {
        EXPECT_EQ(copy(kPlace + "/file", kPlace + place), 0);
        EXPECT_FALSE(fs::is_symlink(kPlace + place));
        EXPECT_EQ(Read(kPlace + place), "new");
    }
    EXPECT_EQ(zip::Listing(kPlace).size(), 3U);
}

/// A folder with what a copy keeps and what it leaves out.
void MakeTree(const std::string& folder) {
    fs::create_directories(folder + "/deep/deeper");
    WriteFile(folder + "/deep/deeper/file", "x");
    WriteFile(folder + "/archive.zip", "PK\3\4");
    WriteFile(folder + "/caf\xE9", "not UTF-8");
    fs::create_symlink("nowhere", folder + "/link");
    ASSERT_EQ(mkfifo((folder + "/deep/fifo").c_str(), 0666), 0);
    ASSERT_EQ(mkfifo((folder + "/fifo").c_str(), 0666), 0);
    fs::permissions(folder + "/deep/deeper/file", fs::perms(06755));
}

const Lines kCopyOfTree{"f 0644 archive.zip PK\3\4",
                        "f 0644 caf\xE9 not UTF-8",
                        "d 0755 deep ",
                        "d 0755 deep/deeper ",
                        "f 0755 deep/deeper/file x",
                        "l 0777 link nowhere"};

TEST_F(ArchiveCopier, CopiesWhatADirectoryContains) {
    MakeTree(kPlace + "/tree");
    fs::create_symlink("tree", kPlace + "/link");
    for (const char* source : {"/tree", "/tree/", "/link"}) {
        calls.clear();
        fs::remove_all(kDestination);
        EXPECT_EQ(copy(kPlace + source, kDestination + "/made"), 0);
        EXPECT_EQ(zip::Listing(kDestination + "/made"), kCopyOfTree);
        std::ranges::sort(calls);
        EXPECT_EQ(calls, (Lines{"left out 95 deep/fifo", "left out 95 fifo"}));
    }
}

TEST_F(ArchiveCopier, MergesADirectoryIntoAnother) {
    MakeTree(kPlace + "/tree");
    fs::create_directories(kDestination + "/deep/deeper");
    fs::create_directories(kDestination + "/archive.zip");
    WriteFile(kDestination + "/deep/deeper/file", "old");
    WriteFile(kDestination + "/deep/kept", "kept");
    fs::create_symlink("/etc/passwd", kDestination + "/link");
    EXPECT_EQ(copy(kPlace + "/tree"), 0);
    Lines expected = kCopyOfTree;
    expected[0] = "d 0755 archive.zip ";
    expected.insert(expected.end() - 1, "f 0644 deep/kept kept");
    EXPECT_EQ(zip::Listing(kDestination), expected);
    std::ranges::sort(calls);
    EXPECT_EQ(calls,
              (Lines{"left out 21 archive.zip", "left out 95 deep/fifo", "left out 95 fifo"}));
}

TEST_F(ArchiveCopier, StopsADirectoryWhenTheHandlerDoesNotSkip) {
    fs::create_directories(kPlace + "/tree/folder");
    ASSERT_EQ(mkfifo((kPlace + "/tree/folder/fifo").c_str(), 0666), 0);
    answer = 1;
    EXPECT_EQ(copy(kPlace + "/tree"), EOPNOTSUPP);
    EXPECT_EQ(calls, Lines{"left out 95 folder/fifo"});
    EXPECT_EQ(zip::Listing(kDestination), Lines()) << "nothing half done";
}

TEST_F(ArchiveCopier, DoesNotCopyTheCopyOfADirectoryIntoItself) {
    fs::create_directories(kPlace + "/tree/folder");
    WriteFile(kPlace + "/tree/file", "x");
    EXPECT_EQ(copy(kPlace + "/tree", kPlace + "/tree/folder"), 0);
    EXPECT_EQ(calls.size(), 1U) << "what the copy was while it grew";
    EXPECT_EQ(
        zip::Listing(kPlace + "/tree"),
        (Lines{
            "f 0644 file x", "d 0755 folder ", "f 0644 folder/file x", "d 0755 folder/folder "}));
}

TEST_F(ArchiveCopier, OpensNoSourceThatIsNeitherFileNorDirectory) {
    const std::string special = kPlace + "/special";
    for (const mode_t type : std::array<mode_t, 3>{S_IFIFO, S_IFSOCK, S_IFCHR}) {
        fs::remove(special);
        calls.clear();
        if (mknod(special.c_str(), type | 0666, makedev(1, 5)) != 0) {
            ASSERT_EQ(type, static_cast<mode_t>(S_IFCHR)) << "an ordinary user makes no devices";
            fs::create_symlink("/dev/zero", special);
        }
        const std::string source = type == S_IFCHR ? "/dev/zero" : special;
        EXPECT_EQ(copy(source), EOPNOTSUPP);
        EXPECT_EQ(calls, Lines{"fatal 95"});
    }
    EXPECT_FALSE(fs::exists(kDestination));
}

TEST_F(ArchiveCopier, NeedsASourceAndAPlace) {
    WriteFile(kPlace + "/file", "x");
    fs::create_directories(kPlace + "/tree");
    WriteFile(kSource, zip::Write({zip::File("a", "x")}));
    EXPECT_EQ(copy("/nowhere/source"), ENOENT);
    EXPECT_EQ(copy(""), ENOENT);
    EXPECT_EQ(copy(kPlace + "/file", kPlace + "/missing/file"), ENOENT);
    EXPECT_EQ(copy(kPlace + "/file", kPlace + "/missing/"), ENOENT);
    for (const std::string& source : {kSource, kPlace + "/tree"}) {
        EXPECT_EQ(copy(source, kPlace + "/file"), ENOTDIR);
        EXPECT_EQ(copy(source, kPlace + "/file/below"), ENOTDIR);
        EXPECT_EQ(copy(source, ""), ENOENT);
    }
    EXPECT_EQ(calls.size(), 10U);
    EXPECT_EQ(zip::Listing(kPlace).size(), 3U);
}

TEST_F(ArchiveCopier, FollowsNoLinkOfTheMobileUserToWhatIsNot) {
    fs::create_directories(kPlace + "/roots");
    fs::create_symlink(kPlace + "/roots", kPlace + "/link");
    ASSERT_EQ(lchown((kPlace + "/link").c_str(), 501, 501), 0);
    WriteFile(kSource, zip::Write({zip::File("a", "x")}));
    WriteFile(kPlace + "/file", "x");
    for (const std::string& source : {kSource, kPlace + "/file", kPlace + "/roots"}) {
        EXPECT_EQ(copy(source, kPlace + "/link"), EPERM) << source;
        EXPECT_EQ(copy(source, kPlace + "/link/below"), EPERM) << source;
    }
    EXPECT_EQ(copy(kPlace + "/link"), EPERM);
    EXPECT_EQ(zip::Listing(kPlace + "/roots"), Lines());
}

}  // namespace
}  // namespace platform
