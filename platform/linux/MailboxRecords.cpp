#include "platform/linux/MailboxRecords.h"

#include <algorithm>
#include <cstring>
#include <utility>

#include "platform/PropertyListText.h"

namespace platform {
namespace {

constexpr const char* kTokenKey = "Token";
constexpr const char* kRecordsKey = "Records";
constexpr const char* kKeyKey = "Key";

PropertyList ListOfText(const std::string& text) {
    if (IsXmlText(text)) {
        return PropertyList(text);
    }
    PropertyList::Data data(text.size());
    std::memcpy(data.data(), text.data(), text.size());
    return PropertyList(std::move(data));
}

std::optional<std::string> TextOfList(const PropertyList* list) {
    if (list == nullptr) {
        return std::nullopt;
    }
    if (const auto* const text = list->as<std::string>()) {
        return *text;
    }
    if (const auto* const data = list->as<PropertyList::Data>()) {
        return std::string(reinterpret_cast<const char*>(data->data()), data->size());
    }
    return std::nullopt;
}

PropertyList ListOfRecord(const MailboxRecords::Record& record) {
    return PropertyList(PropertyList::Dictionary{{kKeyKey, ListOfText(record.key)},
                                                 {kTokenKey, ListOfText(record.token)}});
}

bool TakeToken(const PropertyList* list, MailboxRecords& records) {
    records.token = TextOfList(list);
    return list == nullptr || records.token.has_value();
}

bool TakeRecords(const PropertyList* list, MailboxRecords& records) {
    if (list == nullptr) {
        return true;
    }
    const auto* const array = list->as<PropertyList::Array>();
    return array != nullptr && std::ranges::all_of(*array, [&records](const PropertyList& entry) {
               auto key = TextOfList(entry.find(kKeyKey));
               auto token = TextOfList(entry.find(kTokenKey));
               const bool isRecord = key && token;
               if (isRecord) {
                   records.records.push_back({std::move(*key), std::move(*token)});
               }
               return isRecord;
           });
}

/// For records that may be changed, and for those that may not.
template <typename Records>
auto TokenIn(Records& records, std::string_view key) -> decltype(&records.front().token) {
    const auto found = std::ranges::find(records, key, &MailboxRecords::Record::key);
    return found == records.end() ? nullptr : &found->token;
}

}  // namespace

const std::string* MailboxRecords::find(std::string_view key) const {
    return TokenIn(records, key);
}

std::string* MailboxRecords::find(std::string_view key) {
    return TokenIn(records, key);
}

PropertyList PropertyListOf(const MailboxRecords& records) {
    PropertyList::Dictionary entries;
    if (records.token) {
        entries.emplace_back(kTokenKey, ListOfText(*records.token));
    }
    if (!records.records.empty()) {
        PropertyList::Array array;
        std::ranges::transform(records.records, std::back_inserter(array), ListOfRecord);
        entries.emplace_back(kRecordsKey, PropertyList(std::move(array)));
    }
    return PropertyList(std::move(entries));
}

std::optional<MailboxRecords> MailboxRecordsOf(const PropertyList& list) {
    MailboxRecords records;
    const bool isStore = list.kind() == PropertyList::Kind::kDictionary &&
                         TakeToken(list.find(kTokenKey), records) &&
                         TakeRecords(list.find(kRecordsKey), records);
    return isStore ? std::optional(std::move(records)) : std::nullopt;
}

}  // namespace platform
