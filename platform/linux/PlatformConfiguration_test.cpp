#include "platform/linux/PlatformConfiguration.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "tests/location/Configuration.h"
#include "tests/support/PhoneRoot.h"

using platform::PlatformConfigurationText;

namespace {

namespace fs = std::filesystem;

class PlatformConfiguration : public testing::Test {
protected:
    PlatformConfiguration() { configuration::Write({{"CountryCode", "GB"}}); }

    ~PlatformConfiguration() override { configuration::Remove(); }

    static std::string countryCode() {
        return PlatformConfigurationText("CountryCode").value_or("none");
    }
};

TEST_F(PlatformConfiguration, IsReadEachTime) {
    EXPECT_EQ(countryCode(), "GB");
    configuration::Write({{"CountryCode", "FR"}});
    EXPECT_EQ(countryCode(), "FR");
    configuration::Remove();
    EXPECT_EQ(countryCode(), "none");
}

TEST_F(PlatformConfiguration, KnowsTextsAlone) {
    EXPECT_EQ(PlatformConfigurationText("StunServer"), std::nullopt);
    configuration::WriteText(
        "<plist><dict><key>CountryCode</key><integer>49</integer></dict></plist>");
    EXPECT_EQ(countryCode(), "none");
    configuration::WriteText("<plist><dict><key>CountryCode</key><string></string></dict></plist>");
    EXPECT_EQ(countryCode(), "none");
}

TEST_F(PlatformConfiguration, CountsAsAbsentWhenOthersCouldHaveWrittenIt) {
    auto journal = phone::LogReader::journal();
    ASSERT_EQ(chmod(configuration::kPath, 0664), 0);
    EXPECT_EQ(countryCode(), "none");
    ASSERT_EQ(chmod(configuration::kPath, 0644), 0);
    ASSERT_EQ(chown(configuration::kPath, 501, 501), 0);
    EXPECT_EQ(countryCode(), "none");
    ASSERT_EQ(chown(configuration::kPath, 0, 0), 0);
    ASSERT_EQ(chmod("/etc/linefold", 0777), 0);
    EXPECT_EQ(countryCode(), "none");
    ASSERT_EQ(chmod("/etc/linefold", 0755), 0);
    EXPECT_EQ(countryCode(), "GB");
    EXPECT_EQ(journal.take().size(), 3U) << "one line each time";
}

TEST_F(PlatformConfiguration, CountsAsAbsentWhenItIsNoRegularFile) {
    configuration::Remove();
    ASSERT_EQ(mkfifo(configuration::kPath, 0644), 0);
    EXPECT_EQ(countryCode(), "none");
    configuration::Remove();
    fs::create_directory(configuration::kPath);
    EXPECT_EQ(countryCode(), "none");
    configuration::Remove();
    fs::create_symlink("/etc/passwd", configuration::kPath);
    EXPECT_EQ(countryCode(), "none");
}

TEST_F(PlatformConfiguration, CountsAsAbsentWhenItIsNoDictionary) {
    for (const char* const text : {"", "CountryCode=GB", "<plist><array/></plist>", "bplist00"}) {
        configuration::WriteText(text);
        EXPECT_EQ(countryCode(), "none") << text;
    }
}

TEST_F(PlatformConfiguration, CountsAsAbsentBeyond64KiB) {
    const std::string start =
        "<plist><dict><key>CountryCode</key><string>GB</string></dict></plist>";
    configuration::WriteText(start + std::string((64 << 10) - start.size(), '\n'));
    EXPECT_EQ(countryCode(), "GB");
    configuration::WriteText(start + std::string((64 << 10) - start.size() + 1, '\n'));
    EXPECT_EQ(countryCode(), "none");
}

}  // namespace
