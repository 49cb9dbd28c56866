// A preference that is being written when the daemon dies, a call fails or the disk is full: the
// file holds the old value or the new one.
#include <gtest/gtest.h>
#include <sys/mount.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <random>
#include <thread>

#include "platform/PropertyList.h"
#include "tests/faults/FaultyDaemon.h"
#include "tests/support/PhoneRoot.h"

namespace fs = std::filesystem;

namespace {

using faults::FaultyDaemon;
using faults::kFileCalls;
using platform::PropertyList;

constexpr const char* kDomain = "com.vendra.test";

std::string Folder() {
    return std::string(phone::kMobileLibrary) + "/Preferences";
}

std::string DomainFile() {
    return Folder() + "/" + kDomain + ".plist";
}

std::string TemporaryFile() {
    return Folder() + "/.linefold-mobile-helper.tmp";
}

std::string Xml(const PropertyList& value) {
    const auto data = platform::PropertyListCreateXmlData(value).value();
    return {reinterpret_cast<const char*>(data.data()), data.size()};
}

/// The domain as it lies on disk; none when the file is anything but whole.
std::optional<PropertyList> DomainOnDisk() {
    std::ifstream file(DomainFile(), std::ios::binary);
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    return platform::PropertyListCreateWithData(std::as_bytes(std::span(text)));
}

std::int64_t NumberOnDisk(const std::string& key) {
    const auto domain = DomainOnDisk();
    const auto* const value = domain ? domain->find(key) : nullptr;
    const auto* const number = value == nullptr ? nullptr : value->as<std::int64_t>();
    return number == nullptr ? -1 : *number;
}

std::ptrdiff_t FilesInFolder() {
    return std::distance(fs::directory_iterator(Folder()), {});
}

std::int32_t SetNumber(const phone::Client& client, const std::string& key, std::int64_t number) {
    return client.setPreference(kDomain, key, Xml(PropertyList(number)));
}

/// A domain that takes a while to write.
void FillDomain() {
    PropertyList::Dictionary entries{{"number", PropertyList(std::int64_t{0})}};
    for (int i = 0; i < 2000; ++i) {
        entries.emplace_back("filler " + std::to_string(i), PropertyList(std::string(100, 'x')));
    }
    std::ofstream(DomainFile()) << Xml(PropertyList(std::move(entries)));
    fs::permissions(DomainFile(), fs::perms(0644));
}

class PreferenceWrites : public testing::Test {
protected:
    PreferenceWrites() { phone::ResetMobileHome(); }

