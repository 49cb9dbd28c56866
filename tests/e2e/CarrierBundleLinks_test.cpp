// Routines 9, 10 and 11 through the real daemon, on real files, with both logs read back.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "tests/support/PhoneRoot.h"

namespace fs = std::filesystem;

namespace {

constexpr std::int32_t kLinkCarrierBundle = 8683558;
constexpr std::int32_t kCreateSymlink = 8683559;
constexpr std::int32_t kRemovePreferenceDomain = 8683560;

using Lines = std::vector<std::string>;

class CarrierBundleLinks : public testing::Test {
protected:
    CarrierBundleLinks() { phone::ResetMobileHome(); }

    [[nodiscard]] static std::string library(const char* name) {
        return std::string(phone::kMobileLibrary) + "/" + name;
    }

    phone::Daemon daemon_;
    phone::Client client_ = phone::Client::checkIn();
    phone::LogReader journal_ = phone::LogReader::journal();
    phone::LogReader systemLog_ = phone::LogReader::systemLog();
};

TEST_F(CarrierBundleLinks, LinkIsReplacedAndLogged) {
    const auto link = library("Carrier Bundle.bundle");
    fs::create_symlink("/old", link);
    EXPECT_EQ(client_.callTexts(kLinkCarrierBundle, {"/Library/new", link, "com.vendra.carrier"}),
              0);
    EXPECT_EQ(fs::read_symlink(link), "/Library/new");
    EXPECT_EQ(journal_.take(),
              (Lines{"6 - " + link + " is within allowed path " + link,
                     "6 - linkpath: " + link + ", domain: com.vendra.carrier"}));
    EXPECT_EQ(systemLog_.take(), Lines{});
}

TEST_F(CarrierBundleLinks, LinkIsAllowedInBothSpellingsOfTheHome) {
    const std::string link = "/var/mobile/Library/Carrier2Bundle.bundle";
    EXPECT_EQ(client_.callTexts(kLinkCarrierBundle, {"/a", link, ""}), 0);
    EXPECT_EQ(fs::read_symlink(library("Carrier2Bundle.bundle")), "/a");
    EXPECT_EQ(journal_.take(),
              (Lines{"6 - " + link + " is within allowed path " + link,
                     "6 - linkpath: " + link + ", domain: "}));
}

TEST_F(CarrierBundleLinks, LinkReplacesARegularFile) {
    const auto link = library("Operator Bundle.bundle");
    std::ofstream(link) << "file";
    EXPECT_EQ(client_.callTexts(kLinkCarrierBundle, {"../relative target", link, ""}), 0);
    EXPECT_EQ(fs::read_symlink(link), "../relative target");
}

TEST_F(CarrierBundleLinks, LinkOntoADirectoryIsRefused) {
    const auto link = library("Carrier1Bundle.bundle");
    fs::create_directory(link);
    EXPECT_EQ(client_.callTexts(kLinkCarrierBundle, {"/a", link, "com.vendra.carrier_1"}), 8);
    EXPECT_TRUE(fs::is_directory(link));
    EXPECT_EQ(journal_.take(), Lines{"3 - Cannot remove symlink: " + link});
}

TEST_F(CarrierBundleLinks, LinkElsewhereIsRefused) {
    EXPECT_EQ(client_.callTexts(kLinkCarrierBundle, {"/a", "/run/elsewhere", ""}), 8);
    EXPECT_FALSE(fs::exists(fs::symlink_status("/run/elsewhere")));
    EXPECT_EQ(journal_.take(), Lines{"3 - Cannot remove symlink: /run/elsewhere"});
}

TEST_F(CarrierBundleLinks, LinkInAMissingFolderFails) {
    fs::remove_all(phone::kMobileLibrary);
    const auto link = library("Carrier Bundle.bundle");
    EXPECT_EQ(client_.callTexts(kLinkCarrierBundle, {"/a", link, "com.vendra.carrier"}), 5);
    EXPECT_EQ(journal_.take(), Lines{"6 - " + link + " is within allowed path " + link});
}

TEST_F(CarrierBundleLinks, EmptyTargetFailsAndTheOldLinkIsGone) {
    const auto link = library("CarrierDefault.bundle");
    fs::create_symlink("/old", link);
    EXPECT_EQ(client_.callTexts(kLinkCarrierBundle, {"", link, ""}), 5);
    EXPECT_FALSE(fs::exists(fs::symlink_status(link)));
}

TEST_F(CarrierBundleLinks, FullFieldIsCutToOneByteLess) {
    const std::string full(1024, 't');
    const auto link = library("CarrierBootstrap.bundle");
    EXPECT_EQ(client_.callTexts(kLinkCarrierBundle, {full, link, ""}), 0);
    EXPECT_EQ(fs::read_symlink(link), std::string(1023, 't'));
}

TEST_F(CarrierBundleLinks, TextThatForgesALogLineIsEscaped) {
    EXPECT_EQ(client_.callTexts(kLinkCarrierBundle, {"/a", "/x\nPRIORITY=0\x7f\xff", ""}), 8);
    EXPECT_EQ(journal_.take(),
              Lines{"3 - Cannot remove symlink: /x\\\\x0aPRIORITY=0\\\\x7f\\\\xff"});
}

TEST_F(CarrierBundleLinks, LinkAttackLeadsNowhere) {
    fs::create_directories("/private/links-canary");
    std::ofstream("/private/links-canary/Carrier Bundle.bundle") << "canary";
    fs::remove_all(phone::kMobileLibrary);
    fs::create_symlink("/private/links-canary", phone::kMobileLibrary);
    ASSERT_EQ(lchown(phone::kMobileLibrary, phone::kMobileUser, phone::kMobileUser), 0);
    EXPECT_EQ(client_.callTexts(kLinkCarrierBundle, {"/a", library("Carrier Bundle.bundle"), ""}),
              5);
    EXPECT_TRUE(fs::is_regular_file("/private/links-canary/Carrier Bundle.bundle"));
    fs::remove(phone::kMobileLibrary);
}

TEST_F(CarrierBundleLinks, SymlinkNeedsNoPolicyAndSaysNothing) {
    std::ofstream("/run/anything") << "file";
    EXPECT_EQ(client_.callTexts(kCreateSymlink, {"/target", "/run/anything"}), 0);
    EXPECT_EQ(fs::read_symlink("/run/anything"), "/target");
    EXPECT_EQ(journal_.take(), Lines{});
    EXPECT_EQ(systemLog_.take(), Lines{});
}

TEST_F(CarrierBundleLinks, SymlinkReplacesAnEmptyFolderAndNoFullOne) {
    fs::create_directories("/run/empty");
    fs::create_directories("/run/full/inside");
    EXPECT_EQ(client_.callTexts(kCreateSymlink, {"/target", "/run/empty"}), 0);
    EXPECT_EQ(client_.callTexts(kCreateSymlink, {"/target", "/run/full"}), 5);
    EXPECT_TRUE(fs::is_directory("/run/full/inside"));
}

TEST_F(CarrierBundleLinks, SymlinkOfAFullFieldIsCut) {
    const std::string path = "/run/" + std::string(1019, 'p');
    EXPECT_EQ(client_.callTexts(kCreateSymlink, {"/target", path}), 5) << "the name is too long";
    EXPECT_EQ(client_.callTexts(kCreateSymlink, {std::string(1024, 't'), "/run/long"}), 0);
    EXPECT_EQ(fs::read_symlink("/run/long").string().size(), 1023U);
}

TEST_F(CarrierBundleLinks, DomainFileIsRemovedAndLogged) {
    const auto file = library("Preferences/com.vendra.carrier_2.plist");
    std::ofstream(file) << "plist";
    EXPECT_EQ(client_.callTexts(kRemovePreferenceDomain, {file, "com.vendra.carrier_2"}), 0);
    EXPECT_FALSE(fs::exists(file));
    EXPECT_EQ(systemLog_.take(), Lines{"5 3 Removing domain: com.vendra.carrier_2\\n"});
    EXPECT_EQ(journal_.take(), Lines{"6 - " + file + " is within allowed path " + file});
}

TEST_F(CarrierBundleLinks, RefusedDomainFileIsLoggedAndFlushedFirst) {
    EXPECT_EQ(client_.callTexts(kRemovePreferenceDomain, {"/etc/passwd", "com.vendra.carrier"}), 8);
    EXPECT_TRUE(fs::exists("/etc/passwd"));
    EXPECT_EQ(systemLog_.take(), Lines{"5 3 Removing domain: com.vendra.carrier\\n"});
    EXPECT_EQ(
        journal_.take(),
        (Lines{"3 - NOT Allowing path /etc/passwd as it isn't within the wild card directories:",
               "3 - /var/mobile/Library/Carrier Bundles/",
               "3 - /private/var/mobile/Library/Carrier Bundles"}));
}

TEST_F(CarrierBundleLinks, EmptyDomainIsNeitherLoggedNorFlushed) {
    const auto file = library("Carrier Bundles/old.plist");
    std::ofstream(file) << "plist";
    EXPECT_EQ(client_.callTexts(kRemovePreferenceDomain, {file, ""}), 0);
    EXPECT_FALSE(fs::exists(file));
    EXPECT_EQ(systemLog_.take(), Lines{});
    EXPECT_EQ(
        journal_.take(),
        Lines{"6 - Allowing path " + file + " within /private/var/mobile/Library/Carrier Bundles"});
}

TEST_F(CarrierBundleLinks, MissingDomainFileFails) {
    const auto file = library("Preferences/com.vendra.operator.plist");
    EXPECT_EQ(client_.callTexts(kRemovePreferenceDomain, {file, ""}), 5);
}

TEST_F(CarrierBundleLinks, TemporaryArchiveIsRemovedDespiteTheErrorLines) {
    std::ofstream("/tmp/new.crbn") << "archive";
    EXPECT_EQ(client_.callTexts(kRemovePreferenceDomain, {"/tmp/new.crbn", ""}), 0);
    EXPECT_FALSE(fs::exists("/tmp/new.crbn"));
    EXPECT_EQ(
        journal_.take(),
        (Lines{"3 - NOT Allowing path /tmp/new.crbn as it isn't within the wild card directories:",
               "3 - /var/mobile/Library/Carrier Bundles/",
               "3 - /private/var/mobile/Library/Carrier Bundles"}));
}

}  // namespace
