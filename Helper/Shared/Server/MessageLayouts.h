// The layouts of the check-in and of the 24 requests: the published interface, as data.
//
// The server's stubs are checked against it while compiling, and clients are made from it.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "platform/MachMessage.h"

inline constexpr std::string_view kServiceName = "com.vendra.linefold.mobile-helper";

inline constexpr std::int32_t kCheckInId = 4'792'174;
inline constexpr std::uint32_t kCheckInRequestSize = 40;
inline constexpr std::uint32_t kCheckInReplySize = 40;

inline constexpr std::int32_t kFirstRoutineId = 8'683'549;
inline constexpr std::size_t kRoutineCount = 24;

/// The id of a reply, from the id of its request.
[[nodiscard]] constexpr std::int32_t ReplyId(std::int32_t requestId) {
    return static_cast<std::int32_t>(static_cast<std::uint32_t>(requestId) + 100);
}

/// Where the first field of a simple request, and the out value of a reply, stands.
inline constexpr std::uint32_t kFirstFieldOffset = 32;
inline constexpr std::uint32_t kOutValueOffset = 36;

/// The out-of-line reply: a descriptor, the NDR record at 44 and the count at 52.
inline constexpr std::uint32_t kOutOfLineReplySize = 56;
inline constexpr std::size_t kOffsetOfOutOfLineReplyNdr = 44;
inline constexpr std::size_t kOffsetOfOutOfLineReplyCount = 52;
/// deallocate = 1, copy = virtual copy, type = out-of-line descriptor.
inline constexpr std::uint32_t kOutOfLineReplyFlags = 0x01000101;

/// The one request with out-of-line data: strings from 52, a count that repeats the size.
inline constexpr std::uint32_t kFirstFieldOffsetBehindData = 52;

enum class Field : std::uint8_t {
    kNone,
    kString64,
    kString256,
    kString1024,
    kInt32,
    kDouble,
    kData
};

/// Bytes of a field inside its message; data counts with the uint32 that repeats its size.
[[nodiscard]] constexpr std::uint32_t SizeOfField(Field field) {
    switch (field) {
        case Field::kNone:
            return 0;
        case Field::kString64:
            return 64;
        case Field::kString256:
            return 256;
        case Field::kString1024:
            return 1024;
        case Field::kInt32:
        case Field::kData:
            return 4;
        case Field::kDouble:
            return 8;
    }
    return 0;
}

/// One routine: its fields lie one behind the other, always sent whole.
struct RoutineLayout {
    std::int32_t id = 0;
    std::string_view name;
    std::uint32_t requestSize = 0;
    std::array<Field, 3> request{};
    std::uint32_t replySize = 0;
    Field reply = Field::kNone;

    [[nodiscard]] constexpr bool bringsData() const {
        return request[0] == Field::kData || request[1] == Field::kData ||
               request[2] == Field::kData;
    }

    [[nodiscard]] constexpr std::uint32_t offsetOfField(std::size_t index) const {
        std::uint32_t offset = bringsData() ? kFirstFieldOffsetBehindData : kFirstFieldOffset;
        for (std::size_t i = 0; i < index; ++i) {
            offset += SizeOfField(request[i]);
        }
        return offset;
    }
};

// clang-format off
inline constexpr std::array<RoutineLayout, kRoutineCount> kRoutineLayouts{{
    // id      name                              request                                                          reply
    {8683549, "SetVoicemailToken",               288, {Field::kString256},                                           36, Field::kNone},
    {8683550, "SetVoicemailTokenForKey",         544, {Field::kString256, Field::kString256},                        36, Field::kNone},
    {8683551, "ClearVoicemailToken",              24, {},                                                            36, Field::kNone},
    {8683552, "RemoveAllVoicemailRecords",        24, {},                                                            36, Field::kNone},
    {8683553, "CopyVoicemailTokenForKey",        288, {Field::kString256},                                          292, Field::kString256},
    {8683554, "CopyVoicemailToken",               24, {},                                                           292, Field::kString256},
    {8683555, "SetPreferenceValue",              568, {Field::kString256, Field::kString256, Field::kData},          36, Field::kNone},
    {8683556, "CopyPreferenceValue",             544, {Field::kString256, Field::kString256},                        56, Field::kData},
    {8683557, "CopyAppPreferenceValue",          544, {Field::kString256, Field::kString256},                        56, Field::kData},
    {8683558, "LinkCarrierBundle",              3104, {Field::kString1024, Field::kString1024, Field::kString1024},  36, Field::kNone},
    {8683559, "CreateSymlink",                  2080, {Field::kString1024, Field::kString1024},                      36, Field::kNone},
    {8683560, "RemovePreferenceDomain",         2080, {Field::kString1024, Field::kString1024},                      36, Field::kNone},
    {8683561, "IsVoicemailSubscribed",            24, {},                                                            40, Field::kInt32},
    {8683562, "SetHeartbeatEnabled",              36, {Field::kInt32},                                               36, Field::kNone},
    {8683563, "CheckForDatabaseUpdate",           36, {Field::kInt32},                                               36, Field::kNone},
    {8683564, "CopyFile",                        800, {Field::kString256, Field::kString256, Field::kString256},     40, Field::kInt32},
    {8683565, "CopyLogDirectory",                288, {Field::kString256},                                           40, Field::kInt32},
    {8683566, "MoveDirectory",                   800, {Field::kString256, Field::kString256, Field::kString256},     40, Field::kInt32},
    {8683567, "RequestCountryCodeFromLocation",   48, {Field::kDouble, Field::kDouble},                              36, Field::kNone},
    {8683568, "CopyCountryCode",                  24, {},                                                           100, Field::kString64},
    {8683569, "RequestWanIPFromLocation",         24, {},                                                            36, Field::kNone},
    {8683570, "SetRadioManagerLogging",           36, {Field::kInt32},                                               36, Field::kNone},
    {8683571, "CopyArchive",                     544, {Field::kString256, Field::kString256},                        40, Field::kInt32},
    {8683572, "LoadPlistFile",                   288, {Field::kString256},                                           56, Field::kData},
}};

// clang-format on

/// The routine of an id, or null.
[[nodiscard]] constexpr const RoutineLayout* FindRoutineLayout(std::int32_t id) {
    for (const RoutineLayout& layout : kRoutineLayouts) {
        if (layout.id == id) {
            return &layout;
        }
    }
    return nullptr;
}

/// Two statements of one fact: the sizes above, and the fields that they must come from.
consteval bool RoutineLayoutsAreConsistent() {
    for (std::size_t i = 0; i < kRoutineCount; ++i) {
        const RoutineLayout& layout = kRoutineLayouts[i];
        const bool hasFields = layout.request[0] != Field::kNone;
        const std::uint32_t requestSize = hasFields ? layout.offsetOfField(layout.request.size())
                                                    : sizeof(platform::MachMsgHeader);
        const std::uint32_t replySize = layout.reply == Field::kData
                                            ? kOutOfLineReplySize
                                            : kOutValueOffset + SizeOfField(layout.reply);
        if (layout.id != kFirstRoutineId + static_cast<std::int32_t>(i) ||
            layout.requestSize != requestSize || layout.replySize != replySize) {
            return false;
        }
    }
    return true;
}

static_assert(RoutineLayoutsAreConsistent(), "ids run on, and sizes follow from the fields");
