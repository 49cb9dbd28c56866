// Routine 22 through the real daemon: archives that strangers made, sources of every kind, and an
// attacker who swaps folders meanwhile.
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>

#include "tests/attack/Attacker.h"
#include "tests/attack/Canary.h"
#include "tests/files/RoutineClient.h"
#include "tests/support/HostileArchives.h"
#include "tests/support/ZipWriter.h"

namespace fs = std::filesystem;

namespace files {
namespace {

const std::string kPlace = "/private/archives";
const std::string kSource = kPlace + "/source";
const std::string kDestination = kPlace + "/destination";
const std::string kFatalLine = "3 3 MIRCopier signaled fatal file error";
constexpr const char* kModule = "/usr/lib/linefold/libLinefoldArchive.so";

bool IsCall(const std::string& line) {
    return line.starts_with("left out ") || line.starts_with("fatal ");
}

class CopyArchive : public testing::Test {
protected:
    CopyArchive() {
        phone::ResetMobileHome();
        fs::remove_all(kPlace);
        fs::create_directories(kPlace);
    }

    [[nodiscard]] bool copy(const std::string& source = kSource,
                            const std::string& destination = kDestination) const {
        const auto reply = client_.privatePort.call(Request(kCopyArchive, {source, destination}));
        const bool isDone = reply.bytes == FlagReply(kCopyArchive, true);
        EXPECT_TRUE(isDone || reply.bytes == FlagReply(kCopyArchive, false));
        return isDone;
    }

    [[nodiscard]] bool expand(const std::string& archive) const {
        Write(kSource, archive);
        return copy();
    }

    /// Peak of the daemon's memory so far, in MiB.
    [[nodiscard]] std::size_t peakMemory() const {
        std::ifstream status("/proc/" + std::to_string(daemon_.pid()) + "/status");
        std::size_t kib = 0;
        for (std::string word; status >> word;) {
            if (word == "VmHWM:") {
                status >> kib;
            }
        }
        EXPECT_GT(kib, 0U);
        return kib >> 10;
    }

