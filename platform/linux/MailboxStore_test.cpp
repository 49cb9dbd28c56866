// The voicemail store in its folder, which is root's own. Runs in a private phone root.
#include "platform/MailboxStore.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <thread>

#include "tests/support/PhoneRoot.h"

namespace fs = std::filesystem;

namespace {

using Lines = std::vector<std::string>;
using platform::MailboxStoreCopyToken;
using platform::MailboxStoreCopyTokenForKey;
using platform::MailboxStoreRemoveAllRecords;
using platform::MailboxStoreSetToken;
using platform::MailboxStoreSetTokenForKey;

const fs::path kFolder = "/private/var/db/linefold";
const fs::path kFile = kFolder / "voicemail.plist";
const fs::path kTemporary = kFolder / ".linefold-mobile-helper.tmp";
const fs::path kDamaged = kFolder / "voicemail.plist.damaged";
constexpr const char* kRefused =
    "3 platform voicemail: /private/var/db/linefold must be a folder of root's own, so nothing in "
    "it is used";

std::string Read(const fs::path& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

unsigned ModeOf(const fs::path& path) {
    struct stat status {};

    return lstat(path.c_str(), &status) == 0 ? status.st_mode & 07777U : 0;
}

/// The names in the folder.
std::vector<std::string> Names() {
    std::vector<std::string> names;
    for (const auto& entry : fs::directory_iterator(kFolder)) {
        names.push_back(entry.path().filename());
    }
    return names;
}

std::string Line(std::string_view text) {
    return "3 platform voicemail: " + kFile.string() + " " + std::string(text);
}

class MailboxStore : public testing::Test {
protected:
    MailboxStore() {
        fs::remove_all("/private/var/db");
        fs::create_directories("/private/var/db");
    }

    static void makeFolder(mode_t mode = 0700) {
        fs::create_directories(kFolder);
        ASSERT_EQ(chmod(kFolder.c_str(), mode), 0);
    }

    static void put(const std::string& contents) {
        makeFolder();
        std::ofstream(kFile, std::ios::binary) << contents;
    }

    phone::LogReader journal_ = phone::LogReader::journal();
};

TEST_F(MailboxStore, IsAFileOfRootsInAFolderOfRoots) {
    MailboxStoreSetToken("token");
    MailboxStoreSetTokenForKey("key", "other");
    EXPECT_EQ(ModeOf(kFolder), 0700U);
    EXPECT_EQ(ModeOf(kFile), 0600U);
    EXPECT_EQ(Names(), std::vector<std::string>{"voicemail.plist"});
    EXPECT_EQ(MailboxStoreCopyToken(), "token");
    EXPECT_EQ(MailboxStoreCopyTokenForKey("key"), "other");
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(MailboxStore, IsMadeWithTheFolderAboveIt) {
    fs::remove("/private/var/db");
    MailboxStoreSetToken("token");
    EXPECT_EQ(ModeOf("/private/var/db"), 0755U);
    EXPECT_EQ(MailboxStoreCopyToken(), "token");
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(MailboxStore, IsNotMadeToRememberNothing) {
    MailboxStoreSetToken(std::nullopt);
    MailboxStoreRemoveAllRecords(0);
    EXPECT_EQ(MailboxStoreCopyToken(), std::nullopt);
    EXPECT_EQ(MailboxStoreCopyTokenForKey("key"), std::nullopt);
    EXPECT_FALSE(fs::exists(kFolder));
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(MailboxStore, TellsAnEmptyTokenFromNone) {
    MailboxStoreSetToken("");
    MailboxStoreSetTokenForKey("", "");
    EXPECT_EQ(MailboxStoreCopyToken(), "");
    EXPECT_EQ(MailboxStoreCopyTokenForKey(""), "");
    MailboxStoreSetToken(std::nullopt);
    EXPECT_EQ(MailboxStoreCopyToken(), std::nullopt);
    EXPECT_EQ(MailboxStoreCopyTokenForKey(""), "");
}

TEST_F(MailboxStore, KeepsEveryText) {
    for (const std::string& text : {std::string("\x01\x1F\x7F"),
                                    std::string("<&>\"' \r\n\t"),
                                    std::string("\xEF\xBF\xBF \xF0\x9F\x93\xB1"),
                                    std::string(256, '\x01')}) {
        MailboxStoreSetToken(text);
        MailboxStoreSetTokenForKey(text, text);
        EXPECT_EQ(MailboxStoreCopyToken(), text);
        EXPECT_EQ(MailboxStoreCopyTokenForKey(text), text);
    }
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(MailboxStore, IsNotWrittenWhenNothingChanges) {
    MailboxStoreSetToken("token");
    MailboxStoreSetTokenForKey("key", "token");
    const auto written = fs::last_write_time(kFile);
    MailboxStoreSetToken("token");
    MailboxStoreSetTokenForKey("key", "token");
    EXPECT_EQ(fs::last_write_time(kFile), written);
}

TEST_F(MailboxStore, ForgetsTheRecordsAndKeepsTheToken) {
    MailboxStoreSetToken("token");
    MailboxStoreSetTokenForKey("a", "one");
    MailboxStoreSetTokenForKey("b", "two");
    MailboxStoreRemoveAllRecords(0);
    EXPECT_EQ(MailboxStoreCopyToken(), "token");
    EXPECT_EQ(MailboxStoreCopyTokenForKey("a"), std::nullopt);
    EXPECT_EQ(Read(kFile).find("one"), std::string::npos);
}

TEST_F(MailboxStore, ClosesAFileAndAFolderThatOthersCouldRead) {
    MailboxStoreSetToken("old");
    ASSERT_EQ(chmod(kFile.c_str(), 0666), 0);
    makeFolder(0755);
    MailboxStoreSetToken("new");
    EXPECT_EQ(ModeOf(kFile), 0600U);
    EXPECT_EQ(ModeOf(kFolder), 0700U);
    EXPECT_EQ(journal_.take(), Lines{});
}

TEST_F(MailboxStore, RefusesAFolderThatOthersCanWrite) {
    MailboxStoreSetToken("old");
    for (const mode_t mode : {0720U, 0702U, 0777U}) {
        makeFolder(mode);
        MailboxStoreSetToken("new");
        EXPECT_EQ(journal_.take(), Lines{kRefused});
        EXPECT_EQ(MailboxStoreCopyToken(), std::nullopt);
        EXPECT_EQ(journal_.take(), Lines{kRefused});
        EXPECT_NE(Read(kFile).find("old"), std::string::npos);
    }
}

TEST_F(MailboxStore, RefusesAFolderOfSomebodyElses) {
    MailboxStoreSetToken("old");
    ASSERT_EQ(chown(kFolder.c_str(), phone::kMobileUser, 0), 0);
    const std::string before = Read(kFile);
    MailboxStoreSetToken("new");
    MailboxStoreSetTokenForKey("key", "new");
    MailboxStoreRemoveAllRecords(0);
    EXPECT_EQ(MailboxStoreCopyToken(), std::nullopt);
    EXPECT_EQ(journal_.take(), Lines(4, kRefused));
    EXPECT_EQ(Read(kFile), before);
    EXPECT_EQ(ModeOf(kFolder), 0700U);
}

TEST_F(MailboxStore, RefusesWhatIsNoFolder) {
    fs::create_directories("/private/var/elsewhere");
    fs::create_directory_symlink("/private/var/elsewhere", kFolder);
    MailboxStoreSetToken("token");
    EXPECT_EQ(journal_.take(), Lines{kRefused});
    EXPECT_TRUE(fs::is_empty("/private/var/elsewhere"));
    fs::remove(kFolder);
    std::ofstream(kFolder) << "a file";
    MailboxStoreSetToken("token");
    EXPECT_EQ(journal_.take(), Lines{kRefused});
    EXPECT_EQ(Read(kFolder), "a file");
}

TEST_F(MailboxStore, KeepsADamagedFileBesideTheNewOne) {
    for (const std::string& damaged : {std::string("<plist><dict><key>Token"),
                                       std::string(),
                                       std::string("<plist><array/></plist>"),
                                       std::string("bplist00 and no more")}) {
        put(damaged);
        EXPECT_EQ(MailboxStoreCopyToken(), std::nullopt);
        MailboxStoreSetToken("token");
        const std::string line = Line("is damaged: it holds no property list with a dictionary");
        EXPECT_EQ(journal_.take(), Lines(2, line));
        EXPECT_EQ(Read(kDamaged), damaged);
        EXPECT_EQ(MailboxStoreCopyToken(), "token");
    }
}

TEST_F(MailboxStore, KeepsAFileOfSomethingElseBesideTheNewOne) {
    const std::string other = "<plist><dict><key>Token</key><true/></dict></plist>";
    put(other);
    MailboxStoreSetTokenForKey("key", "token");
    EXPECT_EQ(journal_.take(), Lines{Line("is damaged: it holds something other than tokens")});
    EXPECT_EQ(Read(kDamaged), other);
    EXPECT_EQ(MailboxStoreCopyTokenForKey("key"), "token");
    EXPECT_EQ(MailboxStoreCopyToken(), std::nullopt);
}

TEST_F(MailboxStore, ForgetsWhatADamagedFileHeld) {
    put("secret");
    MailboxStoreSetToken("token");
    std::ofstream(kTemporary) << "secret";
    MailboxStoreRemoveAllRecords(0);
    EXPECT_EQ(Names(), std::vector<std::string>{"voicemail.plist"});
    EXPECT_EQ(MailboxStoreCopyToken(), "token");
    put("secret");
    MailboxStoreRemoveAllRecords(0);
    EXPECT_EQ(Names(), std::vector<std::string>{"voicemail.plist"});
    EXPECT_EQ(Read(kFile).find("secret"), std::string::npos);
}

TEST_F(MailboxStore, LeavesWhatItCannotReadAlone) {
    makeFolder();
    ASSERT_EQ(mkfifo(kFile.c_str(), 0600), 0);
    MailboxStoreSetToken("token");
    EXPECT_EQ(MailboxStoreCopyToken(), std::nullopt);
    EXPECT_EQ(journal_.take(), Lines(2, Line("is not a regular file")));
    EXPECT_TRUE(fs::is_fifo(kFile));
    fs::remove(kFile);
    fs::create_directory(kFile);
    MailboxStoreSetTokenForKey("key", "token");
    MailboxStoreRemoveAllRecords(0);
    EXPECT_EQ(journal_.take(), Lines(2, Line("is not a regular file")));
    EXPECT_TRUE(fs::is_directory(kFile));
}

TEST_F(MailboxStore, LeavesAFileThatIsTooLargeAlone) {
    put("");
    fs::resize_file(kFile, (16U << 20) + 1);
    MailboxStoreSetToken("token");
    EXPECT_EQ(MailboxStoreCopyToken(), std::nullopt);
    EXPECT_EQ(journal_.take(), Lines(2, Line("cannot be read: File too large")));
    EXPECT_EQ(fs::file_size(kFile), (16U << 20) + 1);
}

TEST_F(MailboxStore, FollowsNoLink) {
    makeFolder();
    std::ofstream("/private/var/elsewhere.plist")
        << "<plist><dict><key>Token</key><string>planted</string></dict></plist>";
    fs::create_symlink("/private/var/elsewhere.plist", kFile);
    EXPECT_EQ(MailboxStoreCopyToken(), std::nullopt);
    MailboxStoreSetToken("token");
    EXPECT_EQ(journal_.take(), Lines(2, Line("is not a regular file")));
    EXPECT_TRUE(fs::is_symlink(kFile));
    fs::remove("/private/var/elsewhere.plist");
    MailboxStoreSetToken("token");
    EXPECT_FALSE(fs::exists("/private/var/elsewhere.plist"));
}

TEST_F(MailboxStore, WritesThroughNothingThatLiesInTheWay) {
    makeFolder();
    std::ofstream("/private/var/victim") << "kept";
    fs::create_symlink("/private/var/victim", kTemporary);
    MailboxStoreSetToken("token");
    EXPECT_EQ(Read("/private/var/victim"), "kept");
    EXPECT_EQ(Names(), std::vector<std::string>{"voicemail.plist"});
    fs::create_directory(kTemporary);
    MailboxStoreSetToken("another");
    EXPECT_EQ(journal_.take(), Lines{Line("cannot be written: File exists")});
    EXPECT_EQ(MailboxStoreCopyToken(), "token");
}

TEST_F(MailboxStore, TakesSoManyKeysAndNoMore) {
    std::string store = "<plist><dict><key>Records</key><array>";
    for (std::size_t i = 0; i + 1 < platform::kMostMailboxRecords; ++i) {
        store += "<dict><key>Key</key><string>" + std::to_string(i) +
                 "</string><key>Token</key><string>t</string></dict>";
    }
    put(store + "</array></dict></plist>");
    MailboxStoreSetTokenForKey("last", "one");
    MailboxStoreSetTokenForKey("too many", "two");
    EXPECT_EQ(journal_.take(), Lines{Line("is full, so the token of one more key is not stored")});
    MailboxStoreSetTokenForKey("0", "changed");
    EXPECT_EQ(MailboxStoreCopyTokenForKey("last"), "one");
    EXPECT_EQ(MailboxStoreCopyTokenForKey("too many"), std::nullopt);
    EXPECT_EQ(MailboxStoreCopyTokenForKey("0"), "changed");
}

TEST_F(MailboxStore, LosesNoTokenOfFourThreads) {
    {
        std::vector<std::jthread> threads;
        for (int thread = 0; thread < 4; ++thread) {
            threads.emplace_back([thread] {
                for (int i = 0; i < 10; ++i) {
                    MailboxStoreSetTokenForKey(std::to_string(thread * 10 + i), "token");
                }
            });
        }
    }
    for (int i = 0; i < 40; ++i) {
        EXPECT_EQ(MailboxStoreCopyTokenForKey(std::to_string(i)), "token") << i;
    }
}

}  // namespace
