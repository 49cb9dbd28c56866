#include <algorithm>
#include <bit>
#include <string>

#include "platform/PropertyListLimits.h"
#include "platform/PropertyListText.h"

namespace platform {
namespace {

using Dictionary = PropertyList::Dictionary;
using Array = PropertyList::Array;
using Kind = PropertyList::Kind;

enum Marker : unsigned {
    kFalse = 0x08,
    kTrue = 0x09,
    kInteger = 0x10,
    kReal = 0x23,
    kDate = 0x33,
    kData = 0x40,
    kAsciiText = 0x50,
    kUtf16Text = 0x60,
    kArray = 0xA0,
    kDictionary = 0xD0,
};

/// Bytes that a number takes, a power of two.
unsigned WidthOf(std::uint64_t value) {
    return value <= 0xFF ? 1 : value <= 0xFFFF ? 2 : value <= 0xFFFFFFFF ? 4 : 8;
}

std::u16string Utf16(std::string_view text) {
    std::u16string units;
    for (std::size_t at = 0; at < text.size();) {
        const auto byte = [&](std::size_t i) { return static_cast<unsigned char>(text[at + i]); };
        const unsigned lead = byte(0);
        const std::size_t length = lead < 0x80 ? 1 : lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
        std::uint32_t character = length == 1 ? lead : lead & (0x7FU >> length);
        for (std::size_t i = 1; i < length; ++i) {
            character = character << 6 | (byte(i) & 0x3FU);
        }
        if (character >= 0x10000) {
            units += static_cast<char16_t>(0xD800 + ((character - 0x10000) >> 10));
            character = 0xDC00 + (character & 0x3FF);
        }
        units += static_cast<char16_t>(character);
        at += length;
    }
    return units;
}

/// Lays the objects out level by level, so that the children of one lie side by side.
class BinaryWriter {
public:
    std::optional<std::vector<std::byte>> write(const PropertyList& root) {
        if (!add(root, 0) || !layOut()) {
            return std::nullopt;
        }
        putText("bplist00");
        referenceSize_ = WidthOf(objects_.size());
        std::vector<std::uint64_t> offsets;
        offsets.reserve(objects_.size());
        for (const Object& object : objects_) {
            offsets.push_back(bytes_.size());
            if (!writeObject(object) || bytes_.size() > kPropertyListLimits.bytes) {
                return std::nullopt;
            }
        }
        writeEnd(offsets);
        return bytes_.size() <= kPropertyListLimits.bytes ? std::optional(std::move(bytes_))
                                                          : std::nullopt;
    }

private:
    /// A value, or a key.
    struct Object {
        const PropertyList* value = nullptr;
        const std::string* key = nullptr;
        std::size_t depth = 0;       ///< containers around it
        std::size_t firstChild = 0;  ///< of a container; the values of a dictionary follow its keys
    };

    bool add(const PropertyList& value, std::size_t depth) {
        objects_.push_back({.value = &value, .depth = depth});
        return budget_.takeObject();
    }

    bool add(const std::string& key, std::size_t depth) {
        objects_.push_back({.key = &key, .depth = depth});
        return budget_.takeObject();
    }

    [[nodiscard]] bool layOut() {
        for (std::size_t i = 0; i < objects_.size(); ++i) {
            if (objects_[i].value != nullptr && !addChildren(i)) {
                return false;
            }
        }
        return true;
    }

    [[nodiscard]] bool addChildren(std::size_t index) {
        const PropertyList& value = *objects_[index].value;
        const std::size_t depth = objects_[index].depth + 1;
        objects_[index].firstChild = objects_.size();
        bool fits = true;
        if (const auto* const values = value.as<Array>(); values != nullptr) {
            for (auto at = values->begin(); fits && at != values->end(); ++at) {
                fits = add(*at, depth);
            }
            return fits && (values->empty() || depth <= kPropertyListLimits.depth);
        }
        if (const auto* const entries = value.as<Dictionary>(); entries != nullptr) {
            for (auto at = entries->begin(); fits && at != entries->end(); ++at) {
                fits = add(at->first, depth);
            }
            for (auto at = entries->begin(); fits && at != entries->end(); ++at) {
                fits = add(at->second, depth);
            }
            return fits && (entries->empty() || depth <= kPropertyListLimits.depth);
        }
        return true;
    }

