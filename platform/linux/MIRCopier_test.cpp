#include "platform/MIRCopier.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
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

std::string LineOf(const std::string& path, const std::string& shown) {
    struct stat status {};

    EXPECT_EQ(lstat(path.c_str(), &status), 0);
    EXPECT_EQ(status.st_uid, 0U);
    constexpr const char* kTypes = "?pc?d?b?f?l?s???";
    std::array<char, 8> mode{};
    (void)std::snprintf(mode.data(), mode.size(), "%04o", status.st_mode & 07777U);
    std::string contents = S_ISREG(status.st_mode)   ? Read(path)
                           : S_ISLNK(status.st_mode) ? fs::read_symlink(path).string()
                                                     : "";
    return std::string(1, kTypes[status.st_mode >> 12]) + " " + mode.data() + " " + shown + " " +
           contents;
}

/// Everything below a folder, by path.
Lines TreeAt(const std::string& folder) {
    std::map<std::string, std::string> lines;
    for (const auto& entry : fs::recursive_directory_iterator(folder)) {
        const std::string shown = entry.path().string().substr(folder.size() + 1);
        lines[shown] = LineOf(entry.path(), shown);
    }
    Lines tree;
    for (auto& [path, line] : lines) {
        tree.push_back(std::move(line));
    }
    return tree;
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
    EXPECT_EQ(TreeAt(kDestination),
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
        Lines outcome = TreeAt(kDestination);
        outcome.insert(outcome.end(), calls.begin(), calls.end());
        EXPECT_EQ(outcome, archive.outcome) << archive.name;
        const bool isFatal = !calls.empty() && calls.back().starts_with("fatal");
        EXPECT_EQ(result != 0, isFatal) << archive.name;
        EXPECT_EQ(TreeAt(kPlace).size(), 2 + TreeAt(kDestination).size()) << archive.name;
    }
}

std::vector<zip::Entry> Folders(std::size_t count) {
    std::vector<zip::Entry> entries;
    for (std::size_t i = 0; i < count; ++i) {
        entries.push_back(zip::Folder(std::to_string(i)));
    }
    return entries;
}

std::size_t CountIn(const std::string& folder) {
    return static_cast<std::size_t>(
        std::distance(fs::directory_iterator(folder), fs::directory_iterator()));
}

TEST_F(ArchiveCopier, EndsAtTheFirstEntryBeyondThat) {
    EXPECT_EQ(expand(zip::Write(Folders(100'001))), EFBIG);
    EXPECT_EQ(calls, Lines{"fatal 27"});
    EXPECT_EQ(CountIn(kDestination), 100'000U) << "what was expanded stays";
}

TEST_F(ArchiveCopier, CountsTheFoldersThatNamesImply) {
    std::vector<zip::Entry> entries;
    for (int i = 0; i < 1'700; ++i) {
        std::string name = std::to_string(i);
        for (int depth = 0; depth < 63; ++depth) {
            name += "/d";
        }
        entries.push_back(zip::Folder(name));
    }
    EXPECT_EQ(expand(zip::Write(std::move(entries))), EFBIG);
    EXPECT_EQ(calls, Lines{"fatal 27"});
    EXPECT_EQ(CountIn(kDestination), 1'563U) << "100,000 folders, 64 for each name";
}

TEST_F(ArchiveCopier, RefusesADirectoryThatMemoryWouldNotHold) {
    const std::string record = zip::Write(Folders(1)).substr(31, 47);
    std::string records;
    for (int i = 0; i < 1'000'000; ++i) {
        records += record;
    }
    zip::Archive archive{.entries = Folders(1)};
    archive.locator = records;
    archive.directorySize = static_cast<std::uint32_t>(records.size() + record.size());
    EXPECT_EQ(expand(zip::Write(archive)), EFBIG);
    EXPECT_EQ(calls, Lines{"fatal 27"});
}

}  // namespace
}  // namespace platform