    phone::Daemon daemon_;
    phone::Client client_ = phone::Client::checkIn();
    phone::LogReader journal_ = phone::LogReader::journal();
    phone::LogReader systemLog_ = phone::LogReader::systemLog();
};

TEST_F(CopyArchive, ExpandsACarrierArchive) {
    EXPECT_TRUE(expand(zip::Write({zip::Folder("Example.bundle/"),
                                   zip::File("Example.bundle/Info.plist", "<plist/>"),
                                   zip::Link("Example.bundle/link", "Info.plist")})));
    EXPECT_EQ(zip::Listing(kDestination),
              (Lines{"d 0755 Example.bundle ",
                     "f 0644 Example.bundle/Info.plist <plist/>",
                     "l 0777 Example.bundle/link Info.plist"}));
    EXPECT_EQ(systemLog_.take(), Lines());
    EXPECT_EQ(journal_.take(), Lines());
}

TEST_F(CopyArchive, TellsInTheLogWhatItLeftOutAndWhy) {
    EXPECT_TRUE(expand(zip::Write({zip::File("../evil", "x"), zip::File("good", "x")})));
    EXPECT_EQ(journal_.take(),
              Lines{"3 platform archive copier: ../evil of " + kSource +
                    " left out: the name leads upwards"});
    EXPECT_EQ(systemLog_.take(), Lines());
    EXPECT_FALSE(expand("PK\3\4 and so on"));
    EXPECT_EQ(journal_.take(),
              Lines{"3 platform archive copier: " + kSource + ": Unrecognized archive format"});
    EXPECT_EQ(systemLog_.take(), Lines{kFatalLine});
}

TEST_F(CopyArchive, DoesNotLetAnArchiveFillTheLog) {
    EXPECT_TRUE(expand(zip::Write(std::vector(1'000, zip::File("../evil\n", "x")))));
    const Lines lines = journal_.take();
    ASSERT_EQ(lines.size(), 17U);
    EXPECT_EQ(lines.back(),
              "3 platform archive copier: 984 more files of " + kSource + " left out");
}

TEST_F(CopyArchive, IsNotHurtByHostileArchives) {
    attack::MakeCanary();
    const auto before = attack::Snapshot::take();
    for (const zip::HostileArchive& archive : zip::HostileArchives()) {
        SCOPED_TRACE(archive.name);
        fs::remove_all(kDestination);
        const auto firstCall = std::ranges::find_if(archive.outcome, IsCall);
        const bool isFatal =
            !archive.outcome.empty() && archive.outcome.back().starts_with("fatal ");
        EXPECT_EQ(expand(archive.bytes), !isFatal);
        EXPECT_EQ(zip::Listing(kDestination), Lines(archive.outcome.begin(), firstCall));
        EXPECT_EQ(systemLog_.take(), isFatal ? Lines{kFatalLine} : Lines());
        const Lines told = journal_.take();
        EXPECT_EQ(told.size(), static_cast<std::size_t>(archive.outcome.end() - firstCall));
    }
    EXPECT_EQ(before.differencesTo(attack::Snapshot::take()), Lines());
    EXPECT_LT(peakMemory(), 16U);
}

std::vector<zip::Entry> Folders(std::size_t count) {
    std::vector<zip::Entry> entries;
    for (std::size_t i = 0; i < count; ++i) {
        entries.push_back(zip::Folder(std::to_string(i)));
    }
    return entries;
}

std::ptrdiff_t ItemsIn(const std::string& folder) {
    return std::distance(fs::directory_iterator(folder), fs::directory_iterator());
}

TEST_F(CopyArchive, Takes100000Entries) {
    EXPECT_TRUE(expand(zip::Write(Folders(100'000))));
    EXPECT_EQ(ItemsIn(kDestination), 100'000);
    EXPECT_LT(peakMemory(), 64U);
}

TEST_F(CopyArchive, EndsAtTheFirstEntryBeyondThat) {
    EXPECT_FALSE(expand(zip::Write(Folders(100'001))));
    EXPECT_EQ(ItemsIn(kDestination), 100'000) << "what was expanded stays";
    EXPECT_EQ(systemLog_.take(), Lines{kFatalLine});
    EXPECT_EQ(journal_.take(),
              Lines{"3 platform archive copier: " + kSource + ": more than 100,000 entries"});
}

TEST_F(CopyArchive, CountsTheFoldersThatNamesImply) {
    std::string deep;
    for (int depth = 0; depth < 63; ++depth) {
        deep += "/d";
    }
    std::vector<zip::Entry> entries = Folders(1'700);
    for (zip::Entry& entry : entries) {
        entry.name += deep;
    }
    EXPECT_FALSE(expand(zip::Write(std::move(entries))));
    EXPECT_EQ(ItemsIn(kDestination), 1'563) << "100,000 folders, 64 for each name";
}

TEST_F(CopyArchive, RefusesADirectoryThatMemoryWouldNotHold) {
    constexpr std::size_t kHeaderSize = 31;
    constexpr std::size_t kRecordSize = 47;
    const std::string record = zip::Write(Folders(1)).substr(kHeaderSize, kRecordSize);
    zip::Archive archive{.entries = Folders(1)};
    for (int i = 0; i < 1'000'000; ++i) {
        archive.locator += record;
    }
    archive.directorySize = static_cast<std::uint32_t>(archive.locator.size() + kRecordSize);
    EXPECT_FALSE(expand(zip::Write(archive)));
    EXPECT_LT(peakMemory(), 64U);
    EXPECT_EQ(systemLog_.take(), Lines{kFatalLine});
}

TEST_F(CopyArchive, TakesSourcesOfEveryKind) {
    fs::create_directories(kPlace + "/tree/folder");
    Write(kPlace + "/tree/folder/file", "x");
    ASSERT_EQ(mkfifo((kPlace + "/tree/fifo").c_str(), 0666), 0);
    EXPECT_TRUE(copy(kPlace + "/tree"));
    EXPECT_EQ(zip::Listing(kDestination), (Lines{"d 0755 folder ", "f 0644 folder/file x"}));
    EXPECT_TRUE(copy(kPlace + "/tree/folder/file"));
    EXPECT_EQ(Read(kDestination + "/file"), "x");
    EXPECT_TRUE(copy(kPlace + "/tree/folder/file", kPlace + "/caf\xE9"));
    EXPECT_EQ(Read(kPlace + "/caf\xE9"), "x");
    EXPECT_EQ(systemLog_.take(), Lines());
    for (const char* source :
         {"/private/archives/tree/fifo", "/dev/zero", "/dev/log", "/nowhere", ""}) {
        EXPECT_FALSE(copy(source)) << source;
        EXPECT_EQ(systemLog_.take(), Lines{kFatalLine}) << source;
    }
}

TEST_F(CopyArchive, TakesAllBytesOfItsFields) {
    const std::string start = kPlace + "/" + std::string(200, 'd');
    const std::string source = start + "/" + std::string(255 - start.size(), 's');
    ASSERT_EQ(source.size(), 256U);
    fs::create_directories(start);
    Write(source, "x");
    EXPECT_TRUE(copy(source));
    EXPECT_EQ(Read(kDestination), "x");
}

TEST_F(CopyArchive, EndsWhenTheDiskIsFull) {
    fs::create_directories(kDestination);
    ASSERT_EQ(mount("full", kDestination.c_str(), "tmpfs", 0, "size=64k"), 0);
    EXPECT_FALSE(expand(zip::Write({zip::File("small", "x"),
                                    zip::File("large", std::string(100'000, 'x')),
                                    zip::File("next", "x")})));
    EXPECT_EQ(zip::Listing(kDestination), Lines{"f 0644 small x"}) << "what was expanded stays";
    EXPECT_EQ(systemLog_.take(), Lines{kFatalLine});
    fs::create_directories(kPlace + "/tree/folder");
    Write(kPlace + "/tree/folder/large", std::string(100'000, 'x'));
    EXPECT_FALSE(copy(kPlace + "/tree"));
    EXPECT_EQ(zip::Listing(kDestination), Lines{"f 0644 small x"});
    EXPECT_EQ(umount(kDestination.c_str()), 0);
}

TEST_F(CopyArchive, IsNotDoneWithoutItsModule) {
    const std::string aside = kPlace + "/module";
    const std::string module = Read(kModule);
    ASSERT_FALSE(module.empty());
    fs::remove(kModule);
    EXPECT_FALSE(expand(zip::Write({zip::File("a", "x")})));
    Write(kModule, module);
    EXPECT_FALSE(fs::exists(kDestination));
    EXPECT_EQ(systemLog_.take(), Lines());
    EXPECT_EQ(journal_.take(), Lines());
}

// ---- Under attack ------------------------------------------------------------------------------

/// An archive with the names of what the attacker swaps.
std::string ArchiveOfSwappedNames() {
    std::vector<zip::Entry> entries;
    for (const std::string folder :
         {"", "a/", "a/b/", "Preferences/", "empty/", "link/", "full/"}) {
        for (const char* name :
             {"file", "link", "fresh", "inner/file", "com.vendra.carrier.plist"}) {
            entries.push_back(zip::File(folder + name, "from the archive", 0777));
        }
        entries.push_back(zip::Link(folder + "Carrier Bundle.bundle", "file"));
        entries.push_back(zip::Folder(folder + "empty/"));
    }
    return zip::Write(std::move(entries));
}

/// The secrets of the canary have names that nobody else's things have.
constexpr const char* kSecret = "secret of the canary";

void AddSecrets() {
    for (const char* folder : {"/open", "/secret", "/open/a", "/open/Preferences"}) {
        Write(attack::kCanary + std::string(folder) + "/" + kSecret, kSecret);
    }
}

TEST(CopyArchiveUnderAttack, LeavesWhatIsNotTheMobileUsersAsItIs) {
    constexpr int kCopies = 600;
    fs::remove_all(kPlace);
    fs::create_directories(kPlace);
    Write(kSource, ArchiveOfSwappedNames());
    const attack::Attacker attacker;
    AddSecrets();
    const auto before = attack::Snapshot::take();
    const phone::Daemon daemon;
    const auto client = phone::Client::checkIn();
    const std::string home = attack::kHome;
    const std::vector<std::string> places{
        home + "/Media", home + "/Media/a", home + "/Media/a/b", home + "/turn", home + "/Library"};
    int done = 0;
    for (int i = 0; i < kCopies; ++i) {
        const std::string& place = places[static_cast<std::size_t>(i) % places.size()];
        // In turns an archive and a tree into places that are swapped, and a tree out of them.
        const std::string source = i % 3 == 0 ? kSource : home + (i % 3 == 1 ? "/own" : "/Media/a");
        const std::string destination = i % 3 == 2 ? kPlace + "/out" : place;
        const auto reply = client.privatePort.call(Request(kCopyArchive, {source, destination}));
        done += reply.bytes == FlagReply(kCopyArchive, true) ? 1 : 0;
    }
    EXPECT_EQ(before.differencesTo(attack::Snapshot::take()), Lines());
    for (const Lines listing = zip::Listing(kPlace); const std::string& line : listing) {
        EXPECT_EQ(line.find(kSecret), std::string::npos) << line;
    }
    EXPECT_GT(done, kCopies / 5) << "it does not refuse everything";
    EXPECT_LT(done, kCopies) << "nor goes through unattacked";
    EXPECT_GT(attacker.swaps(), kCopies / 10);
}

}  // namespace
}  // namespace files
