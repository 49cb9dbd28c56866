#include "platform/SecTask.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

namespace platform {
namespace {

namespace fs = std::filesystem;

const std::string kFolder = "/etc/linefold/entitlements";
constexpr std::uint32_t kTelephony = 5010;
constexpr std::uint32_t kOther = 5020;
constexpr std::uint32_t kNobody = 65'534;

AuditToken TokenOf(std::uint32_t egid, std::uint32_t euid = 0, std::uint32_t pid = 1) {
    return {euid, euid, egid, euid, egid, pid, 0, 0};
}

std::string Granting(const std::string& value) {
    return "<plist version=\"1.0\"><dict><key>allow</key>" + value + "</dict></plist>";
}

/// A fresh folder, and a second entitled group.
class SecTaskTest : public testing::Test {
protected:
    SecTaskTest() {
        fs::remove_all(kFolder);
        fs::create_directories(kFolder);
        fs::copy_file("/etc/group", savedGroups_, fs::copy_options::overwrite_existing);
        std::ofstream("/etc/group", std::ios::app) << "linefold-other:x:5020:\n";
    }

    ~SecTaskTest() override {
        fs::copy_file(savedGroups_, "/etc/group", fs::copy_options::overwrite_existing);
    }

    static std::string fileOf(const std::string& group) { return kFolder + "/" + group + ".plist"; }

    static void write(const std::string& contents,
                      const std::string& group = "linefold-telephony") {
        std::ofstream(fileOf(group), std::ios::binary) << contents;
    }

    static SecTask::Answer ask(std::uint32_t egid = kTelephony) {
        return SecTask::createWithAuditToken(TokenOf(egid))->copyValueForEntitlement("allow");
    }

