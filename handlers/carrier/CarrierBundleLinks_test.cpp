#include <gtest/gtest.h>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "handlers/carrier/CarrierTest.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"

using platform::LogLevel;
using platform::PreferencesUser;

namespace {

constexpr const char* kLink = "/var/mobile/Library/Carrier Bundle.bundle";
constexpr const char* kPrivateLink = "/private/var/mobile/Library/Carrier Bundle.bundle";
constexpr const char* kTarget = "/System/Bundles/Example.bundle";

kern_return_t LinkBundle(std::string_view target, std::string_view path, std::string_view domain) {
    auto targetField = Field1024(target);
    auto pathField = Field1024(path);
    auto domainField = Field1024(domain);
    return server_LFMobileHelperLinkCarrierBundle(7, targetField, pathField, domainField);
}

kern_return_t CreateSymlink(std::string_view target, std::string_view path) {
    auto targetField = Field1024(target);
    auto pathField = Field1024(path);
    return server_LFMobileHelperCreateSymlink(7, targetField, pathField);
}

class LinkCarrierBundle : public testing::Test {
protected:
    LinkCarrierBundle() { sim::Reset(); }

    static void expectLinkTo(std::string_view target, const char* path = kLink) {
        const auto node = sim::FileAt(path);
        ASSERT_TRUE(node.has_value());
        EXPECT_TRUE(node->is(sim::kLink));
        EXPECT_EQ(node->contents, target);
    }

    static sim::LogLine allowed(const std::string& path) {
        return {LogLevel::kInfo, path + " is within allowed path " + path};
    }
};

using CreateSymlinkRoutine = LinkCarrierBundle;

TEST_F(LinkCarrierBundle, MakesTheLinkAndFlushesTheDomainForAnyUser) {
    EXPECT_EQ(LinkBundle(kTarget, kLink, "com.vendra.carrier"), 0);
    expectLinkTo(kTarget);
    const std::vector<sim::PreferencesFlush> expected{
        {"com.vendra.carrier", PreferencesUser::kAny}};
    EXPECT_EQ(sim::PreferencesFlushes(), expected);
}

TEST_F(LinkCarrierBundle, LogsTheAdmissionAndTheResult) {
    EXPECT_EQ(LinkBundle(kTarget, kLink, "com.vendra.carrier"), 0);
    const std::vector<sim::LogLine> expected{
        allowed(kLink),
        {LogLevel::kInfo, std::string("linkpath: ") + kLink + ", domain: com.vendra.carrier"}};
    EXPECT_EQ(sim::UnifiedLog(), expected);
    EXPECT_TRUE(sim::SystemLogLines().empty());
}

TEST_F(LinkCarrierBundle, WorksInItsOrder) {
    EXPECT_EQ(LinkBundle(kTarget, kLink, "domain"), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"PathAccess.lstat",
                                        "Log info /var/mobile",
                                        "PathAccess.remove",
                                        "PathAccess.symlink",
                                        "Log info linkpath: ",
                                        "PreferencesFlushCachesForIdentifier domain"}));
}

TEST_F(LinkCarrierBundle, ReplacesAnOldLinkInBothSpellingsOfTheHome) {
    for (const char* path : {kLink, kPrivateLink}) {
        sim::MakeLink(kLink, "/old", 501);
        EXPECT_EQ(LinkBundle(kTarget, path, ""), 0);
        expectLinkTo(kTarget);
    }
    EXPECT_TRUE(sim::PreferencesFlushes().empty());
}

TEST_F(LinkCarrierBundle, ReplacesAnOldFile) {
    sim::MakeFile(kLink, {.mode = sim::kRegular | 0644, .owner = 501});
    EXPECT_EQ(LinkBundle(kTarget, kLink, ""), 0);
    expectLinkTo(kTarget);
}

TEST_F(LinkCarrierBundle, FlushesNothingForAnEmptyDomainAndLogsItEmpty) {
    EXPECT_EQ(LinkBundle(kTarget, kLink, ""), 0);
    ASSERT_EQ(sim::UnifiedLog().size(), 2U);
    EXPECT_EQ(sim::UnifiedLog()[1].text, std::string("linkpath: ") + kLink + ", domain: ");
    EXPECT_TRUE(sim::PreferencesFlushes().empty());
}

TEST_F(LinkCarrierBundle, FlushesAllForADomainThatIsNotUtf8) {
    EXPECT_EQ(LinkBundle(kTarget, kLink, "com.\xff"), 0);
    const std::vector<sim::PreferencesFlush> expected{{std::nullopt, PreferencesUser::kAny}};
    EXPECT_EQ(sim::PreferencesFlushes(), expected);
    EXPECT_EQ(sim::UnifiedLog()[1].text, std::string("linkpath: ") + kLink + ", domain: com.\\xff");
}

TEST_F(LinkCarrierBundle, RefusesAnyOtherPlaceWithOneLine) {
    EXPECT_EQ(LinkBundle(kTarget, "/etc/passwd", "domain"), 8);
    const std::vector<sim::LogLine> expected{
        {LogLevel::kError, "Cannot remove symlink: /etc/passwd"}};
    EXPECT_EQ(sim::UnifiedLog(), expected);
    EXPECT_TRUE(sim::PreferencesFlushes().empty());
    EXPECT_EQ(sim::JournalCount("PathAccess.remove"), 0U);
}

