#include <bit>
#include <cmath>
#include <limits>
#include <map>
#include <string>

#include "platform/PropertyListBinary.h"
#include "platform/PropertyListEntries.h"
#include "platform/PropertyListText.h"

namespace platform {
namespace {

constexpr std::string_view kMagic = "bplist00";
constexpr std::size_t kTrailerSize = 32;

/// A few bytes can refer to one large text many times over, so larger ones are made once and
/// shared. What is made may not exceed what a file can hold: texts that overlap are a trap.
constexpr std::size_t kSharedFrom = 1024;

class BinaryReader {
public:
    explicit BinaryReader(std::span<const std::byte> data) : data_(data) {}

    std::optional<PropertyList> read() {
        const std::string_view text(reinterpret_cast<const char*>(data_.data()), data_.size());
        if (!text.starts_with(kMagic) || data_.size() < kMagic.size() + kTrailerSize) {
            return std::nullopt;
        }
        const std::size_t trailer = data_.size() - kTrailerSize;
        offsetSize_ = byteAt(trailer + 6);
        referenceSize_ = byteAt(trailer + 7);
        objectCount_ = number(trailer + 8, 8);
        table_ = number(trailer + 24, 8);
        const auto isWidth = [](unsigned width) { return width >= 1 && width <= 8; };
        const bool isSound = isWidth(offsetSize_) && isWidth(referenceSize_) &&
                             table_ >= kMagic.size() && table_ <= trailer &&
                             objectCount_ <= (trailer - table_) / offsetSize_;
        return isSound ? readObject(number(trailer + 16, 8)) : std::nullopt;
    }

private:
    /// The marker of an object, and where what follows it starts.
    struct Object {
        std::size_t marker = 0;
        unsigned kind = 0;
        unsigned low = 0;
        std::size_t at = 0;
        std::uint64_t count = 0;  ///< of kinds that have one
    };

    enum ObjectKind : unsigned {
        kSimple = 0x0,
        kInteger = 0x1,
        kReal = 0x2,
        kDate = 0x3,
        kData = 0x4,
        kAsciiText = 0x5,
        kUtf16Text = 0x6,
        kArray = 0xA,
        kDictionary = 0xD,
    };

    [[nodiscard]] unsigned byteAt(std::size_t at) const {
        return std::to_integer<unsigned>(data_[at]);
    }

    /// Big-endian, up to 8 bytes.
    [[nodiscard]] std::uint64_t number(std::size_t at, unsigned size) const {
        std::uint64_t value = 0;
        while (size-- > 0) {
            value = value << 8 | byteAt(at++);
        }
        return value;
    }

    [[nodiscard]] std::optional<Object> objectAt(std::uint64_t index) const {
        if (index >= objectCount_) {
            return std::nullopt;
        }
        const std::uint64_t at = number(table_ + index * offsetSize_, offsetSize_);
        if (at < kMagic.size() || at >= table_) {
            return std::nullopt;
        }
        Object object{.marker = at, .kind = byteAt(at) >> 4, .low = byteAt(at) & 15, .at = at + 1};
        const bool hasCount = object.kind == kData || object.kind == kAsciiText ||
                              object.kind == kUtf16Text || object.kind == kArray ||
                              object.kind == kDictionary;
        object.count = object.low;
        return !hasCount || object.low != 15 || takeCount(object) ? std::optional(object)
                                                                  : std::nullopt;
    }

    /// A count of 15 and more stands behind the marker as an integer.
    [[nodiscard]] bool takeCount(Object& object) const {
        if (object.at >= table_ || byteAt(object.at) >> 4 != kInteger ||
            (byteAt(object.at) & 15) > 3) {
            return false;
        }
        const unsigned width = 1U << (byteAt(object.at) & 15);
        if (width > table_ - ++object.at) {
            return false;
        }
        object.count = number(object.at, width);
        object.at += width;
        return true;
    }

