#include "tools/lfhelper/Json.h"

#include <array>
#include <cstddef>

namespace lfhelper {
namespace {

std::string Hex(unsigned value, std::size_t digits) {
    constexpr std::string_view kDigits = "0123456789abcdef";
    std::string text(digits, '0');
    for (std::size_t i = digits; i > 0; --i, value >>= 4U) {
        text[i - 1] = kDigits[value & 0xFU];
    }
    return text;
}

struct SequenceForm {
    unsigned char firstFrom;
    unsigned char firstTo;
    std::size_t length;
    /// What the second byte must lie between: this keeps out overlong forms and surrogates.
    unsigned char secondFrom;
    unsigned char secondTo;
};

/// The well-formed byte sequences of RFC 3629, section 4.
constexpr std::array<SequenceForm, 9> kSequenceForms{{
    {0x00, 0x7F, 1, 0x80, 0xBF},
    {0xC2, 0xDF, 2, 0x80, 0xBF},
    {0xE0, 0xE0, 3, 0xA0, 0xBF},
    {0xE1, 0xEC, 3, 0x80, 0xBF},
    {0xED, 0xED, 3, 0x80, 0x9F},
    {0xEE, 0xEF, 3, 0x80, 0xBF},
    {0xF0, 0xF0, 4, 0x90, 0xBF},
    {0xF1, 0xF3, 4, 0x80, 0xBF},
    {0xF4, 0xF4, 4, 0x80, 0x8F},
}};

bool HasForm(std::string_view text, const SequenceForm& form) {
    const auto byteAt = [text](std::size_t i) { return static_cast<unsigned char>(text[i]); };
    if (text.size() < form.length || byteAt(0) < form.firstFrom || byteAt(0) > form.firstTo) {
        return false;
    }
    for (std::size_t i = 1; i < form.length; ++i) {
        if (byteAt(i) < (i == 1 ? form.secondFrom : 0x80) ||
            byteAt(i) > (i == 1 ? form.secondTo : 0xBF)) {
            return false;
        }
    }
    return true;
}

/// Bytes of the UTF-8 sequence at the start of the text; 0 when there is none.
std::size_t SequenceLength(std::string_view text) {
    for (const SequenceForm& form : kSequenceForms) {
        if (HasForm(text, form)) {
            return form.length;
        }
    }
    return 0;
}

std::string EscapedSequence(std::string_view sequence) {
    const auto byte = static_cast<unsigned char>(sequence[0]);
    if (byte == '"' || byte == '\\') {
        return std::string("\\").append(sequence);
    }
    return byte < 0x20 || byte == 0x7F ? "\\u" + Hex(byte, 4) : std::string(sequence);
}

}  // namespace

std::string JsonString(std::string_view text) {
    std::string quoted = "\"";
    while (!text.empty()) {
        const std::size_t length = SequenceLength(text);
        if (length == 0) {
            quoted += "\\\\x" + Hex(static_cast<unsigned char>(text[0]), 2);
        } else {
            quoted += EscapedSequence(text.substr(0, length));
        }
        text.remove_prefix(length == 0 ? 1 : length);
    }
    return quoted + "\"";
}

void JsonObject::append(const JsonObject& other) {
    if (!members_.empty() && !other.members_.empty()) {
        members_ += ",";
    }
    members_ += other.members_;
}

void JsonObject::addRaw(std::string_view key, std::string_view value) {
    if (!members_.empty()) {
        members_ += ",";
    }
    members_ += JsonString(key) + ":";
    members_ += value;
}

}  // namespace lfhelper
