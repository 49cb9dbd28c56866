// The voicemail record store: the access token, and tokens filed under keys.
//
// Tokens and keys are texts in UTF-8. They are secrets: no twin ever logs one. Each call sees what
// the calls before it stored, also those of an earlier process, and may come from any thread. None
// reports a failure: what could not be stored is as it was before, what cannot be read counts as
// absent, and one error line says what to mend.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

/// Tokens under keys that the store takes; one more is not stored.
inline constexpr std::size_t kMostMailboxRecords = 1024;

/// Stores the access token in place of the one before, or with none forgets it. On return it is
/// where a crash of the system does not reach it; a crash in the middle leaves the old or the new.
void MailboxStoreSetToken(std::optional<std::string_view> token);

/// The same for the token of a key.
void MailboxStoreSetTokenForKey(std::string_view key, std::string_view token);

/// The access token, or none.
[[nodiscard]] std::optional<std::string> MailboxStoreCopyToken();

/// The token of a key, or none.
[[nodiscard]] std::optional<std::string> MailboxStoreCopyTokenForKey(std::string_view key);

/// Forgets all tokens under keys, and what may still hold one besides, such as a damaged store that
/// was put aside. The access token stays. `flags` is 0.
void MailboxStoreRemoveAllRecords(std::uint32_t flags);

}  // namespace platform
