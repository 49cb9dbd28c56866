#include <gtest/gtest.h>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "handlers/carrier/CarrierTest.h"
#include "handlers/carrier/PreferenceCaches.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"

using platform::PreferencesUser;
using platform::SystemLogPriority;

namespace {

constexpr const char* kFile = "/var/mobile/Library/Preferences/com.vendra.carrier.plist";

kern_return_t RemoveDomain(std::string_view path, std::string_view domain) {
    auto pathField = Field1024(path);
    auto domainField = Field1024(domain);
    return server_LFMobileHelperRemovePreferenceDomain(7, pathField, domainField);
}

class RemovePreferenceDomain : public testing::Test {
protected:
    RemovePreferenceDomain() {
        sim::Reset();
        sim::MakeFile(kFile, {.mode = sim::kRegular | 0600, .owner = 501});
    }
};

TEST_F(RemovePreferenceDomain, RemovesTheFileAndFlushesTheDomain) {
    EXPECT_EQ(RemoveDomain(kFile, "com.vendra.carrier"), 0);
    EXPECT_FALSE(sim::FileAt(kFile).has_value());
    const std::vector<sim::PreferencesFlush> expected{
        {"com.vendra.carrier", PreferencesUser::kAny}};
    EXPECT_EQ(sim::PreferencesFlushes(), expected);
}

TEST_F(RemovePreferenceDomain, SaysSoInTheSystemLog) {
    EXPECT_EQ(RemoveDomain(kFile, "com.vendra.carrier"), 0);
    const std::vector<sim::SystemLogLine> expected{
        {SystemLogPriority::kNotice, "Removing domain: com.vendra.carrier\n"}};
    EXPECT_EQ(sim::SystemLogLines(), expected);
}

TEST_F(RemovePreferenceDomain, LogsAndFlushesBeforeItAsksThePolicy) {
    EXPECT_EQ(RemoveDomain(kFile, "domain"), 0);
    EXPECT_TRUE(sim::JournalHasInOrder({"SystemLog notice Removing domain: domain",
                                        "PreferencesFlushCachesForIdentifier domain",
                                        "PathAccess.lstat",
                                        "PathAccess.remove"}));
}

TEST_F(RemovePreferenceDomain, FlushesTheDomainOfARefusedPathAllTheSame) {
    sim::MakeDirectory("/etc");
    sim::MakeFile("/etc/passwd", {.mode = sim::kRegular | 0644});
    EXPECT_EQ(RemoveDomain("/etc/passwd", "domain"), 8);
    EXPECT_EQ(sim::PreferencesFlushes().size(), 1U);
    EXPECT_EQ(sim::SystemLogLines().size(), 1U);
    EXPECT_EQ(sim::UnifiedLog().size(), 3U);
    EXPECT_TRUE(sim::FileAt("/etc/passwd").has_value());
}

TEST_F(RemovePreferenceDomain, NeitherLogsNorFlushesAnEmptyDomain) {
    EXPECT_EQ(RemoveDomain(kFile, ""), 0);
    EXPECT_TRUE(sim::SystemLogLines().empty());
    EXPECT_TRUE(sim::PreferencesFlushes().empty());
    EXPECT_FALSE(sim::FileAt(kFile).has_value());
}

TEST_F(RemovePreferenceDomain, FailsWhenThereIsNoFile) {
    EXPECT_EQ(RemoveDomain(kFile, ""), 0);
    EXPECT_EQ(RemoveDomain(kFile, ""), 5);
}

TEST_F(RemovePreferenceDomain, FailsWhenTheRemovalDoes) {
    sim::FailCall("PathAccess.remove", 1);
    EXPECT_EQ(RemoveDomain(kFile, "domain"), 5);
    EXPECT_TRUE(sim::FileAt(kFile).has_value());
    EXPECT_EQ(sim::PreferencesFlushes().size(), 1U);
}

TEST_F(RemovePreferenceDomain, RemovesWhatLiesBelowTheCarrierBundles) {
    sim::MakeDirectory("/private/var/mobile/Library/Carrier Bundles", 501);
    sim::MakeDirectory("/private/var/mobile/Library/Carrier Bundles/x", 501);
    EXPECT_EQ(RemoveDomain("/var/mobile/Library/Carrier Bundles/x", ""), 0);
    EXPECT_FALSE(sim::FileAt("/var/mobile/Library/Carrier Bundles/x").has_value());
}

TEST_F(RemovePreferenceDomain, RemovesALinkAndNotWhatItLeadsTo) {
    sim::MakeFile("/tmp/kept", {.mode = sim::kRegular | 0600});
    sim::MakeLink(kFile, "/tmp/kept", 501);
    EXPECT_EQ(RemoveDomain(kFile, ""), 0);
    EXPECT_FALSE(sim::FileAt(kFile).has_value());
    EXPECT_TRUE(sim::FileAt("/tmp/kept").has_value());
}

TEST_F(RemovePreferenceDomain, CannotForgeALogLine) {
    EXPECT_EQ(RemoveDomain(kFile, "a\nb\x7f\xff"), 0);
    EXPECT_EQ(sim::SystemLogLines()[0].text, "Removing domain: a\\x0ab\\x7f\\xff\n");
}

TEST_F(RemovePreferenceDomain, CutsAFieldWithoutNulByItsLastByte) {
    EXPECT_EQ(RemoveDomain(std::string(1024, 'p'), std::string(1024, 'd')), 8);
    EXPECT_EQ(sim::PreferencesFlushes()[0].identifier, std::string(1023, 'd'));
    EXPECT_EQ(sim::UnifiedLog()[0].text,
              "NOT Allowing path " + std::string(1023, 'p') +
                  " as it isn't within the wild card directories:");
}

TEST(PreferenceCaches, OfADomainThatIsNotUtf8AreFlushedAllTogether) {
    sim::Reset();
    FlushPreferenceCaches("good");
    FlushPreferenceCaches("\xc0\x80");
    const std::vector<sim::PreferencesFlush> expected{{"good", PreferencesUser::kAny},
                                                      {std::nullopt, PreferencesUser::kAny}};
    EXPECT_EQ(sim::PreferencesFlushes(), expected);
}

}  // namespace
