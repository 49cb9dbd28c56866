// Routine 14 through the real daemon: a real index over HTTPS, real files, the notifications at the
// telephony daemon's port, and both logs read back.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>

#include "platform/hvu/Gzip_test.h"
#include "tests/http/PacketCapture.h"
#include "tests/http/RawServer.h"
#include "tests/updates/UpdateRig.h"
#include "tools/NamedPort.h"

namespace fs = std::filesystem;

namespace {

using namespace updates;
using Lines = std::vector<std::string>;
using phone::Bytes;

constexpr int kPatienceMs = 20'000;
const std::string kAddressOfWiFi = "198.51.100.1";

/// The server, and the telephony daemon's port, which a process can own once.
struct World {
    web::ConfigurationServer server;
    tools::NamedPort port = tools::NamedPort::own("com.vendra.Linefold.lasd").value();
};

World& TheWorld() {
    static World world;
    return world;
}

std::string Info(const std::string& text) {
    return "6 - " + text;
}

std::string Error(const std::string& text) {
    return "3 - " + text;
}

/// What a check logs up to the comparison of versions.
Lines Beginning(const std::string& mask, std::size_t indexSize) {
    return {Info("Trying to see if update available for mask " + mask),
            Info("Reading local resource com.vendra.lasd"),
            Info("Fetching URL " + kIndexUrl),
            Info("URL retrieved " + kIndexUrl + ", size: " + std::to_string(indexSize) + " ")};
}

void Append(Lines& lines, const Lines& more) {
    lines.insert(lines.end(), more.begin(), more.end());
}

std::string Differs(const std::string& type, const std::string& version) {
    return Info("We have don't have a previously downloaded " + type + " database, server has " +
                version + ", update required");
}

/// The fetch of a database, up to its end.
Lines Fetching(const std::string& url, std::string_view contents) {
    return {
        Info("Fetching URL " + url),
        Info("URL retrieved " + url + ", size: " + std::to_string(Gzip(contents).size()) + " ")};
}

Lines Installing(const std::string& file) {
    return {Info("uncompressing to " + file + ".tmp"), Info("Moving " + file + ".tmp to " + file)};
}

class DatabaseUpdates : public testing::Test {
protected:
    static void SetUpTestSuite() { ForgetOtherAuthorities(); }

    DatabaseUpdates() {
        phone::ResetMobileHome();
        fs::remove_all("/run/www");
        fs::create_directories("/run/www");
        (void)TheWorld().server.takeOutput();
    }

    /// The next notification, whose message and property list are as documented.
    static std::string hear() {
        const auto message = TheWorld().port.receive(kPatienceMs);
        if (!message) {
            return "(nothing)";
        }
        EXPECT_EQ(message->id, 0);
        EXPECT_EQ(Bytes(message->body.begin(), message->body.begin() + 8),
                  phone::BytesOf("bplist00"));
        return NameOf(message->body).value_or("(something else)");
    }

    static bool hearsNothing() { return !TheWorld().port.receive(0).has_value(); }

    std::string check(std::uint32_t mask) {
        EXPECT_TRUE(Ask(client, mask));
        return hear();
    }

