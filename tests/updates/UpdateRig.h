// What the server offers and the phone has installed, for tests of database updates.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/PropertyList.h"
#include "tests/http/ConfigurationServer.h"
#include "tests/support/PhoneRoot.h"

namespace updates {

using platform::PropertyList;
using Dictionary = PropertyList::Dictionary;

inline constexpr std::uint32_t kUmts = 1;
inline constexpr std::uint32_t kLte = 4;
inline constexpr std::uint32_t kGsm = 8;
inline const std::string kOrigin = web::ConfigurationServer::kOrigin;
inline const std::string kIndexUrl = kOrigin + "/1/v3/lasd.plist";
inline const std::string kFolder = "/var/mobile/Library/LASD";

/// Before the configuration server starts: the phone will know its authority alone. To read all
/// that a machine trusts takes longer than the rest of an update.
void ForgetOtherAuthorities();

[[nodiscard]] std::string Xml(const PropertyList& value);

/// What a file holds; "(no file)" when there is none.
[[nodiscard]] std::string Contents(const std::string& path);

[[nodiscard]] PropertyList Entry(const std::string& version, const std::string& url);

/// Puts a database of this name onto the server and gives its URL.
std::string PutDatabase(const std::string& name, std::string_view contents);

/// Puts the index onto the server and gives its size.
std::size_t PutIndex(Dictionary entries);

/// The record of what is installed; empty when there is none.
[[nodiscard]] PropertyList Recorded();
void Record(Dictionary entries);

/// Asks the daemon for a check; true when it took the request.
[[nodiscard]] bool Ask(const phone::Client& client, std::uint32_t mask);

/// A notification by the last word of its name and its type; none for another message's data.
[[nodiscard]] std::optional<std::string> NameOf(const std::vector<std::byte>& notification);

}  // namespace updates
