// Routines 15, 16, 17 and 23 through the real daemon, on real files, with both logs read back.
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "platform/PropertyList.h"
#include "tests/files/RoutineClient.h"

namespace fs = std::filesystem;

namespace files {
namespace {

using platform::PropertyList;

const std::string kBundles = std::string(phone::kMobileLibrary) + "/Carrier Bundles";
const std::string kReports = "/var/mobile/Library/Logs/CrashReporter/";
/// On another file system than the phone's folders, and on theirs.
const std::string kElsewhere = "/tmp/files";
const std::string kNear = "/private/files";

struct stat StatusOf(const std::string& path) {
    struct stat status {};

    EXPECT_EQ(lstat(path.c_str(), &status), 0) << path;
    return status;
}

void MakeTree(const std::string& folder) {
    fs::create_directories(folder + "/deep/deeper");
    Write(folder + "/deep/deeper/file", "new");
    Write(folder + "/file", "new");
    fs::create_symlink("file", folder + "/link");
}

class FilePhone : public testing::Test {
protected:
    FilePhone() {
        phone::ResetMobileHome();
        fs::create_directories(kReports);
        for (const std::string& folder : {kElsewhere, kNear}) {
            fs::remove_all(folder);
            MakeTree(folder + "/tree");
            Write(folder + "/file", "new");
        }
    }

    phone::LogReader journal_ = phone::LogReader::journal();
    phone::LogReader systemLog_ = phone::LogReader::systemLog();
};

class FileRoutines : public FilePhone {
protected:
    /// The reply must be right to the byte.
    void expectDone(bool isDone,
                    std::int32_t id,
                    const std::vector<std::string_view>& texts) const {
        const auto reply = client_.privatePort.call(Request(id, texts));
        EXPECT_EQ(reply.bytes, FlagReply(id, isDone));
        EXPECT_FALSE(reply.descriptor.isOpen());
    }

    [[nodiscard]] phone::CopiedData load(std::string_view path) const {
        return phone::TakeCopiedData(client_.privatePort.call(Request(kLoadPlistFile, {path})));
    }

    void expectLogs(const Lines& systemLog, const Lines& journal) {
        EXPECT_EQ(systemLog_.take(), systemLog);
        EXPECT_EQ(journal_.take(), journal);
    }

    static Lines allowed(const std::string& path) {
        return {"6 - Allowing path " + path + " within " + kBundles};
    }

    static Lines refused(const std::string& path) {
        return {"3 - NOT Allowing path " + path + " as it isn't within the wild card directories:",
                "3 - /var/mobile/Library/Carrier Bundles/",
                "3 - " + kBundles};
    }