TEST_F(LinkCarrierBundle, RefusesADirectoryAtTheLinkPath) {
    sim::MakeDirectory(kLink);
    EXPECT_EQ(LinkBundle(kTarget, kLink, "domain"), 8);
    EXPECT_EQ(sim::UnifiedLog().back().text, std::string("Cannot remove symlink: ") + kLink);
    EXPECT_TRUE(sim::FileAt(kLink)->is(sim::kDirectory));
    EXPECT_TRUE(sim::PreferencesFlushes().empty());
}

TEST_F(LinkCarrierBundle, FailsWhereTheFolderIsMissing) {
    sim::RemoveFile("/private/var/mobile/Library");
    EXPECT_EQ(LinkBundle(kTarget, kLink, "domain"), 5);
    const std::vector<sim::LogLine> expected{allowed(kLink)};
    EXPECT_EQ(sim::UnifiedLog(), expected);
    EXPECT_TRUE(sim::PreferencesFlushes().empty());
}

TEST_F(LinkCarrierBundle, FailsWithAnEmptyTarget) {
    EXPECT_EQ(LinkBundle("", kLink, "domain"), 5);
    EXPECT_FALSE(sim::FileAt(kLink).has_value());
}

TEST_F(LinkCarrierBundle, FailsWhenTheOldLinkCannotBeRemoved) {
    sim::MakeLink(kLink, "/old");
    sim::FailCall("PathAccess.remove", 1);
    EXPECT_EQ(LinkBundle(kTarget, kLink, "domain"), 5);
    expectLinkTo("/old");
}

TEST_F(LinkCarrierBundle, FailsWhenTheLinkCannotBeMade) {
    sim::FailCall("PathAccess.symlink", 1);
    EXPECT_EQ(LinkBundle(kTarget, kLink, "domain"), 5);
    EXPECT_EQ(sim::UnifiedLog().size(), 1U);
    EXPECT_TRUE(sim::PreferencesFlushes().empty());
}

TEST_F(LinkCarrierBundle, LetsTheLinkPointAnywhere) {
    for (const char* target : {"/etc/shadow", "../../..", "relative", "not\nvery\x01nice"}) {
        EXPECT_EQ(LinkBundle(target, kLink, ""), 0);
        expectLinkTo(target);
    }
}

TEST_F(LinkCarrierBundle, CutsAFieldWithoutNulByItsLastByte) {
    EXPECT_EQ(LinkBundle(std::string(1024, 't'), kLink, std::string(1024, 'd')), 0);
    expectLinkTo(std::string(1023, 't'));
    EXPECT_EQ(sim::PreferencesFlushes()[0].identifier, std::string(1023, 'd'));
}

TEST_F(LinkCarrierBundle, DoesNotFollowALinkOfTheMobileUserOnTheWay) {
    sim::MakeDirectory("/etc");
    sim::RemoveFile("/private/var/mobile/Library");
    sim::MakeLink("/private/var/mobile/Library", "/etc", 501);
    EXPECT_EQ(LinkBundle(kTarget, kLink, ""), 5);
    EXPECT_FALSE(sim::FileAt("/etc/Carrier Bundle.bundle").has_value());
}

// The plain link.

TEST_F(CreateSymlinkRoutine, ReplacesWhateverStandsThereAndLogsNothing) {
    sim::MakeDirectory("/etc");
    sim::MakeFile("/etc/file", {.mode = sim::kRegular | 0600});
    sim::ClearJournal();
    EXPECT_EQ(CreateSymlink(kTarget, "/etc/file"), 0);
    expectLinkTo(kTarget, "/etc/file");
    EXPECT_TRUE(sim::UnifiedLog().empty());
    EXPECT_TRUE(sim::SystemLogLines().empty());
    EXPECT_EQ(sim::JournalCount("PathAccess.lstat"), 0U);
}

TEST_F(CreateSymlinkRoutine, ReplacesAnEmptyDirectoryEvenAtALinkPath) {
    sim::MakeDirectory(kLink);
    EXPECT_EQ(CreateSymlink(kTarget, kLink), 0);
    expectLinkTo(kTarget);
}

TEST_F(CreateSymlinkRoutine, FailsOnAFolderThatIsNotEmpty) {
    EXPECT_EQ(CreateSymlink(kTarget, "/private/var/mobile"), 5);
    EXPECT_TRUE(sim::FileAt("/private/var/mobile")->is(sim::kDirectory));
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

TEST_F(CreateSymlinkRoutine, FailsWhereTheFolderIsMissing) {
    EXPECT_EQ(CreateSymlink(kTarget, "/nowhere/link"), 5);
    EXPECT_EQ(CreateSymlink(kTarget, ""), 5);
    EXPECT_EQ(CreateSymlink("", "/tmp/link"), 5);
}

TEST_F(CreateSymlinkRoutine, RemovesBeforeItLinks) {
    EXPECT_EQ(CreateSymlink(kTarget, "/tmp/link"), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"PathAccess.remove", "PathAccess.symlink"}));
    EXPECT_TRUE(sim::PreferencesFlushes().empty());
}

TEST_F(CreateSymlinkRoutine, CutsAFieldWithoutNulByItsLastByte) {
    EXPECT_EQ(CreateSymlink(std::string(1024, 't'), "/tmp/link"), 0);
    expectLinkTo(std::string(1023, 't'), "/tmp/link");
}

}  // namespace
