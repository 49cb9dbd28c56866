// Preference domains in memory: what is stored, what readers have seen of it, and what waits.
#include "platform/Preferences.h"

#include <array>
#include <string>
#include <utility>

#include "platform/PreferenceChanges.h"
#include "platform/sim/Services.h"
#include "platform/sim/World.h"

namespace sim {

void StorePreferences(std::string_view domain, platform::PropertyList entries) {
    TheServices().preferences.stored.insert_or_assign(std::string(domain), std::move(entries));
}

platform::PropertyList StoredPreferences(std::string_view domain) {
    const auto& stored = TheServices().preferences.stored;
    const auto found = stored.find(domain);
    return found == stored.end() ? platform::PropertyList() : found->second;
}

}  // namespace sim

namespace platform {
namespace {

using sim::CallFails;
using sim::NoteCall;
using sim::TheServices;

constexpr std::string_view kGlobalDomain = ".GlobalPreferences";
const std::string kSystem = "system:";

bool IsDomainName(std::string_view domain) {
    return !domain.empty() && domain.size() <= kLongestPreferenceDomain &&
           domain.find('/') == std::string_view::npos &&
           domain.find('\0') == std::string_view::npos;
}

/// The user's domain, the user's global one, and the same two of the system.
std::array<std::string, 4> SearchOrder(std::string_view domain) {
    const std::string own(domain);
    const std::string global(kGlobalDomain);
    return {own, global, kSystem + own, kSystem + global};
}

/// What a reader sees of a domain: what it held when it was last read, with the changes that wait.
PropertyList Visible(const std::string& domain) {
    auto& preferences = TheServices().preferences;
    const auto [seen, isNew] = preferences.seen.try_emplace(domain);
    if (isNew) {
        seen->second = sim::StoredPreferences(domain);
    }
    PropertyList entries = seen->second;
    if (const auto waiting = preferences.waiting.find(domain);
        waiting != preferences.waiting.end()) {
        (void)ApplyPreferenceChanges(waiting->second, entries);
    }
    return entries;
}

bool SynchronizeDomain(const std::string& domain) {
    auto& preferences = TheServices().preferences;
    preferences.seen.erase(domain);
    const auto waiting = preferences.waiting.extract(domain);
    if (CallFails("PreferencesSynchronize", domain)) {
        return false;
    }
    if (!waiting.empty()) {
        PropertyList entries = sim::StoredPreferences(domain);
        (void)ApplyPreferenceChanges(waiting.mapped(), entries);
        sim::StorePreferences(domain, std::move(entries));
    }
    return true;
}

std::optional<PropertyList> ValueIn(const std::string& domain, std::string_view key) {
    const PropertyList entries = Visible(domain);
    const PropertyList* const value = entries.find(key);
    return value == nullptr ? std::nullopt : std::optional(*value);
}

}  // namespace

void PreferencesSetValue(std::string_view key,
                         std::optional<PropertyList> value,
                         std::string_view domain) {
    NoteCall("PreferencesSetValue", domain);
    if (IsDomainName(domain)) {
        TheServices().preferences.waiting[std::string(domain)].push_back(
            {.key = std::string(key), .value = std::move(value)});
    }
}

bool PreferencesSynchronize(std::string_view domain) {
    return IsDomainName(domain) && SynchronizeDomain(std::string(domain));
}

std::optional<PropertyList> PreferencesCopyValue(std::string_view key, std::string_view domain) {
    NoteCall("PreferencesCopyValue", domain);
    return IsDomainName(domain) ? ValueIn(std::string(domain), key) : std::nullopt;
}

bool PreferencesAppSynchronize(std::string_view domain) {
    NoteCall("PreferencesAppSynchronize", domain);
    if (!IsDomainName(domain)) {
        return false;
    }
    bool isDone = true;
    for (const auto& place : SearchOrder(domain)) {
        isDone = SynchronizeDomain(place) && isDone;
    }
    return isDone;
}

std::optional<PropertyList> PreferencesCopyAppValue(std::string_view key, std::string_view domain) {
    NoteCall("PreferencesCopyAppValue", domain);
    if (!IsDomainName(domain)) {
        return std::nullopt;
    }
    for (const auto& place : SearchOrder(domain)) {
        if (auto value = ValueIn(place, key)) {
            return value;
        }
    }
    return std::nullopt;
}

void PreferencesFlushCachesForIdentifier(std::optional<std::string_view> identifier,
                                         PreferencesUser user) {
    NoteCall("PreferencesFlushCachesForIdentifier", identifier.value_or("(all)"));
    auto& flush = TheServices().flushes.emplace_back();
    flush.user = user;
    if (identifier) {
        flush.identifier.emplace(*identifier);
        TheServices().preferences.seen.erase(std::string(*identifier));
    } else {
        TheServices().preferences.seen.clear();
    }
}

}  // namespace platform
