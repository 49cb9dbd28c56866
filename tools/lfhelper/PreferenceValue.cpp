#include "tools/lfhelper/PreferenceValue.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <span>

#include "platform/PropertyList.h"
#include "platform/PropertyListLimits.h"
#include "platform/PropertyListText.h"

namespace lfhelper {
namespace {

using platform::PropertyList;
using MaybeList = std::optional<PropertyList>;

MaybeList ParseText(const std::string& text) {
    return platform::IsXmlText(text) ? MaybeList(PropertyList(text)) : std::nullopt;
}

MaybeList ParseBoolean(const std::string& text) {
    return text == "true" || text == "false" ? MaybeList(PropertyList(text == "true"))
                                             : std::nullopt;
}

template <auto Parse>
MaybeList ParseAs(const std::string& text) {
    auto value = Parse(text);
    return value ? MaybeList(PropertyList(*std::move(value))) : std::nullopt;
}

struct NamedType {
    ValueType type;
    std::string_view name;
    /// Null for a property list, which is sent as it is.
    MaybeList (*parse)(const std::string& text);
    /// What the text has to be.
    std::string_view form;
};

constexpr std::array<NamedType, 7> kTypes{{
    {ValueType::kString, "string", ParseText, "a text in UTF-8 without control characters"},
    {ValueType::kInteger, "integer", ParseAs<platform::ParseInteger>, "an integer of 64 bits"},
    {ValueType::kReal, "real", ParseAs<platform::ParseReal>, "a number"},
    {ValueType::kBoolean, "boolean", ParseBoolean, "true or false"},
    {ValueType::kDate, "date", ParseAs<platform::ParseDate>, "a date such as 2001-01-01T00:00:00Z"},
    {ValueType::kData, "data", ParseAs<platform::ParseBase64>, "bytes in base64"},
    {ValueType::kPlist, "plist", nullptr, "a property list"},
}};

/// The names of PropertyList::Kind, in its order.
constexpr std::array<std::string_view, 8> kKindNames{
    "dictionary", "array", "string", "data", "date", "integer", "real", "boolean"};

const NamedType& Named(ValueType type) {
    return *std::ranges::find(kTypes, type, &NamedType::type);
}

SerializedValue Misfit(const NamedType& type) {
    return {.error = "VALUE is not " + std::string(type.form) +
                     (type.type == ValueType::kString ? "" : ", as --type says")};
}

/// The value for people, when it is one that can stand alone.
std::optional<std::string> PlainText(const PropertyList& value) {
    if (const auto* const text = value.as<std::string>()) {
        return *text;
    }
    if (const auto* const number = value.as<std::int64_t>()) {
        return std::to_string(*number);
    }
    if (const auto* const number = value.as<double>()) {
        return platform::FormatReal(*number);
    }
    if (const auto* const truth = value.as<bool>()) {
        return *truth ? "true" : "false";
    }
    return std::nullopt;
}

/// JSON has no words for infinity and NaN.
bool IsKnownToJson(const PropertyList& value) {
    const auto* const real = value.as<double>();
    return real == nullptr || std::isfinite(*real);
}

JsonObject ListFields(std::string_view type, std::string_view xml) {
    JsonObject fields;
    fields.add("type", type);
    fields.add("plist", xml);
    return fields;
}

JsonObject PlainFields(std::string_view type, const PropertyList& value, std::string_view plain) {
    JsonObject fields;
    fields.add("type", type);
    if (value.as<std::string>() != nullptr) {
        fields.add("value", plain);
    } else {
        fields.addLiteral("value", plain);
    }
    return fields;
}

ShownValue ShowList(std::string_view type, std::string_view xml) {
    return {.text = std::string(xml) + (xml.ends_with('\n') ? "" : "\n"),
            .fields = ListFields(type, xml)};
}

}  // namespace

std::optional<ValueType> FindValueType(std::string_view name) {
    const auto found = std::ranges::find(kTypes, name, &NamedType::name);
    return found == kTypes.end() ? std::nullopt : std::optional(found->type);
}

std::string ValueTypeNames() {
    std::string names;
    for (const NamedType& type : kTypes) {
        names.append(names.empty() ? "" : ", ").append(type.name);
    }
    return names;
}

SerializedValue SerializeValue(ValueType type, const std::string& text) {
    const NamedType& named = Named(type);
    if (named.parse == nullptr) {
        // One byte would remove the key. Whatever else is no property list the service refuses.
        return text.size() == 1 ? Misfit(named) : SerializedValue{.bytes = text};
    }
    const MaybeList value = named.parse(text);
    if (!value) {
        return Misfit(named);
    }
    const auto bytes = platform::PropertyListCreateXmlData(*value);
    if (!bytes) {
        return {.error = "VALUE is too large: a property list has at most 16 MiB"};
    }
    return {.bytes = {reinterpret_cast<const char*>(bytes->data()), bytes->size()}};
}

std::optional<ShownValue> ShowValue(std::string_view xml, ValueForm form) {
    if (xml.size() > platform::kPropertyListLimits.bytes) {
        return ShowList("plist", xml);
    }
    const auto value = platform::PropertyListCreateWithData(std::as_bytes(std::span(xml)));
    if (!value) {
        return std::nullopt;
    }
    const std::string_view type = kKindNames.at(static_cast<std::size_t>(value->kind()));
    const auto plain = PlainText(*value);
    if (!plain || form == ValueForm::kPlist) {
        return ShowList(type, xml);
    }
    return ShownValue{.text = *plain + "\n",
                      .fields = IsKnownToJson(*value) ? PlainFields(type, *value, *plain)
                                                      : ListFields(type, xml)};
}

}  // namespace lfhelper
