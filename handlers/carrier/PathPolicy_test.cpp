#include "handlers/carrier/PathPolicy.h"

#include <gtest/gtest.h>

#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"

using platform::LogLevel;

namespace {

const std::vector<std::string> kHomes{"/var/mobile", "/private/var/mobile"};

const std::vector<std::string> kNames{
    "/Library/Preferences/com.vendra.carrier.plist",
    "/Library/Preferences/com.vendra.carrier_1.plist",
    "/Library/Preferences/com.vendra.carrier_2.plist",
    "/Library/Preferences/com.vendra.operator.plist",
    "/Library/Preferences/com.vendra.operator_1.plist",
    "/Library/Preferences/com.vendra.operator_2.plist",
    "/Library/Preferences/com.vendra.carrier.default.plist",
    "/Library/Preferences/com.vendra.carrier.bootstrap.plist",
    "/Library/Carrier Bundle.bundle",
    "/Library/Carrier1Bundle.bundle",
    "/Library/Carrier2Bundle.bundle",
    "/Library/Operator Bundle.bundle",
    "/Library/Operator1Bundle.bundle",
    "/Library/Operator2Bundle.bundle",
    "/Library/CarrierDefault.bundle",
    "/Library/CarrierBootstrap.bundle",
};

std::vector<std::string> AllAllowedPaths() {
    std::vector<std::string> paths;
    for (const auto& home : kHomes) {
        for (const auto& name : kNames) {
            paths.push_back(home + name);
        }
    }
    return paths;
}

constexpr const char* kLink = "/var/mobile/Library/Carrier Bundle.bundle";

class AllowedLinkPath : public testing::TestWithParam<std::string> {
protected:
    AllowedLinkPath() { sim::Reset(); }
};

TEST_P(AllowedLinkPath, IsAdmittedAndLogged) {
    EXPECT_TRUE(IsAllowedLinkPath(GetParam().c_str()));
    const std::vector<sim::LogLine> expected{
        {LogLevel::kInfo, GetParam() + " is within allowed path " + GetParam()}};
    EXPECT_EQ(sim::UnifiedLog(), expected);
    EXPECT_TRUE(sim::SystemLogLines().empty());
}

TEST_P(AllowedLinkPath, IsAdmittedByTheCarrierRuleWithThatOneLine) {
    EXPECT_TRUE(IsAllowedCarrierPath(GetParam().c_str()));
    const std::vector<sim::LogLine> expected{
        {LogLevel::kInfo, GetParam() + " is within allowed path " + GetParam()}};
    EXPECT_EQ(sim::UnifiedLog(), expected);
}

TEST_P(AllowedLinkPath, IsMatchedExactly) {
    for (const std::string& path : {GetParam() + "x",
                                    GetParam() + "/",
                                    "/" + GetParam(),
                                    GetParam().substr(0, GetParam().size() - 1),
                                    GetParam().substr(1)}) {
        EXPECT_FALSE(IsAllowedLinkPath(path.c_str())) << path;
    }
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

TEST_P(AllowedLinkPath, IsRefusedWhereADirectoryStands) {
    sim::MakeDirectory(GetParam());
    EXPECT_FALSE(IsAllowedLinkPath(GetParam().c_str()));
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

INSTANTIATE_TEST_SUITE_P(Of32, AllowedLinkPath, testing::ValuesIn(AllAllowedPaths()));

class NearMiss : public testing::TestWithParam<const char*> {
protected:
    NearMiss() { sim::Reset(); }
};

TEST_P(NearMiss, IsRefusedWithoutALine) {
    EXPECT_FALSE(IsAllowedLinkPath(GetParam()));
    EXPECT_TRUE(sim::UnifiedLog().empty());
}

INSTANTIATE_TEST_SUITE_P(
    Of48,
    NearMiss,
    testing::Values("",
                    "/",
                    "/var/mobile",
                    "/var/mobile/Library",
                    "/var/mobile/Library/",
                    "/var/mobile/Library/Preferences",
                    "/var/mobile/Library/Preferences/",
                    "/private/var/mobile/Library/Preferences",
                    "/private/var/mobile/Library/Preferences/",
                    "/var/mobile/Library/Preferences/com.vendra.carrier",
                    "/var/mobile/Library/Preferences/com.vendra.carrier.plist ",
                    "/var/mobile/Library/Preferences/com.vendra.carrier.plist\n",
                    "/var/mobile/Library/Preferences/com.vendra.carrier.plist.tmp",
                    "/var/mobile/Library/Preferences/com.vendra.carrier.plists",
                    "/var/mobile/Library/Preferences/com.vendra.carrier.PLIST",
                    "/var/mobile/Library/Preferences/com.vendra.carrier_0.plist",
                    "/var/mobile/Library/Preferences/com.vendra.carrier_3.plist",
                    "/var/mobile/Library/Preferences/com.vendra.carrier1.plist",
                    "/var/mobile/Library/Preferences/com.vendra.carrier_12.plist",
                    "/var/mobile/Library/Preferences/com.vendra.operator_0.plist",
                    "/var/mobile/Library/Preferences/com.vendra.operator_3.plist",
                    "/var/mobile/Library/Preferences/com.vendra.operator.default.plist",
                    "/var/mobile/Library/Preferences/com.vendra.operator.bootstrap.plist",
                    "/var/mobile/Library/Preferences/com.vendra.default.plist",
                    "/var/mobile/Library/Preferences/com.vendra.lasd.plist",
                    "/var/mobile/Library/Preferences/Com.vendra.carrier.plist",
                    "/var/mobile/Library/Preferences//com.vendra.carrier.plist",
                    "/var/mobile/Library/Preferences/./com.vendra.carrier.plist",
                    "/var/mobile/Library/Preferences/../Preferences/com.vendra.carrier.plist",
                    "/var/mobile//Library/Preferences/com.vendra.carrier.plist",
                    "/var/mobile/Library/com.vendra.carrier.plist",
                    "/var/mobile/Preferences/com.vendra.carrier.plist",
                    "/var/root/Library/Preferences/com.vendra.carrier.plist",
                    "/Library/Preferences/com.vendra.carrier.plist",
                    "var/mobile/Library/Preferences/com.vendra.carrier.plist",
                    "/private/private/var/mobile/Library/Carrier Bundle.bundle",
                    "/private/var/mobile2/Library/Carrier Bundle.bundle",
                    "/var/mobile/Library/CarrierBundle.bundle",
                    "/var/mobile/Library/Carrier 1Bundle.bundle",
                    "/var/mobile/Library/Carrier1 Bundle.bundle",
                    "/var/mobile/Library/Carrier3Bundle.bundle",
                    "/var/mobile/Library/Carrier Bundle.Bundle",
                    "/var/mobile/Library/carrier bundle.bundle",
                    "/var/mobile/Library/OperatorBundle.bundle",
                    "/var/mobile/Library/Operator 2Bundle.bundle",
                    "/var/mobile/Library/Operator3Bundle.bundle",
                    "/var/mobile/Library/Carrier Default.bundle",
                    "/var/mobile/Library/OperatorDefault.bundle"));

struct Kind {
    const char* name;
    std::uint32_t type;
    bool isAdmitted;
};

class AllowedLinkPathWhere : public testing::TestWithParam<Kind> {};

TEST_P(AllowedLinkPathWhere, SomethingStandsGoesByTheBitsOfItsMode) {
    sim::Reset();
    sim::MakeFile(kLink, {.mode = GetParam().type | 0644});
    EXPECT_EQ(IsAllowedLinkPath(kLink), GetParam().isAdmitted);
    EXPECT_EQ(sim::UnifiedLog().size(), GetParam().isAdmitted ? 1U : 0U);
    EXPECT_EQ(sim::JournalCount(std::string("PathAccess.lstat ") + kLink), 1U);
}

INSTANTIATE_TEST_SUITE_P(EachKind,
                         AllowedLinkPathWhere,
                         testing::Values(Kind{"directory", sim::kDirectory, false},
                                         Kind{"fifo", sim::kFifo, false},
                                         Kind{"file", sim::kRegular, true},
                                         Kind{"link", sim::kLink, true},
                                         Kind{"socket", sim::kSocket, true},
                                         Kind{"characterDevice", sim::kCharacterDevice, true},
                                         Kind{"blockDevice", sim::kBlockDevice, true}),
                         [](const auto& test) { return test.param.name; });

TEST(AllowedLinkPathRule, IsNotDecidedByAnLstatThatFails) {
    sim::Reset();
    sim::MakeDirectory(kLink);
    sim::FailCall("PathAccess.lstat", 1);
    EXPECT_TRUE(IsAllowedLinkPath(kLink));
}

TEST(AllowedLinkPathRule, LooksAtADirectoryBehindALinkAsALink) {
    sim::Reset();
    sim::MakeDirectory("/tmp/bundle");
    sim::MakeLink(kLink, "/tmp/bundle");
    EXPECT_TRUE(IsAllowedLinkPath(kLink));
}

// The carrier rule.

class AllowedCarrierPath : public testing::Test {
protected:
    AllowedCarrierPath() { sim::Reset(); }

    static std::vector<sim::LogLine> refusal(const std::string& path) {
        return {{LogLevel::kError,
                 "NOT Allowing path " + path + " as it isn't within the wild card directories:"},
                {LogLevel::kError, "/var/mobile/Library/Carrier Bundles/"},
                {LogLevel::kError, "/private/var/mobile/Library/Carrier Bundles"}};
    }

    static void expectAdmittedWithin(const std::string& path, const std::string& directory) {
        sim::ClearLogs();
        EXPECT_TRUE(IsAllowedCarrierPath(path.c_str())) << path;
        const std::vector<sim::LogLine> expected{
            {LogLevel::kInfo, "Allowing path " + path + " within " + directory}};
        EXPECT_EQ(sim::UnifiedLog(), expected);
    }

    static void expectRefused(const std::string& path) {
        sim::ClearLogs();
        EXPECT_FALSE(IsAllowedCarrierPath(path.c_str())) << path;
        EXPECT_EQ(sim::UnifiedLog(), refusal(path));
    }

    static void expectArchive(const std::string& path) {
        sim::ClearLogs();
        EXPECT_TRUE(IsAllowedCarrierPath(path.c_str())) << path;
        EXPECT_EQ(sim::UnifiedLog(), refusal(path));
    }
};

TEST_F(AllowedCarrierPath, IsAnythingBelowTheBundlesOfTheHome) {
    const std::string directory = "/var/mobile/Library/Carrier Bundles/";
    for (const char* rest : {"", "x", "x/y.bundle", "../../../../etc/passwd", "./", "/"}) {
        expectAdmittedWithin(directory + rest, directory);
    }
}

TEST_F(AllowedCarrierPath, NeedsTheSlashBehindTheBundlesOfTheHome) {
    expectRefused("/var/mobile/Library/Carrier Bundles");
    expectRefused("/var/mobile/Library/Carrier Bundlesx");
    expectRefused("/var/mobile/Library/Carrier BundlesOld/x");
}

TEST_F(AllowedCarrierPath, IsAnythingThatBeginsLikeThePrivateBundles) {
    const std::string directory = "/private/var/mobile/Library/Carrier Bundles";
    for (const char* rest : {"", "/", "/x", "x", "Old/x", "/../../../../../etc/passwd"}) {
        expectAdmittedWithin(directory + rest, directory);
    }
}

TEST_F(AllowedCarrierPath, BeginsAtTheFirstByte) {
    expectRefused("x/var/mobile/Library/Carrier Bundles/x");
    expectRefused("//private/var/mobile/Library/Carrier Bundles/x");
    expectRefused("/mnt/private/var/mobile/Library/Carrier Bundles/x");
    expectRefused("/tm/private/var/mobile/Library/Carrier Bundles/x");
    expectRefused("");
}

TEST_F(AllowedCarrierPath, MayBeOfAnyLengthOnceItBeginsRight) {
    const std::string directory = "/var/mobile/Library/Carrier Bundles/";
    expectAdmittedWithin(directory + std::string(987, 'x'), directory);
    expectRefused(std::string(1023, 'x'));
}

TEST_F(AllowedCarrierPath, IsAnArchiveBelowTmpThoughTheRefusalIsLoggedFirst) {
    for (const char* path : {"/tmp/a.crbn",
                             "/tmp/.crbn",
                             "/tmp.crbn",
                             "/tmpx/a.crbn",
                             "/tmp/deep/er/a.crbn",
                             "/tmp/../etc/a.crbn",
                             "/tmpfile.crbn",
                             "/tmp/tmp/a.crbn"}) {
        expectArchive(path);
    }
}

TEST_F(AllowedCarrierPath, IsNoArchiveUnderAnotherNameOrPlace) {
    for (const char* path : {"/tmp",
                             "/tmp/",
                             "/tmp/a",
                             "/tmp/a.crbnx",
                             "/tmp/a.crb",
                             "/tmp/a.CRBN",
                             "/tmp/a.crbn/",
                             "/tmp/a.crbn.crbn",
                             "/tmp/a.crbn/b.crbn",
                             "/private/tmp/a.crbn",
                             "/var/tmp/a.crbn",
                             "/tm/a.crbn",
                             "tmp/a.crbn",
                             "//tmp/a.crbn",
                             "/x/tmp/a.crbn"}) {
        expectRefused(path);
    }
}

TEST_F(AllowedCarrierPath, FindsAnArchivesExtensionWithinTheFirst1024BytesOnly) {
    expectArchive("/tmp/" + std::string(1014, 'a') + ".crbn");
    expectRefused("/tmp/" + std::string(1015, 'a') + ".crbn");
}

TEST_F(AllowedCarrierPath, IsRefusedWhereADirectoryStandsAtALinkPath) {
    sim::MakeDirectory(kLink);
    expectRefused(kLink);
}

}  // namespace
