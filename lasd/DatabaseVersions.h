// The entries of the databases, as installed and as the server offers them: what is out of date.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string_view>

#include "lasd/DatabaseTypes.h"
#include "platform/PropertyList.h"

/// An entry is the dictionary that describes one database. "Version" and "ContentURL" are read, all
/// else is carried along. Entries that one check has made stay for later ones.
class DatabaseVersions final {
public:
    using Entry = std::optional<platform::PropertyList>;

    /// Reads what the domain records as installed of the types in the mask. What is no dictionary
    /// counts as nothing.
    void readInstalled(std::string_view domain, std::uint32_t mask);

    /// Takes the index's entries of the types in the mask that are out of date, and tells which
    /// these are.
    [[nodiscard]] std::uint32_t takeNewer(const platform::PropertyList& index, std::uint32_t mask);

    /// Compares the entry with the index's, and says in one line what it found. False for no index.
    [[nodiscard]] bool isUpToDate(const platform::PropertyList* index, DatabaseType type);

    /// The entry of a type, which may be nothing; null when there is none at all.
    [[nodiscard]] const Entry* find(DatabaseType type) const;

private:
    std::map<DatabaseType, Entry> entries_;
};

/// The text of an entry's "Version"; null when it has none.
[[nodiscard]] const std::string* VersionOf(const platform::PropertyList* entry);