    void putByte(unsigned value) { bytes_.push_back(static_cast<std::byte>(value)); }

    void putText(std::string_view text) {
        const auto* const first = reinterpret_cast<const std::byte*>(text.data());
        bytes_.insert(bytes_.end(), first, first + text.size());
    }

    void putNumber(std::uint64_t value, unsigned width) {
        while (width-- > 0) {
            putByte(static_cast<unsigned>(value >> (8 * width)) & 0xFF);
        }
    }

    void putInteger(std::uint64_t value) {
        const unsigned width = WidthOf(value);
        putByte(kInteger | static_cast<unsigned>(std::countr_zero(width)));
        putNumber(value, width);
    }

    void putMarker(unsigned marker, std::size_t count) {
        putByte(marker | static_cast<unsigned>(count < 15 ? count : 15));
        if (count >= 15) {
            putInteger(count);
        }
    }

    [[nodiscard]] bool writeObject(const Object& object) {
        if (object.key != nullptr) {
            return writeText(*object.key);
        }
        const PropertyList& value = *object.value;
        switch (value.kind()) {
            case Kind::kDictionary:
                return writeContainer(kDictionary, value.as<Dictionary>()->size(), 2, object);
            case Kind::kArray:
                return writeContainer(kArray, value.as<Array>()->size(), 1, object);
            case Kind::kString:
                return writeText(*value.as<std::string>());
            case Kind::kData:
                return writeData(*value.as<PropertyList::Data>());
            case Kind::kDate:
                return writeDate(*value.as<PropertyList::Date>());
            case Kind::kInteger:
                putInteger(static_cast<std::uint64_t>(*value.as<std::int64_t>()));
                return true;
            case Kind::kReal:
                putByte(kReal);
                putNumber(std::bit_cast<std::uint64_t>(*value.as<double>()), 8);
                return true;
            case Kind::kBoolean:
                putByte(*value.as<bool>() ? kTrue : kFalse);
                return true;
        }
        return false;
    }

    [[nodiscard]] bool writeContainer(unsigned marker,
                                      std::size_t count,
                                      std::size_t each,
                                      const Object& object) {
        putMarker(marker, count);
        for (std::size_t i = 0; i < count * each; ++i) {
            putNumber(object.firstChild + i, referenceSize_);
        }
        return true;
    }

    [[nodiscard]] bool writeText(std::string_view text) {
        if (!budget_.takeLeaf(text.size()) || text.size() > kPropertyListLimits.bytes ||
            !IsXmlText(text)) {
            return false;
        }
        const bool isAscii =
            std::ranges::all_of(text, [](char c) { return static_cast<unsigned char>(c) < 0x80; });
        if (isAscii) {
            putMarker(kAsciiText, text.size());
            putText(text);
            return true;
        }
        const std::u16string units = Utf16(text);
        putMarker(kUtf16Text, units.size());
        for (const char16_t unit : units) {
            putNumber(unit, 2);
        }
        return true;
    }

    [[nodiscard]] bool writeData(std::span<const std::byte> data) {
        if (!budget_.takeLeaf(data.size()) || data.size() > kPropertyListLimits.bytes) {
            return false;
        }
        putMarker(kData, data.size());
        bytes_.insert(bytes_.end(), data.begin(), data.end());
        return true;
    }

    [[nodiscard]] bool writeDate(PropertyList::Date date) {
        putByte(kDate);
        putNumber(std::bit_cast<std::uint64_t>(static_cast<double>(date.seconds)), 8);
        return IsCalendarDate(date);
    }

    void writeEnd(const std::vector<std::uint64_t>& offsets) {
        const std::size_t table = bytes_.size();
        const unsigned offsetSize = WidthOf(table);
        for (const std::uint64_t offset : offsets) {
            putNumber(offset, offsetSize);
        }
        putNumber(0, 6);
        putByte(offsetSize);
        putByte(referenceSize_);
        putNumber(objects_.size(), 8);
        putNumber(0, 8);  // the root comes first
        putNumber(table, 8);
    }

    PropertyListBudget budget_;
    std::vector<Object> objects_;
    std::vector<std::byte> bytes_;
    unsigned referenceSize_ = 0;
};

}  // namespace

std::optional<std::vector<std::byte>> PropertyListCreateBinaryData(const PropertyList& value) {
    return BinaryWriter().write(value);
}

}  // namespace platform
