// JSON objects for output (RFC 8259).
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace lfhelper {

/// A text as a JSON string. Bytes that are not UTF-8 become the four characters \xNN.
[[nodiscard]] std::string JsonString(std::string_view text);

/// An object under construction, whose members keep their order. Keys are given once each.
class JsonObject {
public:
    void add(std::string_view key, std::string_view text) { addRaw(key, JsonString(text)); }

    void add(std::string_view key, std::int64_t number) { addRaw(key, std::to_string(number)); }

    void add(std::string_view key, const JsonObject& object) { addRaw(key, object.toString()); }

    /// A number, a boolean or an array that is spelled as JSON spells it.
    void addLiteral(std::string_view key, std::string_view literal) { addRaw(key, literal); }

    void addNull(std::string_view key) { addRaw(key, "null"); }

    /// Puts the members of another object behind these.
    void append(const JsonObject& other);

    [[nodiscard]] std::string toString() const { return "{" + members_ + "}"; }

private:
    void addRaw(std::string_view key, std::string_view value);

    std::string members_;
};

}  // namespace lfhelper