    phone::Daemon daemon;
    phone::Client client = phone::Client::checkIn();
    phone::LogReader journal = phone::LogReader::journal();
    phone::LogReader systemLog = phone::LogReader::systemLog();
};

TEST_F(DatabaseUpdates, InstallWhatIsNewerWithGsmFirst) {
    const std::string gsm = PutDatabase("gsm.db.gz", "gsm 2");
    const std::string umts = PutDatabase("umts.db.gz", "umts 1");
    const auto size = PutIndex({{"umts", Entry("1", umts)}, {"gsm", Entry("2", gsm)}});
    ASSERT_TRUE(Ask(client, kGsm | kUmts));
    EXPECT_EQ(hear(), "UpdateAvailable gsm");
    EXPECT_EQ(hear(), "UpdateAvailable umts");
    Lines expected = Beginning("9", size);
    Append(expected, {Differs("umts", "1"), Differs("gsm", "2")});
    Append(expected, Fetching(gsm, "gsm 2"));
    Append(expected, Installing(kFolder + "/gsm.db"));
    Append(expected, {Info("Downloaded gsm database version 2 successfully")});
    Append(expected, Fetching(umts, "umts 1"));
    Append(expected, Installing(kFolder + "/umts.db"));
    Append(expected, {Info("Downloaded umts database version 1 successfully")});
    EXPECT_EQ(journal.take(), expected);
    EXPECT_EQ(systemLog.take(), Lines{});
    EXPECT_EQ(Contents(kFolder + "/gsm.db"), "gsm 2");
    EXPECT_EQ(Contents(kFolder + "/umts.db"), "umts 1");
    EXPECT_EQ(TheWorld().server.takeOutput(),
              "GET /1/v3/lasd.plist 200\n"
              "GET /databases/gsm.db.gz 200\n"
              "GET /databases/umts.db.gz 200\n");
}

TEST_F(DatabaseUpdates, LeaveFilesOfTheProcess) {
    PutIndex({{"gsm", Entry("2", PutDatabase("gsm.db.gz", "gsm 2"))}});
    EXPECT_EQ(check(kGsm), "UpdateAvailable gsm");

    struct stat status {};

    ASSERT_EQ(stat((kFolder + "/gsm.db").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode, mode_t{S_IFREG | 0644});
    EXPECT_EQ(status.st_uid + status.st_gid, 0U);
    ASSERT_EQ(stat(kFolder.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode, mode_t{S_IFDIR | 0755});
    EXPECT_EQ(std::distance(fs::directory_iterator(kFolder), {}), 1);
}

TEST_F(DatabaseUpdates, RecordTheWholeEntryBesideTheOthers) {
    const std::string url = PutDatabase("gsm.db.gz", "gsm 2");
    const PropertyList entry(Dictionary{
        {"Mirrors", PropertyList(PropertyList::Array{PropertyList("a"), PropertyList(true)})},
        {"ContentURL", PropertyList(url)},
        {"Size", PropertyList(std::int64_t{5})},
        {"Version", PropertyList("2")}});
    Record({{"lte", Entry("1", "x")}, {"gsm", Entry("1", "y")}});
    PutIndex({{"gsm", entry}});
    EXPECT_EQ(check(kGsm), "UpdateAvailable gsm");
    EXPECT_EQ(Recorded(), PropertyList(Dictionary{{"lte", Entry("1", "x")}, {"gsm", entry}}));
}

TEST_F(DatabaseUpdates, RequireNothingTheSecondTime) {
    const auto size = PutIndex({{"gsm", Entry("2", PutDatabase("gsm.db.gz", "gsm 2"))}});
    EXPECT_EQ(check(kGsm), "UpdateAvailable gsm");
    (void)journal.take();
    EXPECT_EQ(check(kGsm), "NoUpdateRequired");
    Lines expected = Beginning("8", size);
    Append(expected,
           {Info("gsm version 2 matches server version"),
            Error("No update required for any databases")});
    EXPECT_EQ(journal.take(), expected);
}

TEST_F(DatabaseUpdates, ReplaceAnOlderFile) {
    const std::string url = PutDatabase("gsm.db.gz", "gsm 2");
    const auto size = PutIndex({{"gsm", Entry("2", url)}});
    fs::create_directories(kFolder);
    std::ofstream(kFolder + "/gsm.db") << "gsm 1, which is longer";
    Record({{"gsm", Entry("1", "x")}});
    EXPECT_EQ(check(kGsm), "UpdateAvailable gsm");
    Lines expected = Beginning("8", size);
    const std::string file = kFolder + "/gsm.db";
    Append(expected, {Info("We have gsm version 1, server has 2, update required")});
    Append(expected, Fetching(url, "gsm 2"));
    Append(expected,
           {Info("uncompressing to " + file + ".tmp"),
            Info("Removed old database " + file),
            Info("Moving " + file + ".tmp to " + file),
            Info("Downloaded gsm database version 2 successfully")});
    EXPECT_EQ(journal.take(), expected);
    EXPECT_EQ(Contents(file), "gsm 2");
}

TEST_F(DatabaseUpdates, FailWithAnIndexThatIsNotThere) {
    EXPECT_EQ(check(kGsm), "UpdateFailed");
    const Lines expected{Info("Trying to see if update available for mask 8"),
                         Info("Reading local resource com.vendra.lasd"),
                         Info("Fetching URL " + kIndexUrl),
                         Error("HTTP request failed for URL " + kIndexUrl +
                               " with error no error errorcode 404 (not found)"),
                         Error("Could not fetch data from source " + kIndexUrl)};
    EXPECT_EQ(journal.take(), expected);
}

TEST_F(DatabaseUpdates, RequireNothingOfAnIndexThatIsNone) {
    web::ConfigurationServer::put("1/v3/lasd.plist", "<html>");
    EXPECT_EQ(check(0xFFFFFFFF), "NoUpdateRequired");
    Lines expected = Beginning("ffffffff", 6);
    Append(expected,
           {Error("Could not create version dictionary from downloaded plist!"),
            Error("No update required for any databases")});
    EXPECT_EQ(journal.take(), expected);
}

TEST_F(DatabaseUpdates, FailWithADatabaseThatIsDamaged) {
    const std::string url = kOrigin + "/databases/gsm.db.gz";
    std::string damaged = Gzip(std::string(100'000, 'x'));
    damaged[damaged.size() - 8] ^= 1;  // of the checksum
    web::ConfigurationServer::put("databases/gsm.db.gz", damaged);
    PutIndex({{"gsm", Entry("2", url)}});
    Record({{"gsm", Entry("1", "x")}});
    EXPECT_EQ(check(kGsm), "UpdateFailed");
    const auto lines = journal.take();
    const std::string temporary = kFolder + "/gsm.db.tmp";
    EXPECT_EQ(Lines(lines.end() - 3, lines.end()),
              (Lines{Info("uncompressing to " + temporary),
                     Error("Could not uncompress HTTP response to " + temporary + "!"),
                     Error("Failed to commit the data to file for " + temporary)}));
    EXPECT_TRUE(fs::is_empty(kFolder));
    EXPECT_EQ(Recorded(), PropertyList(Dictionary{{"gsm", Entry("1", "x")}}));
}

TEST_F(DatabaseUpdates, FailOneByOne) {
    const std::string missing = kOrigin + "/databases/missing.gz";
    PutIndex({{"gsm", Entry("2", missing)},
              {"cdma", PropertyList(Dictionary{{"Version", PropertyList("2")}})},
              {"lte", Entry("2", PutDatabase("lte.gz", "lte 2"))}});
    ASSERT_TRUE(Ask(client, 31));
    EXPECT_EQ(hear(), "UpdateFailed");
    EXPECT_EQ(hear(), "UpdateAvailable lte");
    const auto lines = journal.take();
    EXPECT_NE(std::ranges::find(lines,
                                Error("Cannot download file " + missing +
                                      ". Either Wifi is turned OFF or not Wifi attached")),
              lines.end());
    EXPECT_NE(std::ranges::find(lines, Error("URL for cdma database is empty")), lines.end());
    EXPECT_TRUE(hearsNothing());
}

/// A command line that has to succeed.
void Do(const std::string& command) {
    ASSERT_EQ(std::system(command.c_str()), 0) << command;
}

TEST_F(DatabaseUpdates, SendNothingOverTheCellularNetwork) {
    PutIndex({{"gsm", Entry("2", PutDatabase("gsm.db.gz", "gsm 2"))}});
    Do("ip route add " + kAddressOfWiFi + "/32 via 203.0.113.1 dev pdp_ip0");
    web::PacketCapture capture("gcell0");
    EXPECT_EQ(check(kGsm), "UpdateFailed");
    EXPECT_EQ(capture.tcpPackets(), 0U);
    auto lines = journal.take();
    std::erase_if(lines, [](const auto& line) { return line.starts_with("5 platform "); });
    EXPECT_EQ(Lines(lines.begin() + 3, lines.end()),
              (Lines{Error("HTTP request failed for URL " + kIndexUrl +
                           " with error cellular network forbidden errorcode 0 (no status)"),
                     Error("Could not fetch data from source " + kIndexUrl)}));
    Do("ip route del " + kAddressOfWiFi + "/32 via 203.0.113.1 dev pdp_ip0");
    EXPECT_EQ(check(kGsm), "UpdateAvailable gsm");
    EXPECT_EQ(capture.tcpPackets(), 0U);
}

// What the mobile user may put into its own folders.

TEST_F(DatabaseUpdates, AreLedNowhereByLinks) {
    fs::create_directories("/private/canary");
    std::ofstream("/private/canary/file") << "canary";
    PutIndex({{"gsm", Entry("2", PutDatabase("gsm.db.gz", "gsm 2"))}});
    fs::create_directories(kFolder);
    const std::string file = kFolder + "/gsm.db";
    for (const char* target : {"/private/canary/file", "/private/canary/new", "gsm.db.tmp"}) {
        fs::create_symlink(target, file + ".tmp");
        ASSERT_EQ(lchown((file + ".tmp").c_str(), phone::kMobileUser, phone::kMobileUser), 0);
        EXPECT_EQ(check(kGsm), "UpdateFailed") << target;
        EXPECT_EQ(journal.take().back(),
                  Error("Failed to commit the data to file for " + file + ".tmp"));
        fs::remove(file + ".tmp");
    }
    for (const char* target : {"/private/canary/file", "/private/canary/new", "gsm.db"}) {
        fs::remove(file);
        fs::create_symlink(target, file);
        ASSERT_EQ(lchown(file.c_str(), phone::kMobileUser, phone::kMobileUser), 0);
        fs::remove(std::string(phone::kMobileLibrary) + "/Preferences/com.vendra.lasd.plist");
        daemon.signal(SIGTERM);
        daemon.startAgain();
        client = phone::Client::checkIn();
        EXPECT_EQ(check(kGsm), "UpdateAvailable gsm") << target;
        EXPECT_FALSE(fs::is_symlink(file));
    }
    EXPECT_EQ(Contents("/private/canary/file"), "canary");
    EXPECT_EQ(std::distance(fs::directory_iterator("/private/canary"), {}), 1);
}

TEST_F(DatabaseUpdates, AreLedNowhereByALinkAtTheirFolder) {
    fs::create_directories("/private/roots");
    PutIndex({{"gsm", Entry("2", PutDatabase("gsm.db.gz", "gsm 2"))}});
    fs::create_symlink("/private/roots", kFolder);
    ASSERT_EQ(lchown(kFolder.c_str(), phone::kMobileUser, phone::kMobileUser), 0);
    EXPECT_EQ(check(kGsm), "UpdateFailed");
    EXPECT_TRUE(fs::is_empty("/private/roots"));
    fs::remove(kFolder);
    std::ofstream(kFolder) << "file";
    EXPECT_EQ(check(kGsm), "UpdateFailed");
    EXPECT_EQ(journal.take().back(),
              Error("Cannot create /var/mobile/Library/LASD errno set to File exists"));
}

TEST_F(DatabaseUpdates, OfUrlsThatEndInAFolderChangeNothingOutside) {
    const std::string library = phone::kMobileLibrary;
    for (const char* name : {"", ".gz", "..gz", "...gz"}) {
        web::RawServer server([](const web::RawConnection& asked) {
            const std::string body = Gzip("contents");
            (void)asked.send(
                "HTTP/1.1 200 OK\r\nContent-Type: application/gzip\r\nContent-Length: " +
                std::to_string(body.size()) + "\r\n\r\n" + body);
        });
        PutIndex({{"gsm", Entry("2", server.url("/folder/") + name)}});
        EXPECT_EQ(check(kGsm), "UpdateFailed") << name;
        EXPECT_TRUE(journal.take().back().starts_with(
            "3 - Failed to remove the previous download at location /var/mobile/Library/LASD/"));
    }
    EXPECT_EQ(std::distance(fs::directory_iterator(library), {}), 3);
    EXPECT_EQ(std::distance(fs::directory_iterator(kFolder), {}), 3);
}

// The life of the process.

/// A server on Wi-Fi whose database takes its time.
std::unique_ptr<web::RawServer> SlowServer(int milliseconds) {
    std::unique_ptr<web::RawServer> server;
    web::InGateway([&] {
        server = std::make_unique<web::RawServer>(
            [milliseconds](const web::RawConnection& asked) {
                asked.pause(milliseconds);
                const std::string body = Gzip("slow");
                (void)asked.send(
                    "HTTP/1.1 200 OK\r\nContent-Type: application/gzip\r\nContent-Length: " +
                    std::to_string(body.size()) + "\r\n\r\n" + body);
            },
            kAddressOfWiFi);
    });
    return server;
}

TEST_F(DatabaseUpdates, HoldTheProcessUntilTheyAreDone) {
    const auto server = SlowServer(1500);
    PutIndex({{"gsm", Entry("2", server->url("/slow.db.gz"))}});
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.waitForExit(), 0);
    phone::Daemon brisk({.program = phone::ProgramPath("LinefoldMobileHelper-brisk")});
    auto asking = phone::Client::checkIn();
    ASSERT_TRUE(Ask(asking, kGsm));
    asking.die();
    EXPECT_EQ(hear(), "UpdateAvailable gsm") << "longer than the idle interval";
    EXPECT_EQ(brisk.waitForExit(), 0);
}

TEST_F(DatabaseUpdates, EndWithAProcessThatIsAskedToEnd) {
    const auto server = SlowServer(20'000);
    PutIndex({{"gsm", Entry("2", server->url("/slow.db.gz"))}});
    ASSERT_TRUE(Ask(client, kGsm));
    ASSERT_TRUE(phone::Eventually([&] { return !server->requests().empty(); }));
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.waitForExit(), 0);
    EXPECT_TRUE(hearsNothing());
    EXPECT_EQ(Recorded(), PropertyList());
}

std::size_t MemoryOf(pid_t pid, const std::string& name) {
    std::ifstream status("/proc/" + std::to_string(pid) + "/status");
    for (std::string word; status >> word;) {
        std::size_t kib = 0;
        if (word == name && status >> kib) {
            return kib;
        }
    }
    return 0;
}

TEST_F(DatabaseUpdates, OfAHundredRequestsAtOnceAreWorkedOffInTurn) {
    PutIndex({{"gsm", Entry("2", PutDatabase("gsm.db.gz", "gsm 2"))},
              {"filler", PropertyList(std::string(100'000, 'x'))}});
    EXPECT_EQ(check(kGsm), "UpdateAvailable gsm");
    const std::size_t before = MemoryOf(daemon.pid(), "RssAnon:");
    for (int i = 0; i < 100; ++i) {
        ASSERT_TRUE(Ask(client, kGsm));
    }
    for (int i = 0; i < 100; ++i) {
        ASSERT_EQ(hear(), "NoUpdateRequired") << i;
    }
    EXPECT_LT(MemoryOf(daemon.pid(), "RssAnon:"), before + (8U << 10)) << "of 10 MiB that came";
    EXPECT_TRUE(hearsNothing());
}

}  // namespace