    static bool isTrue(const SecTask::Answer& answer) {
        return answer.error == 0 && answer.value == PropertyList(true);
    }

private:
    const fs::path savedGroups_ = "/tmp/group.saved";
};

TEST_F(SecTaskTest, AGroupHasTheValuesOfItsFile) {
    write(Granting("<true/>"));
    EXPECT_TRUE(isTrue(ask()));
    write(Granting("<false/>"));
    EXPECT_EQ(ask().value, PropertyList(false));
    write(Granting("<integer>1</integer>"));
    EXPECT_EQ(ask().value, PropertyList(std::int64_t{1}));
    write(Granting("<string>true</string>"));
    EXPECT_EQ(ask().value, PropertyList("true"));
}

TEST_F(SecTaskTest, AnEntitlementThatIsNotNamedIsNotHeld) {
    write("<plist><dict><key>deny</key><true/></dict></plist>");
    EXPECT_EQ(ask().value, std::nullopt);
    EXPECT_EQ(ask().error, 0);
    write("<plist><array><string>allow</string></array></plist>");
    EXPECT_EQ(ask().value, std::nullopt);
}

TEST_F(SecTaskTest, EachGroupHasItsOwnFile) {
    write(Granting("<true/>"));
    write(Granting("<false/>"), "linefold-other");
    EXPECT_TRUE(isTrue(ask(kTelephony)));
    EXPECT_EQ(ask(kOther).value, PropertyList(false));
    EXPECT_EQ(ask(0).value, std::nullopt);
}

TEST_F(SecTaskTest, AFileThatIsAddedLaterIsSeen) {
    write(Granting("<true/>"));
    EXPECT_EQ(ask(kOther).value, std::nullopt);
    write(Granting("<true/>"), "linefold-other");
    EXPECT_TRUE(isTrue(ask(kOther)));
    fs::remove(fileOf("linefold-other"));
    EXPECT_EQ(ask(kOther).value, std::nullopt);
}

TEST_F(SecTaskTest, AFileThatIsAddedWithinTheSameTickOfTheClockIsSeen) {
    const auto tick = fs::file_time_type::clock::now();
    write(Granting("<true/>"));
    fs::last_write_time(kFolder, tick);
    EXPECT_EQ(ask(kOther).value, std::nullopt);
    write(Granting("<true/>"), "linefold-other");
    fs::last_write_time(kFolder, tick);
    EXPECT_TRUE(isTrue(ask(kOther)));
}

TEST_F(SecTaskTest, AFileOfAGroupThatNobodyKnowsSpeaksForNobody) {
    write(Granting("<true/>"), "no-such-group");
    write(Granting("<true/>"), "5010");
    EXPECT_EQ(ask().value, std::nullopt);
}

TEST_F(SecTaskTest, WithoutAFolderNobodyHoldsAnything) {
    fs::remove_all(kFolder);
    EXPECT_EQ(ask().value, std::nullopt);
}

TEST_F(SecTaskTest, AFolderOfSomebodyElsesCountsAsAbsent) {
    write(Granting("<true/>"));
    ASSERT_EQ(chown(kFolder.c_str(), 501, 0), 0);
    EXPECT_EQ(ask().value, std::nullopt);
}

TEST_F(SecTaskTest, AFolderThatOthersMayWriteCountsAsAbsent) {
    write(Granting("<true/>"));
    for (const mode_t mode : {0775U, 0757U}) {
        ASSERT_EQ(chmod(kFolder.c_str(), mode), 0);
        EXPECT_EQ(ask().value, std::nullopt) << std::oct << mode;
    }
}

TEST_F(SecTaskTest, AFolderThatIsALinkCountsAsAbsent) {
    write(Granting("<true/>"));
    fs::rename(kFolder, kFolder + ".real");
    fs::create_symlink(kFolder + ".real", kFolder);
    EXPECT_EQ(ask().value, std::nullopt);
    fs::remove(kFolder);
    fs::remove_all(kFolder + ".real");
}

TEST_F(SecTaskTest, AFileOfSomebodyElsesCountsAsAbsent) {
    write(Granting("<true/>"));
    ASSERT_EQ(chown(fileOf("linefold-telephony").c_str(), 501, 0), 0);
    EXPECT_EQ(ask().value, std::nullopt);
    EXPECT_NE(ask().error, 0);
}

TEST_F(SecTaskTest, AFileThatOthersMayWriteCountsAsAbsent) {
    write(Granting("<true/>"));
    for (const mode_t mode : {0664U, 0646U}) {
        ASSERT_EQ(chmod(fileOf("linefold-telephony").c_str(), mode), 0);
        EXPECT_EQ(ask().value, std::nullopt) << std::oct << mode;
    }
}

TEST_F(SecTaskTest, ALinkInPlaceOfTheFileCountsAsAbsent) {
    write(Granting("<true/>"), "linefold-other");
    fs::create_symlink(fileOf("linefold-other"), fileOf("linefold-telephony"));
    EXPECT_EQ(ask().value, std::nullopt);
}

TEST_F(SecTaskTest, AFifoInPlaceOfTheFileBlocksNobody) {
    ASSERT_EQ(mkfifo(fileOf("linefold-telephony").c_str(), 0600), 0);
    EXPECT_EQ(ask().value, std::nullopt);
}

TEST_F(SecTaskTest, AFolderInPlaceOfTheFileCountsAsAbsent) {
    fs::create_directory(fileOf("linefold-telephony"));
    EXPECT_EQ(ask().value, std::nullopt);
}

TEST_F(SecTaskTest, AFileMayHave64KiBAndNotOneByteMore) {
    const std::string granting = Granting("<true/>");
    const std::string padding((64U << 10) - granting.size(), '\n');
    write(granting + padding);
    EXPECT_TRUE(isTrue(ask()));
    write(granting + padding + "\n");
    EXPECT_EQ(ask().value, std::nullopt);
}

TEST_F(SecTaskTest, AFileThatIsNoPropertyListCountsAsAbsent) {
    for (const char* contents : {"", "allow", "<plist><dict><key>allow</key>", "bplist00"}) {
        write(contents);
        EXPECT_EQ(ask().value, std::nullopt) << contents;
        EXPECT_NE(ask().error, 0) << contents;
    }
}

TEST_F(SecTaskTest, ATokenThatNamesNobodyGetsNoTask) {
    EXPECT_EQ(SecTask::createWithAuditToken(kUnknownSender), nullptr);
    EXPECT_EQ(SecTask::createWithAuditToken(TokenOf(kTelephony, 0, 0)), nullptr);
    EXPECT_EQ(SecTask::createWithAuditToken(TokenOf(kTelephony, 0, 0xFFFFFFFF)), nullptr);
    EXPECT_EQ(SecTask::createWithAuditToken(TokenOf(kUnknownIdentity)), nullptr);
    EXPECT_EQ(SecTask::createWithAuditToken(TokenOf(kTelephony, kUnknownIdentity)), nullptr);
}

TEST_F(SecTaskTest, WhomTheKernelCannotNameGetsNoTask) {
    write(Granting("<true/>"), "nogroup");
    EXPECT_EQ(SecTask::createWithAuditToken(TokenOf(kNobody)), nullptr);
    EXPECT_EQ(SecTask::createWithAuditToken(TokenOf(kTelephony, kNobody)), nullptr);
    EXPECT_NE(SecTask::createWithAuditToken(TokenOf(kTelephony)), nullptr);
}

}  // namespace
}  // namespace platform
