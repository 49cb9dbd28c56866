#include "platform/PropertyList.h"

#include <algorithm>

#include "platform/PropertyListBinary.h"
#include "platform/PropertyListXml.h"

namespace platform {
namespace {

template <typename T>
bool AreEqual(const PropertyList& one, const PropertyList& other) {
    const T* const left = one.as<T>();
    const T* const right = other.as<T>();
    return left == right || *left == *right;  // one shared value is equal to itself
}

}  // namespace

PropertyList::PropertyList() {
    // It stays for the life of the process: queues make lists when that is ending, too.
    static const auto& empty = *new std::shared_ptr<const Dictionary>(new Dictionary);
    value_ = empty;
}

PropertyList::PropertyList(Dictionary value)
    : value_(std::make_shared<const Dictionary>(std::move(value))) {}

PropertyList::PropertyList(Array value) : value_(std::make_shared<const Array>(std::move(value))) {}

PropertyList::PropertyList(std::string value)
    : value_(std::make_shared<const std::string>(std::move(value))) {}

PropertyList::PropertyList(const char* value) : PropertyList(std::string(value)) {}

PropertyList::PropertyList(Data value) : value_(std::make_shared<const Data>(std::move(value))) {}

const PropertyList* PropertyList::find(std::string_view key) const {
    const auto* entries = as<Dictionary>();
    if (entries == nullptr) {
        return nullptr;
    }
    const auto last = std::find_if(entries->rbegin(), entries->rend(), [key](const auto& entry) {
        return entry.first == key;
    });
    return last == entries->rend() ? nullptr : &last->second;
}

bool PropertyList::operator==(const PropertyList& other) const {
    if (kind() != other.kind()) {
        return false;
    }
    switch (kind()) {
        case Kind::kDictionary:
            return AreEqual<Dictionary>(*this, other);
        case Kind::kArray:
            return AreEqual<Array>(*this, other);
        case Kind::kString:
            return AreEqual<std::string>(*this, other);
        case Kind::kData:
            return AreEqual<Data>(*this, other);
        case Kind::kDate:
        case Kind::kInteger:
        case Kind::kReal:
        case Kind::kBoolean:
            break;
    }
    return value_ == other.value_;
}

std::optional<PropertyList> PropertyListCreateWithData(std::span<const std::byte> data) {
    if (data.size() > kPropertyListLimits.bytes) {
        return std::nullopt;
    }
    const std::string_view text(reinterpret_cast<const char*>(data.data()), data.size());
    return text.starts_with("bplist") ? ReadBinaryPropertyList(data) : ReadXmlPropertyList(text);
}

}  // namespace platform
