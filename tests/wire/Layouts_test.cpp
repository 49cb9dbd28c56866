// The layouts once more, written by hand: two statements of one fact find mistakes.
#include <gtest/gtest.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

#include "Helper/Shared/Server/MessageLayouts.h"

namespace {

struct FieldPlace {
    std::uint32_t offset;
    std::uint32_t size;

    bool operator==(const FieldPlace&) const = default;
};

struct Row {
    std::int32_t id;
    std::string_view name;
    std::uint32_t requestSize;
    std::vector<FieldPlace> fields;
    std::uint32_t replySize;
    /// Of the out value at 36; 0 for none. The data replies have theirs behind a descriptor.
    std::uint32_t outValueSize = 0;
};

// clang-format off
const std::array<Row, 24> kRows{{
    {8683549, "SetVoicemailToken",               288, {{32, 256}},                              36},
    {8683550, "SetVoicemailTokenForKey",         544, {{32, 256}, {288, 256}},                  36},
    {8683551, "ClearVoicemailToken",              24, {},                                       36},
    {8683552, "RemoveAllVoicemailRecords",        24, {},                                       36},
    {8683553, "CopyVoicemailTokenForKey",        288, {{32, 256}},                             292, 256},
    {8683554, "CopyVoicemailToken",               24, {},                                      292, 256},
    {8683555, "SetPreferenceValue",              568, {{52, 256}, {308, 256}, {564, 4}},        36},
    {8683556, "CopyPreferenceValue",             544, {{32, 256}, {288, 256}},                  56},
    {8683557, "CopyAppPreferenceValue",          544, {{32, 256}, {288, 256}},                  56},
    {8683558, "LinkCarrierBundle",              3104, {{32, 1024}, {1056, 1024}, {2080, 1024}}, 36},
    {8683559, "CreateSymlink",                  2080, {{32, 1024}, {1056, 1024}},               36},
    {8683560, "RemovePreferenceDomain",         2080, {{32, 1024}, {1056, 1024}},               36},
    {8683561, "IsVoicemailSubscribed",            24, {},                                       40, 4},
    {8683562, "SetHeartbeatEnabled",              36, {{32, 4}},                                36},
    {8683563, "CheckForDatabaseUpdate",           36, {{32, 4}},                                36},
    {8683564, "CopyFile",                        800, {{32, 256}, {288, 256}, {544, 256}},      40, 4},
    {8683565, "CopyLogDirectory",                288, {{32, 256}},                              40, 4},
    {8683566, "MoveDirectory",                   800, {{32, 256}, {288, 256}, {544, 256}},      40, 4},
    {8683567, "RequestCountryCodeFromLocation",   48, {{32, 8}, {40, 8}},                       36},
    {8683568, "CopyCountryCode",                  24, {},                                      100, 64},
    {8683569, "RequestWanIPFromLocation",         24, {},                                       36},
    {8683570, "SetRadioManagerLogging",           36, {{32, 4}},                                36},
    {8683571, "CopyArchive",                     544, {{32, 256}, {288, 256}},                  40, 4},
    {8683572, "LoadPlistFile",                   288, {{32, 256}},                              56},
}};

// clang-format on

std::vector<FieldPlace> FieldsOf(const RoutineLayout& layout) {
    std::vector<FieldPlace> fields;
    for (std::size_t i = 0; i < layout.request.size() && layout.request[i] != Field::kNone; ++i) {
        fields.push_back({layout.offsetOfField(i), SizeOfField(layout.request[i])});
    }
    return fields;
}

}  // namespace

TEST(Layouts, OfAllRoutinesAreTheDocumentedOnes) {
    ASSERT_EQ(kRoutineLayouts.size(), kRows.size());
    for (std::size_t i = 0; i < kRows.size(); ++i) {
        SCOPED_TRACE(kRows[i].name);
        EXPECT_EQ(kRoutineLayouts[i].id, kRows[i].id);
        EXPECT_EQ(kRoutineLayouts[i].name, kRows[i].name);
        EXPECT_EQ(kRoutineLayouts[i].requestSize, kRows[i].requestSize);
        EXPECT_EQ(FieldsOf(kRoutineLayouts[i]), kRows[i].fields);
        EXPECT_EQ(kRoutineLayouts[i].replySize, kRows[i].replySize);
    }
}

TEST(Layouts, HaveTheOutValueAt36AndDataBehindADescriptor) {
    EXPECT_EQ(kOutValueOffset, 36U);
    for (std::size_t i = 0; i < kRows.size(); ++i) {
        SCOPED_TRACE(kRows[i].name);
        const bool bringsData = kRows[i].replySize == 56;
        EXPECT_EQ(kRoutineLayouts[i].reply == Field::kData, bringsData);
        const auto outValueSize = bringsData ? 0 : SizeOfField(kRoutineLayouts[i].reply);
        EXPECT_EQ(outValueSize, kRows[i].outValueSize);
    }
}

TEST(Layouts, OnlyRoutineSixBringsData) {
    for (const RoutineLayout& layout : kRoutineLayouts) {
        EXPECT_EQ(layout.bringsData(), layout.id == 8683555) << layout.name;
    }
}

TEST(Layouts, OfTheCheckInAreTheDocumentedOnes) {
    EXPECT_EQ(kServiceName, "com.vendra.linefold.mobile-helper");
    EXPECT_EQ(kCheckInId, 4792174);
    EXPECT_EQ(kCheckInRequestSize, 40U);
    EXPECT_EQ(kCheckInReplySize, 40U);
}

TEST(Layouts, OfHeaderAndDescriptorsAreTheDocumentedOnes) {
    EXPECT_EQ(offsetof(platform::MachMsgHeader, size), 4U);
    EXPECT_EQ(offsetof(platform::MachMsgHeader, id), 20U);
    EXPECT_EQ(platform::kOffsetOfDescriptorCount, 24U);
    EXPECT_EQ(platform::kOffsetOfDescriptor, 28U);
    EXPECT_EQ(platform::kOffsetOfOutOfLineFlags, 36U);
    EXPECT_EQ(platform::kOffsetOfPortDisposition, 38U);
    EXPECT_EQ(platform::kOffsetOfDescriptorType, 39U);
    EXPECT_EQ(platform::kOffsetOfOutOfLineSize, 40U);
}

TEST(Layouts, OfRepliesAreTheDocumentedOnes) {
    EXPECT_EQ(platform::kOffsetOfNdr, 24U);
    EXPECT_EQ(platform::kOffsetOfReturnCode, 32U);
    EXPECT_EQ(platform::kErrorReplySize, 36U);
    EXPECT_EQ(kOutOfLineReplySize, 56U);
    EXPECT_EQ(kOffsetOfOutOfLineReplyNdr, 44U);
    EXPECT_EQ(kOffsetOfOutOfLineReplyCount, 52U);
    EXPECT_EQ(kOutOfLineReplyFlags, 0x01000101U);
}

TEST(Layouts, HaveTheDocumentedLimits) {
    EXPECT_EQ(platform::kMaxInlineData, 65'536U);
    EXPECT_EQ(platform::kMaxRequestData, 16'777'216U);
    EXPECT_EQ(platform::kMaxReplyData, 67'108'864U);
}

TEST(Layouts, NumberAReplyOneHundredAboveItsRequestAndWrapAround) {
    EXPECT_EQ(ReplyId(8683549), 8683649);
    EXPECT_EQ(ReplyId(-1), 99);
    EXPECT_EQ(ReplyId(INT32_MAX), INT32_MIN + 99);
}
