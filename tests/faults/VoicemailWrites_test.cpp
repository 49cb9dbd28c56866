// A voicemail token that is being written when the daemon dies, a call fails or the disk is full:
// the store holds the old token or the new one.
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <random>
#include <thread>

#include "platform/PropertyList.h"
#include "tests/faults/FaultyDaemon.h"
#include "tests/support/VoicemailCalls.h"

namespace fs = std::filesystem;

namespace {

using faults::FaultyDaemon;
using faults::kFileCalls;
using platform::PropertyList;

const std::string kParent = "/private/var/db";
const std::string kFolder = kParent + "/linefold";
const std::string kFile = kFolder + "/voicemail.plist";
const std::string kTemporary = kFolder + "/.linefold-mobile-helper.tmp";

/// The token as it lies on disk; nothing at all when the file is anything but whole.
std::optional<std::string> TokenOnDisk() {
    std::ifstream file(kFile, std::ios::binary);
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    const auto store = platform::PropertyListCreateWithData(std::as_bytes(std::span(text)));
    const PropertyList* const token = store ? store->find("Token") : nullptr;
    const std::string* const value = token == nullptr ? nullptr : token->as<std::string>();
    return value == nullptr ? std::nullopt : std::optional(*value);
}

std::int64_t NumberOnDisk() {
    return std::stoll(TokenOnDisk().value_or("-1"));
}

std::ptrdiff_t FilesInFolder() {
    return std::distance(fs::directory_iterator(kFolder), {});
}

/// A store with the token 0 and many others, which takes a while to write.
void FillStore() {
    std::string store = "<plist><dict><key>Token</key><string>0</string><key>Records</key><array>";
    for (int i = 0; i < 500; ++i) {
        store += "<dict><key>Key</key><string>" + std::to_string(i) +
                 "</string><key>Token</key><string>" + std::string(200, 'x') + "</string></dict>";
    }
    fs::create_directories(kFolder);
    fs::permissions(kFolder, fs::perms(0700));
    std::ofstream(kFile) << store + "</array></dict></plist>";
    fs::permissions(kFile, fs::perms(0600));
}

class VoicemailWrites : public testing::Test {
protected:
    VoicemailWrites() { startOver(); }

    static void startOver() {
        fs::remove_all(kParent);
        fs::create_directories(kParent);
    }

    /// Whatever happened before: the next write works and leaves one file.
    static void expectCleanAfterNextWrite() {
        phone::Daemon daemon;
        const auto client = phone::Client::checkIn();
        EXPECT_EQ(phone::SetToken(client, "1000000"), 0);
        EXPECT_EQ(NumberOnDisk(), 1'000'000);
        EXPECT_EQ(FilesInFolder(), 1);
    }

    /// Sets the token to 1 with each fault in turn, and looks at what is on disk then. The number
    /// of faults that were met.
    template <typename Prepare, typename Judge>
    static int sweep(const std::string& fault, const Prepare& prepare, const Judge& judge) {
        int faults = 0;
        for (const char* call : kFileCalls) {
            bool wasHit = true;
            for (int n = 1; wasHit && n < 20; ++n) {
                SCOPED_TRACE(std::string(call) + " " + std::to_string(n));
                startOver();
                prepare();
                FaultyDaemon faulty({kTemporary, kFile, kFolder, kParent}, call, n, fault);
                const auto client = phone::Client::checkIn();
                const bool isAcknowledged = phone::SetToken(client, "1") == 0;
                wasHit = faulty.wasHit();
                judge(isAcknowledged);
                faults += wasHit ? 1 : 0;
            }
        }
        return faults;
    }
};

TEST_F(VoicemailWrites, AreOldOrNewWhenTheDaemonIsKilled) {
    FillStore();
    std::mt19937 random(60);
    for (int round = 0; round < 60; ++round) {
        phone::Daemon daemon;
        const auto client = phone::Client::checkIn();
        std::int64_t acknowledged = NumberOnDisk();
        std::jthread killer([&daemon, delay = random() % 8000] {
            std::this_thread::sleep_for(std::chrono::microseconds(delay));
            daemon.signal(SIGKILL);
        });
        while (acknowledged < 1'000'000 &&
               phone::SetToken(client, std::to_string(acknowledged + 1)) == 0) {
            ++acknowledged;
        }
        killer.join();
        const std::int64_t onDisk = NumberOnDisk();
        EXPECT_TRUE(onDisk == acknowledged || onDisk == acknowledged + 1)
            << onDisk << " after " << acknowledged;
        EXPECT_LE(FilesInFolder(), 2) << "the store, and one under the one temporary name";
    }
    expectCleanAfterNextWrite();
}

TEST_F(VoicemailWrites, AreOldOrNewWhateverCallIsTheLast) {
    const int faults = sweep("signal=SIGKILL", FillStore, [](bool isAcknowledged) {
        const std::int64_t onDisk = NumberOnDisk();
        EXPECT_TRUE(onDisk == 1 || (onDisk == 0 && !isAcknowledged)) << onDisk;
        EXPECT_LE(FilesInFolder(), 2);
    });
    EXPECT_GE(faults, 10) << "the faults were met";
    expectCleanAfterNextWrite();
}

TEST_F(VoicemailWrites, OfAFirstTokenAreNothingOrAllWhateverCallIsTheLast) {
    const int faults = sweep(
        "signal=SIGKILL",
        [] {},
        [](bool isAcknowledged) {
            const std::int64_t onDisk = NumberOnDisk();
            EXPECT_TRUE(onDisk == 1 || (!isAcknowledged && !fs::exists(kFile))) << onDisk;
        });
    EXPECT_GE(faults, 10) << "the faults were met";
    expectCleanAfterNextWrite();
}

TEST_F(VoicemailWrites, AreOldOrNewWhateverCallFails) {
    for (const char* error : {"error=EIO", "error=ENOSPC"}) {
        const int faults = sweep(error, FillStore, [](bool isAcknowledged) {
            EXPECT_TRUE(isAcknowledged) << "what the store says is not in the reply";
            const std::int64_t onDisk = NumberOnDisk();
            EXPECT_TRUE(onDisk == 0 || onDisk == 1) << onDisk;
        });
        EXPECT_GE(faults, 10) << "the faults were met";
        expectCleanAfterNextWrite();
    }
}

TEST_F(VoicemailWrites, KeepTheOldTokenOnAFullDisk) {
    fs::create_directories(kFolder);
    ASSERT_EQ(mount("tmpfs", kFolder.c_str(), "tmpfs", 0, "size=16k,mode=0700"), 0);
    {
        phone::Daemon daemon;
        const auto client = phone::Client::checkIn();
        phone::LogReader journal = phone::LogReader::journal();
        EXPECT_EQ(phone::SetToken(client, "7"), 0);
        for (int i = 0; i < 60; ++i) {
            EXPECT_EQ(phone::SetTokenForKey(client, std::to_string(i), std::string(250, 'x')), 0);
        }
        const auto lines = journal.take();
        ASSERT_FALSE(lines.empty());
        EXPECT_EQ(lines.front(),
                  "3 platform voicemail: " + kFile + " cannot be written: No space left on device");
        EXPECT_EQ(phone::CopyToken(client).token, "7");
        EXPECT_EQ(phone::CopyTokenForKey(client, "0").token, std::string(250, 'x'));
        EXPECT_EQ(FilesInFolder(), 1);
    }
    EXPECT_EQ(umount2(kFolder.c_str(), MNT_DETACH), 0);
}

}  // namespace