    /// True when so many items of this size lie behind the marker.
    [[nodiscard]] bool has(const Object& object, std::uint64_t count, std::size_t size) const {
        return count <= (table_ - object.at) / size;
    }

    std::optional<PropertyList> readObject(std::uint64_t index) {
        const auto object = objectAt(index);
        if (!object || !budget_.takeObject()) {
            return std::nullopt;
        }
        switch (object->kind) {
            case kSimple:
                return object->low == 8 || object->low == 9
                           ? std::optional(PropertyList(object->low == 9))
                           : std::nullopt;
            case kInteger:
                return readInteger(*object);
            case kReal:
                return readReal(*object);
            case kDate:
                return readDate(*object);
            case kData:
            case kAsciiText:
            case kUtf16Text:
                return readLeaf(*object);
            case kArray:
            case kDictionary:
                return readContainer(*object);
            default:
                return std::nullopt;
        }
    }

    /// Up to 4 bytes have no sign, 8 have one, and 16 exist for what does not fit a signed 8.
    [[nodiscard]] std::optional<PropertyList> readInteger(const Object& object) const {
        const std::size_t width = std::size_t{1} << object.low;
        if (object.low > 4 || !has(object, 1, width)) {
            return std::nullopt;
        }
        const bool isWide = width == 16;
        const std::uint64_t value =
            number(object.at + (isWide ? 8 : 0), static_cast<unsigned>(isWide ? 8 : width));
        const bool fits = !isWide || (number(object.at, 8) == 0 && value >> 63 == 0);
        return fits ? std::optional(PropertyList(static_cast<std::int64_t>(value))) : std::nullopt;
    }

    [[nodiscard]] std::optional<PropertyList> readReal(const Object& object) const {
        if ((object.low != 2 && object.low != 3) || !has(object, 1, std::size_t{1} << object.low)) {
            return std::nullopt;
        }
        const double value = object.low == 2
                                 ? static_cast<double>(std::bit_cast<float>(
                                       static_cast<std::uint32_t>(number(object.at, 4))))
                                 : std::bit_cast<double>(number(object.at, 8));
        return PropertyList(std::isnan(value) ? std::numeric_limits<double>::quiet_NaN() : value);
    }

    [[nodiscard]] std::optional<PropertyList> readDate(const Object& object) const {
        if (object.low != 3 || !has(object, 1, 8)) {
            return std::nullopt;
        }
        const double seconds = std::floor(std::bit_cast<double>(number(object.at, 8)));
        constexpr double kFarthest = 1e12;
        if (!(std::abs(seconds) < kFarthest)) {  // nor is a NaN a date
            return std::nullopt;
        }
        const PropertyList::Date date{.seconds = static_cast<std::int64_t>(seconds)};
        return IsCalendarDate(date) ? std::optional(PropertyList(date)) : std::nullopt;
    }

    std::optional<PropertyList> readLeaf(const Object& object) {
        const auto known = shared_.find(object.marker);
        auto leaf = known != shared_.end() ? std::optional(known->second)
                    : object.kind == kData ? makeData(object)
                                           : makeText(object);
        if (!leaf) {
            return std::nullopt;
        }
        const std::size_t size = leaf->kind() == PropertyList::Kind::kData
                                     ? leaf->as<PropertyList::Data>()->size()
                                     : leaf->as<std::string>()->size();
        if (known == shared_.end()) {
            if (size > bytesToMakeLeft_) {
                return std::nullopt;
            }
            bytesToMakeLeft_ -= size;
            if (size >= kSharedFrom) {
                shared_.emplace(object.marker, *leaf);
            }
        }
        return budget_.takeLeaf(size) ? leaf : std::nullopt;
    }

    [[nodiscard]] std::optional<PropertyList> makeData(const Object& object) const {
        if (!has(object, object.count, 1)) {
            return std::nullopt;
        }
        const auto bytes = data_.subspan(object.at, object.count);
        return PropertyList(PropertyList::Data(bytes.begin(), bytes.end()));
    }

