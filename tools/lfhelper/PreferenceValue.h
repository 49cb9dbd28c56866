// Preference values between a command line and a property list.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "tools/lfhelper/Json.h"

namespace lfhelper {

enum class ValueType : std::uint8_t {
    kString,
    kInteger,
    kReal,
    kBoolean,
    kDate,
    kData,
    kPlist  ///< a property list of any kind, as it is
};

/// None for a name that is no type's.
[[nodiscard]] std::optional<ValueType> FindValueType(std::string_view name);

/// All of them, for people.
[[nodiscard]] std::string ValueTypeNames();

struct SerializedValue {
    /// A property list, or what the caller says is one.
    std::string bytes{};
    /// What is wrong with the text; `bytes` is empty then.
    std::string error{};
};

[[nodiscard]] SerializedValue SerializeValue(ValueType type, const std::string& text);

enum class ValueForm : std::uint8_t {
    kPlain,  ///< texts, numbers and booleans as such
    kPlist   ///< everything as a property list
};

struct ShownValue {
    /// For people, ending in a newline.
    std::string text;
    /// For programs: its type, and the value or the property list.
    JsonObject fields;
};

/// Shows an XML property list; nothing for what is none. A list that the service wrote may be
/// longer than one that can be parsed: it is shown as it is, whatever the form.
[[nodiscard]] std::optional<ShownValue> ShowValue(std::string_view xml, ValueForm form);

}  // namespace lfhelper
