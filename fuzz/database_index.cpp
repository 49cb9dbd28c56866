// Indexes of databases: what is taken from one is what was asked for, and differs.
//
// The first byte is the mask, the rest a property list, whose key "installed" holds the record.
#include "fuzz/Fuzz.h"
#include "lasd/DatabaseFiles.h"
#include "lasd/DatabaseVersions.h"
#include "lasd/VersionComparison.h"
#include "platform/sim/Sim.h"

using platform::PropertyList;

namespace {

constexpr const char* kDomain = "com.vendra.lasd";

void CheckComparison(const std::string& a, const std::string& b) {
    Require(CompareVersions(a, a) == 0 && CompareVersions(b, b) == 0);
    Require((CompareVersions(a, b) == 0) == (CompareVersions(b, a) == 0));
    Require((CompareVersions(a, b) < 0) == (CompareVersions(b, a) > 0));
}

void CheckFileName(const PropertyList& entry) {
    const PropertyList* const url = entry.find("ContentURL");
    const auto* const text = url == nullptr ? nullptr : url->as<std::string>();
    if (const auto name = text == nullptr ? std::nullopt : DatabaseFileName(*text)) {
        Require(name->find('/') == std::string::npos && name->find(".gz") == std::string::npos);
    }
}

/// A type that was taken has the server's whole entry, whose version was not the installed one.
void CheckTaken(const PropertyList& index, const PropertyList& installed, DatabaseType type) {
    const PropertyList* const offered = index.find(DatabaseTypeName(type));
    Require(offered != nullptr && offered->kind() == PropertyList::Kind::kDictionary);
    const std::string* const version = VersionOf(offered);
    const std::string* const before = VersionOf(installed.find(DatabaseTypeName(type)));
    if (version != nullptr && before != nullptr) {
        Require(CompareVersions(*version, *before) != 0);
        CheckComparison(*version, *before);
    }
    CheckFileName(*offered);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto bytes = std::as_bytes(std::span(data, size));
    const auto index =
        size == 0 ? std::nullopt : platform::PropertyListCreateWithData(bytes.subspan(1));
    if (!index || index->kind() != PropertyList::Kind::kDictionary) {
        return 0;
    }
    sim::Reset();
    const PropertyList* const record = index->find("installed");
    const bool isRecord = record != nullptr && record->kind() == PropertyList::Kind::kDictionary;
    const PropertyList installed = isRecord ? *record : PropertyList();
    sim::StorePreferences(kDomain, installed);
    const std::uint32_t mask = data[0];
    DatabaseVersions versions;
    versions.readInstalled(kDomain, mask);
    const std::uint32_t newer = versions.takeNewer(*index, mask);
    Require((newer & ~mask) == 0 && newer < 32);
    std::uint32_t unversioned = 0;
    for (const DatabaseType type : kDatabaseTypes) {
        if ((MaskOf(type) & newer) != 0) {
            CheckTaken(*index, installed, type);
            Require(**versions.find(type) == *index->find(DatabaseTypeName(type)));
            unversioned |= VersionOf(&**versions.find(type)) == nullptr ? MaskOf(type) : 0;
        }
    }
    // What was taken is what is there: nothing is newer any more, but for what tells no version.
    Require(versions.takeNewer(*index, mask) == unversioned);
    return 0;
}
