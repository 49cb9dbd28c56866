#include <algorithm>
#include <array>
#include <iterator>
#include <string>

#include "platform/PropertyListEntries.h"
#include "platform/PropertyListText.h"
#include "platform/PropertyListXml.h"

namespace platform {
namespace {

enum class TagForm : std::uint8_t { kOpening, kClosing, kEmpty };

struct Tag {
    std::string_view name;
    TagForm form = TagForm::kOpening;
    bool hasAttributes = false;
};

/// One pass over the text. Anything but what is expected at a place ends it.
class XmlReader {
public:
    explicit XmlReader(std::string_view text) : text_(text) {}

    std::optional<PropertyList> read() {
        if (!takeProlog()) {
            return std::nullopt;
        }
        const auto plist = takeTag();
        if (!plist || plist->name != "plist" || plist->form != TagForm::kOpening || !skipMisc()) {
            return std::nullopt;
        }
        const auto first = takeTag();
        auto value = first ? readValue(*first) : std::nullopt;
        const bool isWhole =
            value && skipMisc() && takeClosing("plist") && skipMisc() && rest().empty();
        return isWhole ? std::move(value) : std::nullopt;
    }

private:
    [[nodiscard]] std::string_view rest() const { return text_.substr(at_); }

    bool take(std::string_view expected) {
        if (!rest().starts_with(expected)) {
            return false;
        }
        at_ += expected.size();
        return true;
    }

    void skipSpace() { at_ = std::min(text_.find_first_not_of(" \t\r\n", at_), text_.size()); }

    bool skipPast(std::string_view end) {
        const auto found = text_.find(end, at_);
        at_ = found == std::string_view::npos ? text_.size() : found + end.size();
        return found != std::string_view::npos;
    }

    /// White space, comments and processing instructions. False when one of them does not end.
    bool skipMisc() {
        for (;;) {
            skipSpace();
            if (take("<!--")) {
                if (!skipPast("-->")) {
                    return false;
                }
            } else if (!take("<?")) {
                return true;
            } else if (!skipPast("?>")) {
                return false;
            }
        }
    }

    /// The inside of a tag or declaration up to its end; a ">" in quotes does not end it.
    std::optional<std::string_view> takeUpToEnd() {
        const std::size_t start = at_;
        for (;;) {
            at_ = text_.find_first_of("<>\"'[", at_);
            if (at_ == std::string_view::npos || text_[at_] == '<' || text_[at_] == '[') {
                at_ = text_.size();
                return std::nullopt;
            }
            const char stop = text_[at_++];
            if (stop == '>') {
                return text_.substr(start, at_ - 1 - start);
            }
            if (!skipPast({&stop, 1})) {
                return std::nullopt;
            }
        }
    }

    bool takeProlog() {
        (void)take("\xEF\xBB\xBF");  // a byte-order mark says nothing that is not so
        if (rest().starts_with("<?xml") && !takeDeclaration()) {
            return false;
        }
        if (!skipMisc()) {
            return false;
        }
        // An internal subset, which starts with "[", could define entities without end.
        return !take("<!DOCTYPE") || (takeUpToEnd() && skipMisc());
    }

    /// The text is UTF-8 whatever the declaration says, so it may not say anything else.
    bool takeDeclaration() {
        const std::size_t start = at_;
        if (!skipPast("?>")) {
            return false;
        }
        const auto declaration = text_.substr(start, at_ - start);
        const auto encoding = declaration.find("encoding");
        if (encoding == std::string_view::npos) {
            return true;
        }
        const auto quote = declaration.find_first_of("\"'", encoding);
        if (quote == std::string_view::npos) {
            return false;
        }
        const auto name = declaration.substr(quote + 1);
        for (const std::string_view known :
             {"UTF-8", "utf-8", "UTF8", "utf8", "US-ASCII", "us-ascii"}) {
            if (name.starts_with(known) &&
                name.substr(known.size()).starts_with(declaration[quote])) {
                return true;
            }
        }
        return false;
    }

    std::optional<Tag> takeTag() {
        if (!take("<")) {
            return std::nullopt;
        }
        Tag tag;
        if (take("/")) {
            tag.form = TagForm::kClosing;
        }
        auto inside = takeUpToEnd();
        if (!inside) {
            return std::nullopt;
        }
        if (inside->ends_with('/')) {
            if (tag.form == TagForm::kClosing) {
                return std::nullopt;
            }
            tag.form = TagForm::kEmpty;
            inside->remove_suffix(1);
        }
        tag.name = inside->substr(0, inside->find_first_of(" \t\r\n"));
        tag.hasAttributes =
            inside->find_first_not_of(" \t\r\n", tag.name.size()) != std::string_view::npos;
        return tag.hasAttributes && tag.name != "plist" ? std::nullopt : std::optional(tag);
    }

    bool takeClosing(std::string_view name) {
        const auto tag = takeTag();
        return tag && tag->form == TagForm::kClosing && tag->name == name && !tag->hasAttributes;
    }

    std::optional<PropertyList> readValue(const Tag& tag) {
        if (tag.form == TagForm::kClosing || !budget_.takeObject()) {
            return std::nullopt;
        }
        if (tag.name == "dict" || tag.name == "array") {
            return readContainer(tag);
        }
        if (tag.name == "true" || tag.name == "false") {
            const bool isWhole = tag.form == TagForm::kEmpty || takeClosing(tag.name);
            return isWhole ? std::optional(PropertyList(tag.name == "true")) : std::nullopt;
        }
        return readLeaf(tag);
    }