    /// Whatever happened before: the next write works and leaves one file.
    static void expectCleanAfterNextWrite() {
        phone::Daemon daemon;
        const auto client = phone::Client::checkIn();
        EXPECT_EQ(SetNumber(client, "number", 1'000'000), 0);
        EXPECT_EQ(NumberOnDisk("number"), 1'000'000);
        EXPECT_EQ(FilesInFolder(), 1);
    }
};

TEST_F(PreferenceWrites, AreOldOrNewWhenTheDaemonIsKilled) {
    FillDomain();
    std::mt19937 random(60);
    for (int round = 0; round < 60; ++round) {
        phone::Daemon daemon;
        const auto client = phone::Client::checkIn();
        std::int64_t acknowledged = NumberOnDisk("number");
        std::jthread killer([&daemon, delay = random() % 8000] {
            std::this_thread::sleep_for(std::chrono::microseconds(delay));
            daemon.signal(SIGKILL);
        });
        while (acknowledged < 1'000'000 && SetNumber(client, "number", acknowledged + 1) == 0) {
            ++acknowledged;
        }
        killer.join();
        const std::int64_t onDisk = NumberOnDisk("number");
        EXPECT_TRUE(onDisk == acknowledged || onDisk == acknowledged + 1)
            << onDisk << " after " << acknowledged;
        EXPECT_LE(FilesInFolder(), 2);
    }
    expectCleanAfterNextWrite();
}

TEST_F(PreferenceWrites, LoseNothingThatWasAcknowledgedToEightClients) {
    for (int round = 0; round < 5; ++round) {
        phone::Daemon daemon;
        std::array<std::int64_t, 8> acknowledged{};
        {
            std::vector<std::jthread> clients;
            for (std::size_t i = 0; i < acknowledged.size(); ++i) {
                clients.emplace_back([&count = acknowledged[i], key = std::to_string(i)] {
                    const auto client = phone::Client::checkIn();
                    while (client.code == 0 && count < 100'000 &&
                           SetNumber(client, key, count + 1) == 0) {
                        ++count;
                    }
                });
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
            daemon.signal(SIGKILL);
        }
        for (std::size_t i = 0; i < acknowledged.size(); ++i) {
            const std::int64_t onDisk = NumberOnDisk(std::to_string(i));
            EXPECT_TRUE(acknowledged[i] == 0 || onDisk == acknowledged[i] ||
                        onDisk == acknowledged[i] + 1)
                << onDisk << " after " << acknowledged[i];
        }
        fs::remove(DomainFile());
    }
}

/// The same path from the mobile user's home as the system knows it.
std::string AsDaemonSpells(const std::string& path) {
    return path.substr(std::string_view("/private").size());
}

/// What the faults are about.
std::vector<std::string> TouchedPaths() {
    return {TemporaryFile(),
            DomainFile(),
            AsDaemonSpells(DomainFile()),
            Folder(),
            AsDaemonSpells(Folder()),
            AsDaemonSpells(Folder()) + "/"};
}

TEST_F(PreferenceWrites, AreOldOrNewWhateverCallIsTheLast) {
    int faults = 0;
    for (const char* call : kFileCalls) {
        for (int n = 1; n < 20; ++n) {
            fs::remove_all(Folder());
            phone::ResetMobileHome();
            FillDomain();
            FaultyDaemon faulty(TouchedPaths(), call, n, "signal=SIGKILL");
            const auto client = phone::Client::checkIn();
            const bool isAcknowledged = SetNumber(client, "number", 1) == 0;
            const bool wasHit = faulty.wasHit();
            const std::int64_t onDisk = NumberOnDisk("number");
            EXPECT_TRUE(onDisk == 1 || (onDisk == 0 && !isAcknowledged))
                << call << " " << n << ": " << onDisk;
            faults += wasHit ? 1 : 0;
            if (!wasHit) {
                break;
            }
        }
    }
    EXPECT_GE(faults, 10) << "the faults were met";
    expectCleanAfterNextWrite();
}

TEST_F(PreferenceWrites, AreOldOrNewWhateverCallFails) {
    int faults = 0;
    for (const char* call : kFileCalls) {
        for (int n = 1; n < 20; ++n) {
            phone::ResetMobileHome();
            FillDomain();
            FaultyDaemon faulty(TouchedPaths(), call, n, "error=EIO");
            const auto client = phone::Client::checkIn();
            EXPECT_EQ(SetNumber(client, "number", 1), 0) << call << " " << n;
            const bool wasHit = faulty.wasHit();
            const std::int64_t onDisk = NumberOnDisk("number");
            EXPECT_TRUE(onDisk == 0 || onDisk == 1) << call << " " << n << ": " << onDisk;
            faults += wasHit ? 1 : 0;
            if (!wasHit) {
                break;
            }
        }
    }
    EXPECT_GE(faults, 10) << "the faults were met";
    expectCleanAfterNextWrite();
}

TEST_F(PreferenceWrites, KeepTheOldValueOnAFullDisk) {
    ASSERT_EQ(mount("tmpfs", Folder().c_str(), "tmpfs", 0, "size=64k,mode=0777"), 0);
    {
        phone::Daemon daemon;
        const auto client = phone::Client::checkIn();
        phone::LogReader journal = phone::LogReader::journal();
        EXPECT_EQ(SetNumber(client, "number", 7), 0);
        EXPECT_EQ(
            client.setPreference(kDomain, "large", Xml(PropertyList(std::string(100'000, 'x')))),
            0);
        EXPECT_EQ(NumberOnDisk("number"), 7);
        EXPECT_EQ(FilesInFolder(), 1);
        EXPECT_EQ(journal.take().size(), 1U);
        EXPECT_EQ(SetNumber(client, "number", 8), 0);
        EXPECT_EQ(NumberOnDisk("number"), 8);
    }
    EXPECT_EQ(umount2(Folder().c_str(), MNT_DETACH), 0);
}

}  // namespace