    phone::Daemon daemon_;
    phone::Client client_ = phone::Client::checkIn();
};

TEST_F(FileRoutines, CopyAFileAndGiveItToTheMobileUser) {
    const std::string made = kBundles + "/made";
    expectDone(true, kCopyFile, {kElsewhere, made, "file"});
    EXPECT_EQ(Read(made + "/file"), "new");
    EXPECT_EQ(StatusOf(made + "/file").st_uid, phone::kMobileUser);
    EXPECT_EQ(StatusOf(made + "/file").st_gid, phone::kMobileUser);
    EXPECT_EQ(StatusOf(made).st_mode, S_IFDIR | 0755U);
    EXPECT_EQ(StatusOf(made).st_uid, 0U);
    expectLogs({"5 3 '" + kElsewhere + "', '" + made + "', 'file'\\n"}, allowed(made + "/file"));
}

TEST_F(FileRoutines, RefuseToCopyElsewhereAndMakeNothing) {
    expectDone(false, kCopyFile, {kElsewhere, kNear + "/made", "file"});
    EXPECT_FALSE(fs::exists(kNear + "/made"));
    expectLogs({"5 3 '" + kElsewhere + "', '" + kNear + "/made', 'file'\\n",
                "3 3 Destination directory " + kNear +
                    "/made/file is not within the allowed directories\\n"},
               refused(kNear + "/made/file"));
}

TEST_F(FileRoutines, SayThatAFileCouldNotBeCopied) {
    expectDone(false, kCopyFile, {kElsewhere, kBundles, "missing"});
    expectLogs({"5 3 '" + kElsewhere + "', '" + kBundles + "', 'missing'\\n",
                "3 3 Failed to copy the file " + kElsewhere + " to " + kBundles + "\\n"},
               allowed(kBundles + "/missing"));
}

TEST_F(FileRoutines, CopyNoDirectoryOverAFile) {
    Write(kBundles + "/tree", "old");
    expectDone(false, kCopyFile, {kElsewhere, kBundles, "tree"});
    EXPECT_EQ(Read(kBundles + "/tree"), "old");
    EXPECT_EQ(StatusOf(kBundles + "/tree").st_uid, 0U);
    fs::remove_all(kReports);
    Write(kReports.substr(0, kReports.size() - 1), "old");
    (void)systemLog_.take();
    expectDone(false, kCopyLogDirectory, {kElsewhere + "/tree"});
    EXPECT_EQ(systemLog_.take().back(),
              "5 3 Failed to copy the directory " + kElsewhere + "/tree to " + kReports +
                  ". Error: 17\\n");
    EXPECT_EQ(Read(kReports.substr(0, kReports.size() - 1)), "old");
}

TEST_F(FileRoutines, GiveAwayALinkAndNotWhatItLeadsTo) {
    fs::create_symlink("/etc/passwd", kElsewhere + "/link");
    expectDone(true, kCopyFile, {kElsewhere, kBundles, "link"});
    EXPECT_EQ(StatusOf(kBundles + "/link").st_uid, phone::kMobileUser);
    EXPECT_EQ(StatusOf("/etc/passwd").st_uid, 0U);
}

/// A link of root's is one that leads the daemon, so none of the mobile user's may become one.
TEST_F(FileRoutines, GiveNoLinkOfTheMobileUserToRoot) {
    for (const std::string& from : {kNear, kElsewhere}) {
        fs::create_symlink("/etc", from + "/tree/deep/etc");
        for (const char* item : {"/tree/deep/etc", "/tree/link", "/tree/file"}) {
            ASSERT_EQ(lchown((from + item).c_str(), phone::kMobileUser, phone::kMobileUser), 0);
        }
        const std::string name = from == kNear ? "near" : "elsewhere";
        expectDone(true, kCopyLogDirectory, {from + "/tree"});
        expectDone(true, kCopyLogDirectory, {from + "/tree/link"});
        expectDone(true, kMoveDirectory, {from + "/tree", kBundles, name});
        for (const std::string& copy :
             {kReports + "tree/deep/etc", kReports + "link", kBundles + "/" + name + "/deep/etc"}) {
            EXPECT_EQ(StatusOf(copy).st_uid, phone::kMobileUser) << copy;
        }
        EXPECT_EQ(StatusOf(kBundles + "/" + name + "/deep").st_uid, 0U);
        fs::remove_all(kReports + "tree");
        fs::remove(kReports + "link");
    }
}

TEST_F(FileRoutines, CopyLogsIntoTheReportFolder) {
    expectDone(true, kCopyLogDirectory, {kElsewhere + "/tree"});
    EXPECT_EQ(Read(kReports + "tree/deep/deeper/file"), "new");
    EXPECT_EQ(fs::read_symlink(kReports + "tree/link"), "file");
    EXPECT_EQ(StatusOf(kReports + "tree/file").st_uid, 0U);
    expectLogs({"5 3 '" + kElsewhere + "/tree', '" + kReports + "'\\n"}, {});
}

TEST_F(FileRoutines, MergeLogsOfTheSameName) {
    fs::create_directories(kReports + "tree/deep");
    Write(kReports + "tree/deep/kept", "kept");
    Write(kReports + "tree/file", "old");
    expectDone(true, kCopyLogDirectory, {kElsewhere + "/tree"});
    EXPECT_EQ(Read(kReports + "tree/deep/kept"), "kept");
    EXPECT_EQ(Read(kReports + "tree/deep/deeper/file"), "new");
    EXPECT_EQ(Read(kReports + "tree/file"), "new");
    EXPECT_TRUE(fs::exists(kElsewhere + "/tree/file"));
}

TEST_F(FileRoutines, SayByANoticeThatLogsCouldNotBeCopied) {
    expectDone(false, kCopyLogDirectory, {"/nowhere"});
    expectLogs({"5 3 '/nowhere', '" + kReports + "'\\n",
                "5 3 Failed to copy the directory /nowhere to " + kReports + ". Error: -1\\n"},
               {});
}

TEST_F(FileRoutines, MoveADirectory) {
    for (const std::string& from : {kNear, kElsewhere}) {
        const std::string name = from == kNear ? "near" : "elsewhere";
        expectDone(true, kMoveDirectory, {from + "/tree", kBundles, name});
        EXPECT_EQ(Read(kBundles + "/" + name + "/deep/deeper/file"), "new");
        EXPECT_EQ(StatusOf(kBundles + "/" + name).st_uid, 0U);
        EXPECT_FALSE(fs::exists(from + "/tree"));
        const std::string start = "5 3 '" + from + "/tree', '" + kBundles + "'";
        expectLogs({start + "\\n", start + ", '" + name + "'\\n"}, allowed(kBundles + "/" + name));
    }
}

TEST_F(FileRoutines, MakeTheDirectoryOfAMoveThatIsRefused) {
    const std::string made = kNear + "/deep/made";
    expectDone(false, kMoveDirectory, {kElsewhere + "/tree", made, "x"});
    EXPECT_EQ(StatusOf(made).st_mode, S_IFDIR | 0755U);
    EXPECT_EQ(StatusOf(kNear + "/deep").st_mode, S_IFDIR | 0755U);
    EXPECT_TRUE(fs::is_empty(made));
    EXPECT_TRUE(fs::exists(kElsewhere + "/tree"));
    const std::string start = "5 3 '" + kElsewhere + "/tree', '" + made + "'";
    expectLogs(
        {start + "\\n",
         start + ", 'x'\\n",
         "3 3 Destination directory " + made + "/x is not within the allowed directories\\n"},
        refused(made + "/x"));
}

TEST_F(FileRoutines, SayThatTheDirectoryOfAMoveCouldNotBeMade) {
    const std::string below = kNear + "/file/below";
    expectDone(false, kMoveDirectory, {kElsewhere + "/tree", below, "x"});
    expectLogs({"5 3 '" + kElsewhere + "/tree', '" + below + "'\\n",
                "5 3 Failed to create CarrierBundles Dir  to " + below + ". Error: 20\\n"},
               {});
}

TEST_F(FileRoutines, DoNotMoveOverAFile) {
    Write(kBundles + "/x", "old");
    expectDone(false, kMoveDirectory, {kNear + "/tree", kBundles, "x"});
    EXPECT_EQ(Read(kBundles + "/x"), "old");
    EXPECT_EQ(Read(kNear + "/tree/file"), "new");
    EXPECT_EQ(
        systemLog_.take().back(),
        "3 3 Failed to move the directory " + kNear + "/tree to " + kBundles + ". Error: 17\\n");
}

TEST_F(FileRoutines, SurviveHostileSources) {
    fs::create_directories(kNear + "/hostile");
    const std::string hostile = kNear + "/hostile/";
    ASSERT_EQ(mkfifo((hostile + "fifo").c_str(), 0666), 0);
    ASSERT_EQ(mknod((hostile + "socket").c_str(), S_IFSOCK | 0666, 0), 0);
    fs::create_symlink("loop", hostile + "loop");
    fs::create_symlink("/dev/zero", hostile + "device");
    for (const char* name : {"fifo", "socket", "loop", "../../../dev/zero"}) {
        expectDone(false, kCopyFile, {hostile, kBundles + "/a/b/c", name});
        // Nobody is told what could not be put into a folder that is there.
        expectDone(name != std::string("loop"), kCopyLogDirectory, {hostile + name});
        EXPECT_EQ(load(hostile + name).code, 9);
    }
    EXPECT_EQ(load(hostile + "device").code, 9);
    EXPECT_EQ(load(hostile).code, 9);
    EXPECT_TRUE(fs::is_empty(kReports));
    expectDone(true, kCopyLogDirectory, {hostile});
    EXPECT_FALSE(fs::exists(kReports + "hostile/fifo")) << "left out";
    EXPECT_TRUE(fs::is_symlink(kReports + "hostile/loop"));
    EXPECT_TRUE(daemon_.isRunning());
}

TEST_F(FileRoutines, CopyNamesThatAreNotUtf8) {
    const std::string name = "caf\xE9 \x01";
    Write(kElsewhere + "/" + name, "new");
    expectDone(true, kCopyFile, {kElsewhere, kBundles, name});
    EXPECT_EQ(Read(kBundles + "/" + name), "new");
    expectLogs({"5 3 '" + kElsewhere + "', '" + kBundles + "', 'caf\\\\xe9 \\\\x01'\\n"},
               allowed(kBundles + "/caf\\\\xe9 \\\\x01"));
}

TEST_F(FileRoutines, TellThatTheDiskIsFull) {
    ASSERT_EQ(mount("full", kBundles.c_str(), "tmpfs", 0, "size=64k"), 0);
    Write(kElsewhere + "/tree/large", std::string(100'000, 'x'));
    Write(kElsewhere + "/large", std::string(100'000, 'x'));
    expectDone(false, kCopyFile, {kElsewhere, kBundles, "large"});
    expectDone(false, kMoveDirectory, {kElsewhere + "/tree", kBundles, "x"});
    EXPECT_TRUE(fs::is_empty(kBundles)) << "nothing half done";
    EXPECT_EQ(Read(kElsewhere + "/tree/file"), "new") << "the source is whole";
    EXPECT_EQ(systemLog_.take().back(),
              "3 3 Failed to move the directory " + kElsewhere + "/tree to " + kBundles +
                  ". Error: 28\\n");
    EXPECT_EQ(umount(kBundles.c_str()), 0);
}

TEST_F(FileRoutines, LoadADictionary) {
    const PropertyList list(PropertyList::Dictionary{{"key", PropertyList("Grüße <&>")},
                                                     {"a", PropertyList(std::int64_t{-1})}});
    const auto xml = PropertyListCreateXmlData(list).value();
    const auto binary = PropertyListCreateBinaryData(list).value();
    const std::string expected(reinterpret_cast<const char*>(xml.data()), xml.size());
    for (const auto& bytes : {xml, binary}) {
        Write(kNear + "/list", {reinterpret_cast<const char*>(bytes.data()), bytes.size()});
        const auto loaded = load(kNear + "/list");
        EXPECT_TRUE(loaded.isWellFormed);
        EXPECT_EQ(loaded.data, expected);
        expectLogs({}, {"6 - Loading " + kNear + "/list as plist"});
    }
}

TEST_F(FileRoutines, LoadDictionariesOfAnySize) {
    for (const std::size_t size : {65'000U, 66'000U, 15U << 20}) {
        const PropertyList list(
            PropertyList::Dictionary{{"key", PropertyList(std::string(size, 'x'))}});
        const auto xml = PropertyListCreateXmlData(list).value();
        const std::string expected(reinterpret_cast<const char*>(xml.data()), xml.size());
        Write(kNear + "/list", expected);
        const auto loaded = load(kNear + "/list");
        EXPECT_TRUE(loaded.isWellFormed && loaded.data == expected) << size;
        EXPECT_EQ(loaded.carriage == phone::Carriage::kMemoryFile, expected.size() > 65'536);
    }
}

TEST_F(FileRoutines, AnswerNineWithoutADictionary) {
    const std::string plist = "<plist version=\"1.0\">";
    for (const std::string& contents : {std::string(),
                                        std::string("junk"),
                                        plist + "<array><dict/></array></plist>",
                                        plist + "<dict>",
                                        std::string((16U << 20) + 1, ' ')}) {
        Write(kNear + "/list", contents);
        EXPECT_EQ(client_.privatePort.call(Request(kLoadPlistFile, {kNear + "/list"})).bytes, [] {
            auto reply = phone::Message(kLoadPlistFile + 100, 36);
            reply[28] = std::byte{1};
            reply[32] = std::byte{9};
            return reply;
        }());
        expectLogs({},
                   {"6 - Loading " + kNear + "/list as plist",
                    "3 - Could not create data representation of dictionary"});
    }
    EXPECT_EQ(load("/nowhere").code, 9);
}

TEST_F(FileRoutines, TakeFullFields) {
    const std::string full(256, 'a');
    expectDone(false, kCopyFile, {full, full, full});
    expectDone(false, kCopyLogDirectory, {full});
    const std::string cut = "'" + full.substr(1) + "'";
    const Lines lines = systemLog_.take();
    EXPECT_EQ(lines.at(0), "5 3 " + cut + ", " + cut + ", " + cut + "\\n");
    EXPECT_EQ(lines.at(2), "5 3 " + cut + ", '" + kReports + "'\\n");
    EXPECT_EQ(load(full).code, 9);
    EXPECT_EQ(journal_.take().at(3), "6 - Loading " + full + " as plist");
}

/// Daemons that meet another world than the usual one.
class FileRoutinesOf : public FilePhone {
protected:
    static phone::Bytes callOf(phone::Daemon::Options options, const phone::Bytes& request) {
        const phone::Daemon daemon(std::move(options));
        return phone::Client::checkIn().privatePort.call(request).bytes;
    }
};

TEST_F(FileRoutinesOf, ADaemonWhoseChownFailsLeaveTheCopy) {
    // The second one: the first gives the source to the service.
    const auto reply = callOf({.wrapper = {"/usr/bin/strace",
                                           "--quiet=attach,path-resolution",
                                           "-D",
                                           "-f",
                                           "-o",
                                           "/dev/null",
                                           "-e",
                                           "inject=fchownat:error=EPERM:when=2"}},
                              Request(kCopyFile, {kElsewhere, kBundles, "file"}));
    EXPECT_EQ(reply, FlagReply(kCopyFile, false));
    EXPECT_EQ(systemLog_.take(), Lines{"5 3 '" + kElsewhere + "', '" + kBundles + "', 'file'\\n"});
    EXPECT_EQ(Read(kBundles + "/file"), "new");
    EXPECT_EQ(StatusOf(kBundles + "/file").st_uid, 0U);
}

TEST_F(FileRoutinesOf, APhoneWhoseHomeEndsInASlashJoinThemByOne) {
    const std::string accounts = Read("/etc/passwd");
    std::string changed = accounts;
    changed.replace(changed.find(":/var/mobile:"), 13, ":/var/mobile//:");
    Write("/etc/passwd", changed);
    const auto reply = callOf({}, Request(kCopyLogDirectory, {kElsewhere + "/tree"}));
    Write("/etc/passwd", accounts);
    EXPECT_EQ(reply, FlagReply(kCopyLogDirectory, true));
    EXPECT_EQ(systemLog_.take(), Lines{"5 3 '" + kElsewhere + "/tree', '" + kReports + "'\\n"});
    EXPECT_TRUE(fs::exists(kReports + "tree/file"));
}

}  // namespace
}  // namespace files
