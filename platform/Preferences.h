// Preference domains of the mobile user: named dictionaries, one property-list file each.
//
// The current user is the mobile user, whoever runs this process, and values are for any host. What
// is done to files is done with that user's rights. A domain whose name is empty, longer than
// kLongestPreferenceDomain or holds "/" or NUL has no values, and nothing is stored in it.
//
// All calls may come from any thread. A file that cannot be used is told in one error line that
// names the file and never a value.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/PropertyList.h"

namespace platform {

inline constexpr std::size_t kLongestPreferenceDomain = 249;

enum class PreferencesUser : std::uint8_t { kCurrent, kAny };

/// Sets the value of a key, or removes the key with none. Calls that read see it at once; it
/// reaches the domain's file with the next synchronise. Should more wait than is sound to keep, the
/// changes of the domain are written at once.
void PreferencesSetValue(std::string_view key,
                         std::optional<PropertyList> value,
                         std::string_view domain);

/// Writes what was set and has the next call that reads see the domain's file as it is then. False
/// when the domain has no file or what was set could not be written: the file is as it was, and
/// what was set is dropped, so that nothing is written later that nobody waits for. A reader of the
/// file sees the old or the new contents.
///
/// What cannot be read (no permission, not a regular file, more than 16 MiB) is not written over. A
/// file that is no property list counts as empty and is kept as <file>.damaged when it is.
[[nodiscard]] bool PreferencesSynchronize(std::string_view domain);

/// The value of a key in the user's domain.
[[nodiscard]] std::optional<PropertyList> PreferencesCopyValue(std::string_view key,
                                                               std::string_view domain);

/// PreferencesSynchronize, for all that PreferencesCopyAppValue looks at.
[[nodiscard]] bool PreferencesAppSynchronize(std::string_view domain);

/// The first value of a key in: the user's domain, the user's global domain (.GlobalPreferences),
/// the system's domain, the system's global domain (both in /Library/Preferences/).
[[nodiscard]] std::optional<PropertyList> PreferencesCopyAppValue(std::string_view key,
                                                                  std::string_view domain);

/// Makes every reader of the domain read it afresh; what was set and not written stays. No
/// identifier flushes all domains.
void PreferencesFlushCachesForIdentifier(std::optional<std::string_view> identifier,
                                         PreferencesUser user);

}  // namespace platform
