// The check-in with real processes, groups and entitlement files.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <filesystem>
#include <fstream>

#include "tests/support/PhoneRoot.h"

namespace fs = std::filesystem;

namespace {

constexpr const char* kEntitlements = "/etc/linefold/entitlements";
constexpr const char* kTelephonyFile = "/etc/linefold/entitlements/linefold-telephony.plist";
constexpr gid_t kStrangersGroup = 5999;

/// The entitlement file with another value for as long as the object lives.
class EntitlementValue {
public:
    explicit EntitlementValue(const std::string& value) {
        fs::rename(kTelephonyFile, saved_);
        std::ofstream(kTelephonyFile)
            << "<?xml version=\"1.0\" encoding=\"UTF-8\"?><plist version=\"1.0\"><dict>"
               "<key>com.vendra.Halvane.LinefoldHelper.allow</key>"
            << value << "</dict></plist>";
    }

    ~EntitlementValue() { fs::rename(saved_, kTelephonyFile); }

    EntitlementValue(const EntitlementValue&) = delete;
    EntitlementValue& operator=(const EntitlementValue&) = delete;

private:
    const std::string saved_ = std::string(kEntitlements) + "/saved";
};

/// Runs a check-in in a process of its own and tells the code.
int CheckInFromChild() {
    const pid_t child = fork();
    if (child == 0) {
        _exit(phone::Client::checkIn().code);
    }
    int status = 0;
    waitpid(child, &status, 0);
    return WEXITSTATUS(status);
}

std::size_t OpenDescriptors(pid_t pid) {
    std::size_t count = 0;
    for (const auto& entry : fs::directory_iterator("/proc/" + std::to_string(pid) + "/fd")) {
        count += entry.path().empty() ? 0 : 1;
    }
    return count;
}

TEST(CheckIn, EntitledClientGetsAPortOfItsOwn) {
    phone::Daemon daemon;
    const auto client = phone::Client::checkIn();
    ASSERT_EQ(client.code, 0);
    const auto header = client.checkInReply.header();
    EXPECT_EQ(header.bits, platform::MACH_MSGH_BITS_COMPLEX);
    EXPECT_EQ(header.size, 40U);
    EXPECT_EQ(header.id, kCheckInId + 100);
    EXPECT_EQ(client.callTexts(8683558, {"/a", "/refused", ""}), 8);
}

TEST(CheckIn, StrangerIsRefused) {
    phone::Daemon daemon;
    EXPECT_EQ(phone::Client::checkIn(kStrangersGroup).code, 35);
    EXPECT_EQ(phone::Client::checkIn(0).code, 35) << "root is nobody special";
    EXPECT_EQ(phone::Client::checkIn(phone::kMobileUser, phone::kMobileUser).code, 35);
}

TEST(CheckIn, EntitledGroupCountsWhateverTheUser) {
    phone::Daemon daemon;
    EXPECT_EQ(phone::Client::checkIn(phone::kEntitledGroup, phone::kMobileUser).code, 0);
    EXPECT_EQ(phone::Client::checkIn(phone::kEntitledGroup, 65534).code, 35) << "the overflow user";
}

TEST(CheckIn, NothingButTheBooleanTrueGrants) {
    for (const char* value : {"<integer>1</integer>",
                              "<string>true</string>",
                              "<false/>",
                              "<real>1</real>",
                              "<array><true/></array>",
                              "<dict/>",
                              "<data>AQ==</data>"}) {
        const EntitlementValue granted(value);
        phone::Daemon daemon;
        EXPECT_EQ(phone::Client::checkIn().code, 35) << value;
    }
    phone::Daemon daemon;
    EXPECT_EQ(phone::Client::checkIn().code, 0);
}

TEST(CheckIn, SecondCheckInOfAProcessIsAnsweredFromTheCache) {
    phone::Daemon daemon;
    ASSERT_EQ(phone::Client::checkIn().code, 0);
    const EntitlementValue withdrawn("<false/>");
    EXPECT_EQ(phone::Client::checkIn().code, 0) << "the process that was told yes";
    EXPECT_EQ(CheckInFromChild(), 35) << "another process asks afresh";
}

TEST(CheckIn, CacheForgetsAProcessThatExits) {
    phone::Daemon daemon;
    const auto stays = phone::Client::checkIn();
    ASSERT_EQ(CheckInFromChild(), 0);
    const auto before = OpenDescriptors(daemon.pid());
    ASSERT_EQ(CheckInFromChild(), 0);
    EXPECT_TRUE(phone::Eventually([&] { return OpenDescriptors(daemon.pid()) <= before; }))
        << "the second child's watcher and ports are gone";
}

TEST(CheckIn, DeadWatchPortFailsAndLeavesNoClient) {
    phone::Daemon daemon;
    const auto first = phone::Client::checkIn();
    const auto before = OpenDescriptors(daemon.pid());
    std::array<int, 2> ends{};
    ASSERT_EQ(pipe2(ends.data(), O_CLOEXEC), 0);
    close(ends[0]);
    const auto service = phone::Connection::toService();
    const auto reply = service.call(phone::CheckInMessage(), std::array{ends[1]});
    close(ends[1]);
    EXPECT_EQ(reply.code(), 5);
    EXPECT_TRUE(phone::Eventually([&] { return OpenDescriptors(daemon.pid()) <= before + 1; }));
}

TEST(CheckIn, DeadClientsPortIsClosed) {
    phone::Daemon daemon;
    auto client = phone::Client::checkIn();
    client.watch.reset();
    EXPECT_TRUE(client.privatePort.receive().isEnd());
}

TEST(CheckIn, ServiceConnectionEndsAfterACheckIn) {
    phone::Daemon daemon;
    std::array<int, 2> ends{};
    ASSERT_EQ(pipe2(ends.data(), O_CLOEXEC), 0);
    const auto service = phone::Connection::toService();
    const auto reply = service.call(phone::CheckInMessage(), std::array{ends[1]});
    EXPECT_TRUE(reply.descriptor.isOpen());
    EXPECT_TRUE(service.receive().isEnd());
    close(ends[0]);
    close(ends[1]);
}

TEST(CheckIn, EntitlementFileOfAnotherOwnerGrantsNothing) {
    const EntitlementValue granted("<true/>");
    ASSERT_EQ(chown(kTelephonyFile, phone::kMobileUser, 0), 0);
    phone::Daemon daemon;
    auto log = phone::LogReader::journal();
    EXPECT_EQ(phone::Client::checkIn().code, 35);
    EXPECT_EQ(log.take().size(), 1U) << "one line says what to mend";
    ASSERT_EQ(chown(kTelephonyFile, 0, 0), 0);
}

}  // namespace