    [[nodiscard]] std::optional<PropertyList> makeText(const Object& object) const {
        auto text = object.kind == kAsciiText ? asciiText(object) : utf16Text(object);
        return text && IsXmlText(*text) ? std::optional(PropertyList(std::move(*text)))
                                        : std::nullopt;
    }

    /// Some write UTF-8 here.
    [[nodiscard]] std::optional<std::string> asciiText(const Object& object) const {
        if (!has(object, object.count, 1)) {
            return std::nullopt;
        }
        return std::string(reinterpret_cast<const char*>(data_.data()) + object.at, object.count);
    }

    [[nodiscard]] std::optional<std::string> utf16Text(const Object& object) const {
        if (!has(object, object.count, 2)) {
            return std::nullopt;
        }
        std::string text;
        text.reserve(object.count * 3);  // never grown: a large one would be there twice
        for (std::uint64_t i = 0; i < object.count; ++i) {
            auto character = static_cast<std::uint32_t>(number(object.at + 2 * i, 2));
            if (character >= 0xD800 && character < 0xDC00 && ++i < object.count) {
                const auto low = static_cast<std::uint32_t>(number(object.at + 2 * i, 2));
                if (low < 0xDC00 || low > 0xDFFF) {
                    return std::nullopt;
                }
                character = 0x10000 + ((character - 0xD800) << 10) + (low - 0xDC00);
            }
            if (!IsXmlCharacter(character)) {  // which half a pair is not
                return std::nullopt;
            }
            AppendUtf8(text, character);
        }
        text.shrink_to_fit();
        return text;
    }

    std::optional<PropertyList> readContainer(const Object& object) {
        const std::size_t each = object.kind == kDictionary ? 2 : 1;
        if (!has(object, object.count, referenceSize_ * each) ||
            object.count * each > budget_.objectsLeft() || !budget_.enter()) {
            return std::nullopt;
        }
        auto value = object.kind == kDictionary ? readDictionary(object) : readArray(object);
        budget_.leave();
        return value;
    }

    [[nodiscard]] std::uint64_t reference(const Object& object, std::uint64_t index) const {
        return number(object.at + index * referenceSize_, referenceSize_);
    }

    std::optional<PropertyList> readArray(const Object& object) {
        PropertyList::Array values;
        values.reserve(object.count);
        for (std::uint64_t i = 0; i < object.count; ++i) {
            auto value = readObject(reference(object, i));
            if (!value) {
                return std::nullopt;
            }
            values.push_back(std::move(*value));
        }
        return PropertyList(std::move(values));
    }

    std::optional<PropertyList> readDictionary(const Object& object) {
        PropertyList::Dictionary entries;
        entries.reserve(object.count);
        for (std::uint64_t i = 0; i < object.count; ++i) {
            const auto key = readObject(reference(object, i));
            const auto* const text = key ? key->as<std::string>() : nullptr;
            auto value =
                text != nullptr ? readObject(reference(object, object.count + i)) : std::nullopt;
            if (!value) {
                return std::nullopt;
            }
            entries.emplace_back(*text, std::move(*value));
        }
        MergeEqualKeys(entries);
        return PropertyList(std::move(entries));
    }

    const std::span<const std::byte> data_;
    std::size_t table_ = 0;
    std::uint64_t objectCount_ = 0;
    unsigned offsetSize_ = 0;
    unsigned referenceSize_ = 0;
    PropertyListBudget budget_;
    std::size_t bytesToMakeLeft_ = kPropertyListLimits.bytes;
    /// By marker: objects that overlap may have their contents at one place.
    std::map<std::size_t, PropertyList> shared_;
};

}  // namespace

std::optional<PropertyList> ReadBinaryPropertyList(std::span<const std::byte> data) {
    return data.size() <= kPropertyListLimits.bytes ? BinaryReader(data).read() : std::nullopt;
}

}  // namespace platform
