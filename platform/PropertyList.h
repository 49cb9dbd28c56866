// Property lists: a value type for the eight kinds of value.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <variant>
#include <vector>

namespace platform {

/// A dictionary, array, string, data, date, integer, real or boolean. Dictionaries keep the order
/// of their keys; texts are UTF-8.
///
/// A value never changes. Copies share what they hold, so that copying is cheap whatever the size;
/// they may be used from several threads.
class PropertyList {
public:
    using Dictionary = std::vector<std::pair<std::string, PropertyList>>;
    using Array = std::vector<PropertyList>;
    using Data = std::vector<std::byte>;

    /// Whole seconds since 2001-01-01 00:00:00 UTC.
    struct Date {
        std::int64_t seconds = 0;
        bool operator==(const Date&) const = default;
    };

    enum class Kind : std::uint8_t {
        kDictionary,
        kArray,
        kString,
        kData,
        kDate,
        kInteger,
        kReal,
        kBoolean
    };

    PropertyList();  ///< an empty dictionary

    // One constructor a kind, and none by conversion: a C string is not a boolean.
    explicit PropertyList(Dictionary value);
    explicit PropertyList(Array value);
    explicit PropertyList(std::string value);
    explicit PropertyList(const char* value);
    explicit PropertyList(Data value);

    explicit PropertyList(Date value) : value_(value) {}

    explicit PropertyList(std::int64_t value) : value_(value) {}

    explicit PropertyList(double value) : value_(value) {}

    explicit PropertyList(bool value) : value_(value) {}

    [[nodiscard]] Kind kind() const { return static_cast<Kind>(value_.index()); }

    /// The value as one kind, or null when it is another.
    template <typename T>
    [[nodiscard]] const T* as() const {
        if constexpr (kIsShared<T>) {
            const auto* const shared = std::get_if<Shared<T>>(&value_);
            return shared == nullptr ? nullptr : shared->get();
        } else {
            return std::get_if<T>(&value_);
        }
    }

    /// The value of the last such key of a dictionary; null when there is none, or no dictionary.
    [[nodiscard]] const PropertyList* find(std::string_view key) const;

    /// By kind, order and value, all the way down.
    bool operator==(const PropertyList& other) const;

private:
    template <typename T>
    using Shared = std::shared_ptr<const T>;

    template <typename T>
    static constexpr bool kIsShared = std::is_same_v<T, Dictionary> || std::is_same_v<T, Array> ||
                                      std::is_same_v<T, std::string> || std::is_same_v<T, Data>;

    /// In the order of Kind.
    std::variant<Shared<Dictionary>,
                 Shared<Array>,
                 Shared<std::string>,
                 Shared<Data>,
                 Date,
                 std::int64_t,
                 double,
                 bool>
        value_;
};

// What a property list may be, read or written: 16 MiB, 64 containers inside one another, 200,000
// objects (keys count, and shared ones count at each use), 64 MiB of keys, texts and data
// (likewise). Texts hold what XML 1.0 can hold: UTF-8 without control characters other than tab,
// line feed and carriage return. Dates lie in the years 1 to 9999. Integers fit 64 bits with a
// sign.

/// Parses XML or binary 1.0, and no other format; none when the bytes are no property list or
/// exceed the limits. Nothing is guessed, cut or skipped: a number with a tail, a date that no
/// calendar has, a key without a value or a second root make it no property list. Of equal keys the
/// last counts, and takes the place of the first. Binary dates lose their fractions of a second; a
/// NaN is a NaN, whatever its bits.
[[nodiscard]] std::optional<PropertyList> PropertyListCreateWithData(
    std::span<const std::byte> data);

/// The XML 1.0 form, which parses back to an equal value; none beyond the limits.
[[nodiscard]] std::optional<std::vector<std::byte>> PropertyListCreateXmlData(
    const PropertyList& value);

/// The binary 1.0 form, likewise.
[[nodiscard]] std::optional<std::vector<std::byte>> PropertyListCreateBinaryData(
    const PropertyList& value);

}  // namespace platform