    std::optional<PropertyList> readContainer(const Tag& tag) {
        const bool isDictionary = tag.name == "dict";
        if (tag.form == TagForm::kEmpty) {
            return isDictionary ? PropertyList() : PropertyList(PropertyList::Array());
        }
        if (!budget_.enter()) {
            return std::nullopt;
        }
        auto value = isDictionary ? readDictionary() : readArray();
        budget_.leave();
        return value;
    }

    std::optional<PropertyList> readArray() {
        PropertyList::Array values;
        for (;;) {
            if (!skipMisc()) {
                return std::nullopt;
            }
            const auto tag = takeTag();
            if (tag && tag->form == TagForm::kClosing && tag->name == "array") {
                return PropertyList(std::move(values));
            }
            auto value = tag ? readValue(*tag) : std::nullopt;
            if (!value) {
                return std::nullopt;
            }
            values.push_back(std::move(*value));
        }
    }

    std::optional<PropertyList> readDictionary() {
        PropertyList::Dictionary entries;
        for (;;) {
            if (!skipMisc()) {
                return std::nullopt;
            }
            const auto tag = takeTag();
            if (tag && tag->form == TagForm::kClosing && tag->name == "dict") {
                MergeEqualKeys(entries);
                return PropertyList(std::move(entries));
            }
            if (!tag || tag->form == TagForm::kClosing || tag->name != "key" ||
                !budget_.takeObject()) {
                return std::nullopt;
            }
            auto key = readText(*tag);
            if (!key || !budget_.takeLeaf(key->size()) || !skipMisc()) {
                return std::nullopt;
            }
            const auto valueTag = takeTag();
            auto value = valueTag ? readValue(*valueTag) : std::nullopt;
            if (!value) {
                return std::nullopt;
            }
            entries.emplace_back(std::move(*key), std::move(*value));
        }
    }

    template <typename T>
    static std::optional<PropertyList> wrap(std::optional<T> value) {
        return value ? std::optional(PropertyList(std::move(*value))) : std::nullopt;
    }

    std::optional<PropertyList> readLeaf(const Tag& tag) {
        auto text = readText(tag);
        if (!text) {
            return std::nullopt;
        }
        if (tag.name == "string") {
            return budget_.takeLeaf(text->size()) ? wrap(std::move(text)) : std::nullopt;
        }
        if (tag.name == "integer") {
            return wrap(ParseInteger(*text));
        }
        if (tag.name == "real") {
            return wrap(ParseReal(*text));
        }
        if (tag.name == "date") {
            return wrap(ParseDate(*text));
        }
        if (tag.name == "data") {
            auto data = ParseBase64(*text);
            return data && budget_.takeLeaf(data->size()) ? wrap(std::move(data)) : std::nullopt;
        }
        return std::nullopt;
    }

    /// The text inside an element, through its closing tag.
    std::optional<std::string> readText(const Tag& tag) {
        std::string text;
        if (tag.form == TagForm::kEmpty) {
            return text;
        }
        // One allocation for a large text: growing one would hold it twice.
        text.reserve(std::min(text_.find("</", at_), text_.size()) - at_);
        for (;;) {
            // Values are long: find_first_of would make a call for each character of them.
            const auto stop =
                std::ranges::find_if(rest(), [](char c) { return c == '<' || c == '&'; });
            if (stop == text_.end()) {
                return std::nullopt;
            }
            const auto length = static_cast<std::size_t>(stop - text_.begin()) - at_;
            text.append(text_, at_, length);
            at_ += length;
            if (rest().starts_with("</")) {
                return takeClosing(tag.name) ? std::optional(std::move(text)) : std::nullopt;
            }
            if (!(text_[at_] == '&' ? takeReference(text) : takeSectionOrComment(text))) {
                return std::nullopt;
            }
        }
    }

    bool takeSectionOrComment(std::string& text) {
        if (take("<![CDATA[")) {
            const std::size_t start = at_;
            const bool isWhole = skipPast("]]>");
            text.append(text_, start, isWhole ? at_ - 3 - start : 0);
            return isWhole;
        }
        return take("<!--") && skipPast("-->");
    }

    bool takeReference(std::string& text) {
        struct Entity {
            std::string_view name;
            char character;
        };

        constexpr std::array<Entity, 5> kEntities{
            {{"&amp;", '&'}, {"&lt;", '<'}, {"&gt;", '>'}, {"&quot;", '"'}, {"&apos;", '\''}}};
        for (const Entity& entity : kEntities) {
            if (take(entity.name)) {
                text += entity.character;
                return true;
            }
        }
        return take("&#") && takeCharacterReference(text);
    }

    bool takeCharacterReference(std::string& text) {
        const std::uint32_t base = take("x") ? 16 : 10;
        std::uint32_t character = 0;
        for (std::size_t digits = 0; at_ < text_.size(); ++digits) {
            const char c = text_[at_++];
            if (c == ';') {
                const bool isCharacter = digits > 0 && IsXmlCharacter(character);
                if (isCharacter) {
                    AppendUtf8(text, character);
                }
                return isCharacter;
            }
            const std::uint32_t digit =
                c >= '0' && c <= '9'   ? static_cast<std::uint32_t>(c - '0')
                : c >= 'a' && c <= 'f' ? static_cast<std::uint32_t>(c - 'a' + 10)
                : c >= 'A' && c <= 'F' ? static_cast<std::uint32_t>(c - 'A' + 10)
                                       : base;
            character = character * base + digit;
            if (digit >= base || character > 0x10FFFF) {
                return false;
            }
        }
        return false;
    }

    const std::string_view text_;
    std::size_t at_ = 0;
    PropertyListBudget budget_;
};

}  // namespace

std::optional<PropertyList> ReadXmlPropertyList(std::string_view text) {
    return text.size() <= kPropertyListLimits.bytes && IsXmlText(text) ? XmlReader(text).read()
                                                                       : std::nullopt;
}

}  // namespace platform
