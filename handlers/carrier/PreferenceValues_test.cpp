#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/PropertyList.h"
#include "platform/VirtualMemory.h"
#include "platform/sim/Sim.h"

using platform::PropertyList;
using platform::SystemLogPriority;

namespace {

using SystemLines = std::vector<sim::SystemLogLine>;

constexpr std::string_view kDomain = "com.vendra.carrier";
constexpr std::string_view kNotUtf8 = "\xff";

String256 Field256(std::string_view text) {
    std::array<std::byte, 256> bytes{};
    std::memcpy(bytes.data(), text.data(), text.size());
    return String256(bytes);
}

kern_return_t Set(std::string_view domain, std::string_view key, std::string_view value) {
    auto domainField = Field256(domain);
    auto keyField = Field256(key);
    return server_LFMobileHelperSetPreferenceValue(
        7, domainField, keyField, std::as_bytes(std::span(value)));
}

using CopyHandler = kern_return_t (*)(mach_port_t, String256&, String256&, OutOfLineData&);

struct Copied {
    kern_return_t code = 0;
    std::string xml;
    bool isAbsent = false;
};

Copied Copy(CopyHandler handler, std::string_view domain, std::string_view key) {
    auto domainField = Field256(domain);
    auto keyField = Field256(key);
    OutOfLineData data{.address = &domainField, .count = 1};
    const auto code = handler(7, domainField, keyField, data);
    if (code != 0 || data.address == nullptr) {
        return {.code = code, .xml = {}, .isAbsent = data.address == nullptr && data.count == 0};
    }
    std::string xml(static_cast<const char*>(data.address), data.count);
    platform::vm_deallocate(data.address, data.count);
    return {.code = code, .xml = xml};
}

PropertyList Entries(std::string_view key, const char* value) {
    return PropertyList(PropertyList::Dictionary{{std::string(key), PropertyList(value)}});
}

std::string XmlOf(const PropertyList& value) {
    const auto bytes = platform::PropertyListCreateXmlData(value);
    return {reinterpret_cast<const char*>(bytes->data()), bytes->size()};
}

class SetPreferenceValue : public testing::Test {
protected:
    SetPreferenceValue() { sim::Reset(); }
};

TEST_F(SetPreferenceValue, StoresAPropertyList) {
    EXPECT_EQ(Set(kDomain, "key", "<plist><integer>7</integer></plist>"), 0);
    const auto stored = sim::StoredPreferences(kDomain);
    ASSERT_NE(stored.find("key"), nullptr);
    EXPECT_EQ(*stored.find("key"), PropertyList(std::int64_t{7}));
    EXPECT_TRUE(sim::JournalHasInOrder({"PreferencesSetValue", "PreferencesSynchronize"}));
}

TEST_F(SetPreferenceValue, OfOneByteRemovesTheKeyWhateverTheByte) {
    for (const std::string_view byte : {std::string_view("\0", 1), std::string_view("x")}) {
        sim::StorePreferences(kDomain, Entries("key", "value"));
        EXPECT_EQ(Set(kDomain, "key", byte), 0);
        EXPECT_EQ(sim::StoredPreferences(kDomain).find("key"), nullptr);
    }
}

TEST_F(SetPreferenceValue, RefusesWhatIsNoPropertyList) {
    sim::StorePreferences(kDomain, Entries("key", "value"));
    for (const std::string_view value : {"", "xx", "<plist>", "bplist00"}) {
        EXPECT_EQ(Set(kDomain, "key", value), 5) << value;
    }
    EXPECT_EQ(sim::StoredPreferences(kDomain), Entries("key", "value"));
    EXPECT_EQ(sim::JournalCount("PreferencesSetValue"), 0U);
}

TEST_F(SetPreferenceValue, RefusesNamesThatAreNotUtf8) {
    EXPECT_EQ(Set(kNotUtf8, "key", "x"), 5);
    EXPECT_EQ(Set(kDomain, kNotUtf8, "x"), 5);
    EXPECT_TRUE(sim::Journal().empty());
}

TEST_F(SetPreferenceValue, IgnoresTheResultOfTheSynchronisation) {
    sim::FailCall("PreferencesSynchronize", 1);
    EXPECT_EQ(Set(kDomain, "key", "<plist><true/></plist>"), 0);
    EXPECT_EQ(sim::FailedCall(), "PreferencesSynchronize");
}

struct Copier {
    CopyHandler handler;
    const char* line;
    std::vector<std::string_view> calls;
};

class CopyValue : public testing::TestWithParam<Copier> {
protected:
    CopyValue() { sim::Reset(); }

