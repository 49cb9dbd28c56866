#include "lasd/DatabaseVersions.h"

#include <string>

#include "lasd/VersionComparison.h"
#include "platform/Log.h"
#include "platform/Preferences.h"

using platform::Log;
using platform::LogLevel;
using platform::PropertyList;

namespace {

bool IsDictionary(const PropertyList* value) {
    return value != nullptr && value->kind() == PropertyList::Kind::kDictionary;
}

const PropertyList* FindDictionary(const PropertyList& index, DatabaseType type) {
    const PropertyList* const value = index.find(DatabaseTypeName(type));
    return IsDictionary(value) ? value : nullptr;
}

const char* TextOrEmpty(const std::string* text) {
    return text == nullptr ? "" : text->c_str();
}

}  // namespace

const std::string* VersionOf(const PropertyList* entry) {
    const PropertyList* const version = entry == nullptr ? nullptr : entry->find("Version");
    return version == nullptr ? nullptr : version->as<std::string>();
}

void DatabaseVersions::readInstalled(std::string_view domain, std::uint32_t mask) {
    for (const DatabaseType type : kDatabaseTypes) {
        if ((MaskOf(type) & mask) != 0) {
            auto value = platform::PreferencesCopyValue(DatabaseTypeName(type), domain);
            entries_[type] = value && IsDictionary(&*value) ? std::move(value) : std::nullopt;
        }
    }
}

std::uint32_t DatabaseVersions::takeNewer(const PropertyList& index, std::uint32_t mask) {
    std::uint32_t newer = 0;
    // Entries of earlier checks are among them, which the mask of this one leaves out.
    for (auto& [type, entry] : entries_) {
        if ((MaskOf(type) & mask) == 0 || isUpToDate(&index, type)) {
            continue;
        }
        if (const PropertyList* const offered = FindDictionary(index, type)) {
            entry = *offered;
            newer |= MaskOf(type);
        }
    }
    return newer;
}

bool DatabaseVersions::isUpToDate(const PropertyList* index, DatabaseType type) {
    if (index == nullptr) {
        return false;
    }
    const char* const name = DatabaseTypeName(type);
    const PropertyList* const offered = FindDictionary(*index, type);
    if (offered == nullptr) {
        // The line speaks of the wrong side, and has always done so.
        Log(LogLevel::kInfo, "%s db is not present locally, update required", name);
        return false;
    }
    const std::string* const offeredVersion = VersionOf(offered);
    const Entry& entry = entries_[type];
    const std::string* const version = VersionOf(entry ? &*entry : nullptr);
    if (version == nullptr) {
        Log(LogLevel::kInfo,
            "We have don't have a previously downloaded %s database, server has %s, update "
            "required",
            name,
            TextOrEmpty(offeredVersion));
        return false;
    }
    if (offeredVersion != nullptr && CompareVersions(*version, *offeredVersion) == 0) {
        Log(LogLevel::kInfo, "%s version %s matches server version", name, offeredVersion->c_str());
        return true;
    }
    Log(LogLevel::kInfo,
        "We have %s version %s, server has %s, update required",
        name,
        version->c_str(),
        TextOrEmpty(offeredVersion));
    return false;
}

const DatabaseVersions::Entry* DatabaseVersions::find(DatabaseType type) const {
    const auto found = entries_.find(type);
    return found == entries_.end() ? nullptr : &found->second;
}
