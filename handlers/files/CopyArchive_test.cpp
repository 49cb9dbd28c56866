#include <cerrno>

#include "handlers/files/FileTest.h"
#include "platform/sim/SimArchives.h"

using platform::PropertyList;

namespace {

const sim::SystemLogLine kFatal = Error("MIRCopier signaled fatal file error");

class CopyArchive : public testing::Test {
protected:
    CopyArchive() { sim::Reset(); }

    ~CopyArchive() override { EXPECT_EQ(sim::ArchiveCopiers(), 0U) << "each copier is freed"; }

    kern_return_t call(std::string_view source = "/a.crbn", std::string_view destination = "/out") {
        auto sourceField = Field256(source);
        auto destinationField = Field256(destination);
        return server_LFMobileHelperCopyArchive(7, sourceField, destinationField, isDone);
    }

    static std::vector<sim::SystemLogLine> logged() { return sim::SystemLogLines(); }

    std::int32_t isDone = 7;
};

TEST_F(CopyArchive, CopiesWithAllThreeOptions) {
    sim::ProvideArchive("/a.crbn");
    EXPECT_EQ(call(), 0);
    EXPECT_EQ(isDone, 1);
    ASSERT_EQ(sim::ArchiveCopies().size(), 1U);
    EXPECT_EQ(sim::ArchiveCopies()[0].source, "/a.crbn");
    EXPECT_EQ(sim::ArchiveCopies()[0].destination, "/out");
    EXPECT_EQ(sim::ArchiveCopies()[0].options,
              PropertyList(PropertyList::Dictionary{{"extractPKZip", PropertyList(true)},
                                                    {"copyExtendedAttributes", PropertyList(true)},
                                                    {"copyResources", PropertyList(true)}}));
}

TEST_F(CopyArchive, LogsNothingWhenNothingIsWrong) {
    sim::ProvideArchive("/a.crbn");
    EXPECT_EQ(call(), 0);
    EXPECT_TRUE(logged().empty());
    EXPECT_TRUE(sim::UnifiedLog().empty()) << "no path is policed";
}

TEST_F(CopyArchive, IsNotDoneWithoutACopier) {
    sim::RemoveArchiveCopier();
    EXPECT_EQ(call(), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_TRUE(sim::ArchiveCopies().empty());
    EXPECT_TRUE(logged().empty());
}

TEST_F(CopyArchive, SkipsFilesThatFail) {
    sim::ProvideArchive("/a.crbn", {.failing = {{"../x", EPERM}, {"y", EILSEQ}}});
    EXPECT_EQ(call(), 0);
    EXPECT_EQ(isDone, 1);
    EXPECT_TRUE(logged().empty());
}

TEST_F(CopyArchive, SaysThatAnErrorWasFatal) {
    sim::ProvideArchive("/a.crbn", {.failing = {{"y", EILSEQ}}, .fatal = EFBIG});
    EXPECT_EQ(call(), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(logged(), std::vector{kFatal});
}

TEST_F(CopyArchive, IsNotDoneWithoutASource) {
    EXPECT_EQ(call("/nowhere"), 0);
    EXPECT_EQ(isDone, 0);
    EXPECT_EQ(logged(), std::vector{kFatal});
}

TEST_F(CopyArchive, TakesAllBytesOfItsFields) {
    const std::string full(256, 'a');
    sim::ProvideArchive(full);
    EXPECT_EQ(call(full, full), 0);
    EXPECT_EQ(isDone, 1);
    EXPECT_EQ(sim::ArchiveCopies()[0].destination, full);
}

TEST_F(CopyArchive, AnswersAtEveryFailure) {
    sim::ProvideArchive("/a.crbn");
    for (const char* name : {"MIRCopierNew", "MIRCopierCopyWithOptions"}) {
        sim::FailCall(name, 1);
        isDone = 7;
        EXPECT_EQ(call(), 0);
        EXPECT_EQ(isDone, 0);
        EXPECT_EQ(sim::FailedCall(), name);
    }
}

}  // namespace