    static Copied copy(std::string_view domain = kDomain, std::string_view key = "key") {
        return Copy(GetParam().handler, domain, key);
    }
};

TEST_P(CopyValue, AnswersTheXmlForm) {
    sim::StorePreferences(kDomain, Entries("key", "value"));
    const auto copied = copy();
    EXPECT_EQ(copied.code, 0);
    EXPECT_EQ(copied.xml, XmlOf(PropertyList("value")));
    EXPECT_EQ(sim::AllocatedMemory(), 0U);
}

TEST_P(CopyValue, LogsTheLengthWithItsLetter) {
    sim::StorePreferences(kDomain, Entries("key", "value"));
    const auto length = std::to_string(copy().xml.size());
    const SystemLines expected{
        {SystemLogPriority::kError, "VM_ALLOCATE " + length + GetParam().line}};
    EXPECT_EQ(sim::SystemLogLines(), expected);
}

TEST_P(CopyValue, SynchronisesBeforeItReads) {
    sim::StorePreferences(kDomain, Entries("key", "old"));
    (void)copy();
    sim::StorePreferences(kDomain, Entries("key", "new"));
    sim::ClearJournal();
    EXPECT_EQ(copy().xml, XmlOf(PropertyList("new")));
    ASSERT_GE(sim::Journal().size(), 2U);
    EXPECT_TRUE(sim::JournalHasInOrder({GetParam().calls[0], GetParam().calls[1], "vm_allocate"}));
}

TEST_P(CopyValue, OfAnAbsentKeyIsASuccessWithoutData) {
    const auto copied = copy();
    EXPECT_EQ(copied.code, 0);
    EXPECT_TRUE(copied.isAbsent);
    EXPECT_TRUE(sim::SystemLogLines().empty());
}

TEST_P(CopyValue, RefusesNamesThatAreNotUtf8AndEmptiesItsOutValue) {
    for (const auto& copied : {copy(kNotUtf8), copy(kDomain, kNotUtf8)}) {
        EXPECT_EQ(copied.code, 5);
        EXPECT_TRUE(copied.isAbsent);
    }
}

TEST_P(CopyValue, PassesTheCodeOfAFailedAllocationOnAndLogsItAllTheSame) {
    sim::StorePreferences(kDomain, Entries("key", "value"));
    sim::FailCall("vm_allocate", 1);
    const auto copied = copy();
    EXPECT_EQ(copied.code, platform::KERN_NO_SPACE);
    EXPECT_TRUE(copied.isAbsent);
    EXPECT_EQ(sim::SystemLogLines().size(), 1U);
}

TEST_P(CopyValue, FailsForWhatCannotBeWrittenAsXml) {
    sim::StorePreferences(kDomain, Entries("key", "\x01"));
    EXPECT_EQ(copy().code, 5);
    EXPECT_TRUE(sim::SystemLogLines().empty());
}

INSTANTIATE_TEST_SUITE_P(Both,
                         CopyValue,
                         testing::Values(Copier{server_LFMobileHelperCopyPreferenceValue,
                                                "l (mhs1)\n",
                                                {"PreferencesSynchronize", "PreferencesCopyValue"}},
                                         Copier{server_LFMobileHelperCopyAppPreferenceValue,
                                                "l (mhs2)\n",
                                                {"PreferencesAppSynchronize",
                                                 "PreferencesCopyAppValue"}}));

TEST(CopyAppPreferenceValue, SearchesTheUserFirstThenTheSystem) {
    sim::Reset();
    const auto copied = [] {
        return Copy(server_LFMobileHelperCopyAppPreferenceValue, kDomain, "key").xml;
    };
    for (const std::string domain : {"system:.GlobalPreferences",
                                     "system:com.vendra.carrier",
                                     ".GlobalPreferences",
                                     "com.vendra.carrier"}) {
        sim::StorePreferences(domain, Entries("key", domain.c_str()));
        EXPECT_EQ(copied(), XmlOf(PropertyList(domain))) << "each comes before the ones so far";
    }
}

}  // namespace
