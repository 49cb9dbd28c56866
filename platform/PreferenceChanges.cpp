#include "platform/PreferenceChanges.h"

#include <algorithm>

namespace platform {

bool ApplyPreferenceChanges(const PreferenceChanges& changes, PropertyList& entries) {
    auto dictionary = *entries.as<PropertyList::Dictionary>();
    for (const PreferenceChange& change : changes) {
        const auto at =
            std::ranges::find(dictionary, change.key, [](const auto& entry) -> const std::string& {
                return entry.first;
            });
        if (at == dictionary.end()) {
            if (change.value) {
                dictionary.emplace_back(change.key, *change.value);
            }
        } else if (change.value) {
            at->second = *change.value;
        } else {
            dictionary.erase(at);
        }
    }
    PropertyList changed(std::move(dictionary));
    const bool isChanged = changed != entries;
    entries = std::move(changed);
    return isChanged;
}

}  // namespace platform
