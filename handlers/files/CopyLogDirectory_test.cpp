#include "handlers/files/FileTest.h"

namespace {

constexpr const char* kReports = "/var/mobile/Library/Logs/CrashReporter/";

class CopyLogDirectory : public FileRoutine {
protected:
    kern_return_t call(std::string_view source) {
        auto sourceField = Field256(source);
        return server_LFMobileHelperCopyLogDirectory(7, sourceField, isDone);
    }

    static std::string in(const std::string& name) { return kReports + name; }

    std::int32_t isDone = 7;
};

TEST_F(CopyLogDirectory, PutsTheFolderInsideUnderItsOwnName) {
    EXPECT_EQ(call("/logs/folder"), 0);
    EXPECT_EQ(isDone, 1);
    EXPECT_EQ(contentsAt(in("folder/inner")), "in");
    EXPECT_EQ(sim::FileAt(in("folder"))->owner, 0U) << "the service's own";
    EXPECT_EQ(contentsAt("/logs/folder/inner"), "in");
}

TEST_F(CopyLogDirectory, LogsBothPathsAndNothingElse) {
    EXPECT_EQ(call("/logs/folder"), 0);
    EXPECT_EQ(sim::SystemLogLines(),
              SystemLines{Notice("'/logs/folder', '/var/mobile/Library/Logs/CrashReporter/'\n")});
    EXPECT_TRUE(sim::UnifiedLog().empty()) << "the source is not policed";
}

TEST_F(CopyLogDirectory, MakesTheReportFolderOfTheSourceWhenThereIsNone) {
    sim::RemoveFile("/private/var/mobile/Library/Logs/CrashReporter");
    EXPECT_EQ(call("/logs/folder"), 0);
    EXPECT_EQ(isDone, 1);
    EXPECT_EQ(contentsAt(in("inner")), "in");
}

TEST_F(CopyLogDirectory, SaysWhyNotByANotice) {
    EXPECT_EQ(call("/nowhere"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(sim::SystemLogLines(),
              (SystemLines{Notice("'/nowhere', '/var/mobile/Library/Logs/CrashReporter/'\n"),
                           Notice("Failed to copy the directory /nowhere to "
                                  "/var/mobile/Library/Logs/CrashReporter/. Error: -1\n")}));
}

TEST_F(CopyLogDirectory, TellsTheFailureOfTheCopy) {
    sim::RemoveFile("/private/var/mobile/Library/Logs/CrashReporter");
    sim::FailCall("FileManager.copyItem", 1);
    EXPECT_EQ(call("/logs/folder"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(sim::SystemLogLines().back(),
              Notice("Failed to copy the directory /logs/folder to "
                     "/var/mobile/Library/Logs/CrashReporter/. Error: 28\n"));
}

TEST_F(CopyLogDirectory, RefusesADirectoryOverAFile) {
    sim::RemoveFile("/private/var/mobile/Library/Logs/CrashReporter");
    sim::MakeFile("/private/var/mobile/Library/Logs/CrashReporter",
                  {.mode = sim::kRegular | 0644, .contents = "old"});
    EXPECT_EQ(call("/logs/folder"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(contentsAt("/private/var/mobile/Library/Logs/CrashReporter"), "old");
}

TEST_F(CopyLogDirectory, CutsTheLastByteOfAFullField) {
    EXPECT_EQ(call(std::string(256, 'a')), 0);
    EXPECT_EQ(sim::SystemLogLines().front(),
              Notice("'" + std::string(255, 'a') + "', '" + kReports + "'\n"));
}

TEST_F(CopyLogDirectory, TellsTheTruthAtEveryFailure) {
    ExpectTrueFlagAtEveryFailure(
        [] {
            makePhone();
            sim::RemoveFile("/private/var/mobile/Library/Logs/CrashReporter");
        },
        [this] { return call("/logs/folder"); },
        isDone,
        [] { return contentsAt(in("inner")) == "in"; });
}

}  // namespace
