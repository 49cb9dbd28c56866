// What the voicemail store holds, and its form as a property list.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/PropertyList.h"

namespace platform {

struct MailboxRecords {
    struct Record {
        std::string key;
        std::string token;

        bool operator==(const Record&) const = default;
    };

    std::optional<std::string> token{};
    std::vector<Record> records{};

    bool operator==(const MailboxRecords&) const = default;

    /// The token of a key, or null.
    [[nodiscard]] const std::string* find(std::string_view key) const;
    [[nodiscard]] std::string* find(std::string_view key);
};

/// {"Token": text, "Records": [{"Key": text, "Token": text}, ...]}. A text that XML cannot hold,
/// such as one with control characters, is data instead of a string.
[[nodiscard]] PropertyList PropertyListOf(const MailboxRecords& records);

/// None when the list is anything else.
[[nodiscard]] std::optional<MailboxRecords> MailboxRecordsOf(const PropertyList& list);

}  // namespace platform
