// Changes of a preference domain that wait to be written, under the same rules for every twin.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/PropertyList.h"

namespace platform {

struct PreferenceChange {
    std::string key;
    std::optional<PropertyList> value;  ///< none removes the key
    std::size_t size = 0;               ///< of the value as a property list, in bytes
};

/// One for each key.
using PreferenceChanges = std::vector<PreferenceChange>;

/// Puts the changes into a dictionary: keys keep their places, new ones follow. True when it is not
/// as it was.
[[nodiscard]] bool ApplyPreferenceChanges(const PreferenceChanges& changes, PropertyList& entries);

}  // namespace platform
