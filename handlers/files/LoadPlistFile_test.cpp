#include "handlers/files/FileTest.h"
#include "platform/PropertyList.h"
#include "platform/VirtualMemory.h"

using platform::LogLevel;
using platform::PropertyList;

namespace {

const sim::LogLine kLoading{LogLevel::kInfo, "Loading /file as plist"};
const sim::LogLine kNoData{LogLevel::kError, "Could not create data representation of dictionary"};

std::string Text(const std::vector<std::byte>& bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

class LoadPlistFile : public testing::Test {
protected:
    using Lines = std::vector<sim::LogLine>;

    LoadPlistFile() { sim::Reset(); }

    ~LoadPlistFile() override {
        platform::vm_deallocate(reply.address, reply.count);
        EXPECT_EQ(sim::AllocatedMemory(), 0U);
    }

    kern_return_t call(std::string_view path = "/file") {
        auto field = Field256(path);
        return server_LFMobileHelperLoadPlistFile(7, field, reply);
    }

    static void store(std::string contents) {
        sim::MakeFile("/file", {.mode = sim::kRegular | 0644, .contents = std::move(contents)});
    }

    [[nodiscard]] std::string loaded() const {
        return {static_cast<const char*>(reply.address), reply.count};
    }

    void expectNothing() const {
        EXPECT_EQ(reply.address, nullptr);
        EXPECT_EQ(reply.count, 0U);
    }

    OutOfLineData reply;
    const PropertyList list{PropertyList::Dictionary{{"key", PropertyList("value")},
                                                     {"a", PropertyList(std::int64_t{1})}}};
};

TEST_F(LoadPlistFile, GivesTheDictionaryAsXml) {
    for (const auto& bytes :
         {PropertyListCreateXmlData(list), PropertyListCreateBinaryData(list)}) {
        store(Text(*bytes));
        EXPECT_EQ(call(), 0);
        EXPECT_EQ(loaded(), Text(*PropertyListCreateXmlData(list)));
        platform::vm_deallocate(reply.address, reply.count);
    }
    reply = {};
}

TEST_F(LoadPlistFile, LogsThePathAndNothingElse) {
    store(Text(*PropertyListCreateXmlData(list)));
    EXPECT_EQ(call(), 0);
    EXPECT_EQ(sim::UnifiedLog(), Lines{kLoading});
    EXPECT_TRUE(sim::SystemLogLines().empty());
}

TEST_F(LoadPlistFile, AnswersNineWithoutADictionary) {
    const auto array = PropertyListCreateXmlData(PropertyList(PropertyList::Array{list}));
    for (const std::string& contents : {std::string(), std::string("junk"), Text(*array)}) {
        store(contents);
        sim::ClearLogs();
        EXPECT_EQ(call(), 9);
        EXPECT_EQ(sim::UnifiedLog(), (Lines{kLoading, kNoData}));
        expectNothing();
    }
}

TEST_F(LoadPlistFile, AnswersNineForWhatIsNoRegularFile) {
    reply = {.address = this, .count = 7};
    EXPECT_EQ(call("/nowhere"), 9);
    expectNothing();
    sim::MakeFile("/file", {.mode = sim::kFifo | 0666});
    EXPECT_EQ(call(), 9);
    EXPECT_EQ(call("/"), 9);
    EXPECT_EQ(call(""), 9);
}

TEST_F(LoadPlistFile, SaysThatThereIsNoMemory) {
    const auto bytes = PropertyListCreateXmlData(list);
    store(Text(*bytes));
    sim::FailCall("vm_allocate", 1);
    EXPECT_EQ(call(), 3);
    const std::string size = std::to_string(bytes->size());
    EXPECT_EQ(
        sim::UnifiedLog(),
        (Lines{kLoading, {LogLevel::kError, "Could not allocate " + size + " bytes for payload"}}));
    expectNothing();
}

TEST_F(LoadPlistFile, TakesAllBytesOfItsField) {
    EXPECT_EQ(call(std::string(256, 'a')), 9);
    EXPECT_EQ(sim::UnifiedLog()[0].text, "Loading " + std::string(256, 'a') + " as plist");
}

TEST_F(LoadPlistFile, AnswersAtEveryFailure) {
    store(Text(*PropertyListCreateXmlData(list)));
    for (unsigned n = 1;; ++n) {
        sim::FailCall(n);
        const auto code = call();
        if (sim::FailedCall().empty()) {
            EXPECT_EQ(code, 0);
            EXPECT_GT(n, 2U);
            return;
        }
        EXPECT_EQ(code, sim::FailedCall() == "vm_allocate" ? 3 : 9) << sim::FailedCall();
        expectNothing();
    }
}

}  // namespace
