#include "tools/lfhelper/HexDump.h"

#include <algorithm>
#include <cstdio>

#include "Helper/Shared/Server/MessageLayouts.h"
#include "client/linefold_helper.h"

namespace lfhelper {
namespace {

using platform::Load;

constexpr std::size_t kBytesPerLine = 16;
/// Fits a field of eight bytes, so that the names stand in one column.
constexpr std::size_t kColumnOfHex = std::size_t{8} * 3;

struct ReplyField {
    std::size_t offset;
    std::size_t size;
    std::string_view name;
    std::string (*describe)(ByteSpan field);
};

std::string Unsigned(ByteSpan field) {
    return std::to_string(Load<std::uint32_t>(field, 0));
}

std::string Bits(ByteSpan field) {
    const auto bits = Load<std::uint32_t>(field, 0);
    return (bits & platform::MACH_MSGH_BITS_COMPLEX) != 0 ? "complex" : "simple";
}

std::string Id(ByteSpan field) {
    const auto id = Load<std::int32_t>(field, 0);
    return std::to_string(id) + ", the reply to " + std::to_string(std::int64_t{id} - ReplyId(0));
}

std::string Code(ByteSpan field) {
    const auto code = Load<std::int32_t>(field, 0);
    return std::to_string(code) + " " + LFMobileHelperErrorName(code) + ": " +
           LFMobileHelperErrorString(code);
}

std::string Nothing(ByteSpan /*field*/) {
    return "";
}

constexpr std::array<ReplyField, 6> kHeaderFields{{
    {0, 4, "msgh_bits", Bits},
    {4, 4, "msgh_size", Unsigned},
    {8, 4, "msgh_remote_port", Unsigned},
    {12, 4, "msgh_local_port", Unsigned},
    {16, 4, "msgh_voucher_port", Unsigned},
    {20, 4, "msgh_id", Id},
}};

constexpr std::array<ReplyField, 2> kSimpleFields{{
    {platform::kOffsetOfNdr, 8, "NDR record", Nothing},
    {platform::kOffsetOfReturnCode, 4, "return code", Code},
}};

constexpr std::array<ReplyField, 6> kBulkFields{{
    {platform::kOffsetOfDescriptorCount, 4, "descriptor count", Unsigned},
    {platform::kOffsetOfDescriptor, 8, "data address", Nothing},
    {platform::kOffsetOfOutOfLineFlags, 4, "data flags", Nothing},
    {platform::kOffsetOfOutOfLineSize, 4, "data size", Unsigned},
    {kOffsetOfOutOfLineReplyNdr, 8, "NDR record", Nothing},
    {kOffsetOfOutOfLineReplyCount, 4, "data count", Unsigned},
}};

std::string Offset(std::size_t offset) {
    std::array<char, 24> text{};
    (void)std::snprintf(text.data(), text.size(), "  %04zx  ", offset);
    return text.data();
}

std::string SpacedHex(ByteSpan bytes, std::size_t column) {
    std::string text;
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        text += ToHex(bytes.subspan(i, 1)) + " ";
    }
    text.resize(std::max(column, text.size()), ' ');
    return text;
}

std::string Printable(ByteSpan bytes) {
    std::string text;
    for (const std::byte byte : bytes) {
        const auto character = static_cast<char>(byte);
        text += character >= ' ' && character <= '~' ? character : '.';
    }
    return text;
}

/// Appends the fields that lie wholly inside the reply, and answers where they end.
std::size_t AppendFields(std::string& text, ByteSpan reply, std::span<const ReplyField> fields) {
    std::size_t end = fields.front().offset;
    for (const ReplyField& field : fields) {
        if (field.offset + field.size > reply.size()) {
            break;
        }
        const ByteSpan bytes = reply.subspan(field.offset, field.size);
        const std::string meaning = field.describe(bytes);
        text += Offset(field.offset) + SpacedHex(bytes, kColumnOfHex) + " " +
                std::string(field.name) + (meaning.empty() ? "" : ": " + meaning) + "\n";
        end = field.offset + field.size;
    }
    return end;
}

bool IsComplex(ByteSpan reply) {
    return reply.size() >= sizeof(platform::MachMsgHeader) &&
           (Load<std::uint32_t>(reply, 0) & platform::MACH_MSGH_BITS_COMPLEX) != 0;
}

int DigitValue(char digit) {
    if (digit >= '0' && digit <= '9') {
        return digit - '0';
    }
    const char lower = static_cast<char>(digit | 0x20);
    return lower >= 'a' && lower <= 'f' ? lower - 'a' + 10 : -1;
}

}  // namespace

std::string ToHex(ByteSpan bytes) {
    constexpr std::string_view kDigits = "0123456789abcdef";
    std::string text;
    text.reserve(bytes.size() * 2);
    for (const std::byte byte : bytes) {
        const auto value = std::to_integer<std::size_t>(byte);
        text += kDigits[value >> 4U];
        text += kDigits[value & 0xFU];
    }
    return text;
}

std::optional<std::vector<std::byte>> FromHex(std::string_view text) {
    std::vector<std::byte> bytes;
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (text[i] == ' ' || text[i] == '\t' || text[i] == '\n' || text[i] == ':') {
            continue;
        }
        const int high = DigitValue(text[i]);
        const int low = i + 1 < text.size() ? DigitValue(text[i + 1]) : -1;
        if (high < 0 || low < 0) {
            return std::nullopt;
        }
        bytes.push_back(static_cast<std::byte>(high * 16 + low));
        ++i;
    }
    return bytes;
}

std::string AnnotatedReply(ByteSpan reply) {
    std::string text = "reply of " + std::to_string(reply.size()) + " bytes\n";
    std::size_t end = AppendFields(text, reply, kHeaderFields);
    if (end == sizeof(platform::MachMsgHeader)) {
        end = IsComplex(reply) ? AppendFields(text, reply, kBulkFields)
                               : AppendFields(text, reply, kSimpleFields);
    }
    for (std::size_t offset = end; offset < reply.size(); offset += kBytesPerLine) {
        const auto line = reply.subspan(offset, std::min(kBytesPerLine, reply.size() - offset));
        text +=
            Offset(offset) + SpacedHex(line, kBytesPerLine * 3) + " |" + Printable(line) + "|\n";
    }
    return text;
}

std::optional<std::int32_t> ReturnCodeOf(ByteSpan reply) {
    if (IsComplex(reply)) {
        return LF_MOBILE_HELPER_SUCCESS;
    }
    if (reply.size() < platform::kErrorReplySize) {
        return std::nullopt;
    }
    return Load<std::int32_t>(reply, platform::kOffsetOfReturnCode);
}

}  // namespace lfhelper
