#include <algorithm>
#include <array>
#include <string>

#include "platform/PropertyListText.h"
#include "platform/PropertyListXml.h"

namespace platform {
namespace {

// No document type: readers do not need it, and some would go and fetch it.
constexpr std::string_view kHead =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
    "<plist version=\"1.0\">\n";
constexpr std::string_view kTail = "</plist>\n";

/// As many as a line can begin with.
constexpr auto kTabs = [] {
    std::array<char, kPropertyListLimits.depth + 1> tabs{};
    tabs.fill('\t');
    return tabs;
}();

using Dictionary = PropertyList::Dictionary;
using Array = PropertyList::Array;
using Kind = PropertyList::Kind;

/// Hands the text of a value to a sink and counts it. Stops at a limit.
template <typename Sink>
class XmlWriter {
public:
    explicit XmlWriter(const Sink& sink) : sink_(sink) {}

    [[nodiscard]] bool write(const PropertyList& value) {
        return put(kHead) && writeValue(value, 0) && put(kTail);
    }

    [[nodiscard]] std::size_t size() const { return kPropertyListLimits.bytes - bytesLeft_; }

private:
    bool put(std::string_view text) {
        if (text.size() > bytesLeft_) {
            return false;
        }
        bytesLeft_ -= text.size();
        sink_(text);
        return true;
    }

    bool indent(std::size_t depth) { return put(std::string_view(kTabs.data(), depth)); }

    bool writeValue(const PropertyList& value, std::size_t depth) {
        if (!budget_.takeObject() || !indent(depth)) {
            return false;
        }
        switch (value.kind()) {
            case Kind::kDictionary:
                return writeDictionary(*value.as<Dictionary>(), depth);
            case Kind::kArray:
                return writeArray(*value.as<Array>(), depth);
            case Kind::kString:
                return writeText("string", *value.as<std::string>());
            case Kind::kData:
                return writeData(*value.as<PropertyList::Data>());
            case Kind::kDate: {
                const auto date = *value.as<PropertyList::Date>();
                return IsCalendarDate(date) && writePlain("date", FormatDate(date));
            }
            case Kind::kInteger:
                return writePlain("integer", std::to_string(*value.as<std::int64_t>()));
            case Kind::kReal:
                return writePlain("real", FormatReal(*value.as<double>()));
            case Kind::kBoolean:
                return put(*value.as<bool>() ? "<true/>\n" : "<false/>\n");
        }
        return false;
    }

    bool writeDictionary(const Dictionary& entries, std::size_t depth) {
        if (entries.empty()) {
            return put("<dict/>\n");
        }
        if (!budget_.enter() || !put("<dict>\n")) {
            return false;
        }
        for (const auto& [key, value] : entries) {
            if (!budget_.takeObject() || !indent(depth + 1) || !writeText("key", key) ||
                !writeValue(value, depth + 1)) {
                return false;
            }
        }
        budget_.leave();
        return indent(depth) && put("</dict>\n");
    }

    bool writeArray(const Array& values, std::size_t depth) {
        if (values.empty()) {
            return put("<array/>\n");
        }
        if (!budget_.enter() || !put("<array>\n")) {
            return false;
        }
        for (const PropertyList& value : values) {
            if (!writeValue(value, depth + 1)) {
                return false;
            }
        }
        budget_.leave();
        return indent(depth) && put("</array>\n");
    }

    bool open(std::string_view name) { return put("<") && put(name) && put(">"); }

    bool close(std::string_view name) { return put("</") && put(name) && put(">\n"); }

    bool writePlain(std::string_view name, std::string_view text) {
        return open(name) && put(text) && close(name);
    }

    bool writeText(std::string_view name, std::string_view text) {
        return budget_.takeLeaf(text.size()) && IsXmlText(text) && open(name) &&
               writeEscaped(text) && close(name);
    }

    bool writeEscaped(std::string_view text) {
        // Texts are long: find_first_of would make a call for each of their characters.
        const auto isEscaped = [](char c) { return c == '<' || c == '>' || c == '&' || c == '\r'; };
        for (;;) {
            const auto stop = std::ranges::find_if(text, isEscaped);
            if (stop == text.end()) {
                return put(text);
            }
            // A parser of XML turns a bare carriage return into a line feed.
            const std::string_view escape = *stop == '<'   ? "&lt;"
                                            : *stop == '>' ? "&gt;"
                                            : *stop == '&' ? "&amp;"
                                                           : "&#13;";
            if (!put({text.begin(), stop}) || !put(escape)) {
                return false;
            }
            text = {stop + 1, text.end()};
        }
    }

    bool writeData(std::span<const std::byte> data) {
        if (!budget_.takeLeaf(data.size()) || !open("data")) {
            return false;
        }
        for (std::size_t at = 0; at < data.size(); at += 3) {
            if (!put(FormatBase64(data.subspan(at, std::min<std::size_t>(3, data.size() - at))))) {
                return false;
            }
        }
        return close("data");
    }

    const Sink& sink_;
    PropertyListBudget budget_;
    std::size_t bytesLeft_ = kPropertyListLimits.bytes;
};

}  // namespace

std::optional<std::size_t> XmlPropertyListSize(const PropertyList& value) {
    const auto sink = [](std::string_view /*text*/) {};
    XmlWriter writer(sink);
    return writer.write(value) ? std::optional(writer.size()) : std::nullopt;
}

void WriteXmlPropertyList(const PropertyList& value, const PropertyListSink& sink) {
    (void)XmlWriter(sink).write(value);  // it has a size, so it fits
}

std::optional<std::vector<std::byte>> PropertyListCreateXmlData(const PropertyList& value) {
    const auto size = XmlPropertyListSize(value);
    if (!size) {
        return std::nullopt;
    }
    std::vector<std::byte> data;
    data.reserve(*size);  // growing it would hold it twice
    WriteXmlPropertyList(value, [&data](std::string_view text) {
        const auto* const first = reinterpret_cast<const std::byte*>(text.data());
        data.insert(data.end(), first, first + text.size());
    });
    return data;
}

}  // namespace platform
