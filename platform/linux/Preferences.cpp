// Preferences on property-list files.
//
// Every call works with the mobile user's rights: that user owns the folder and can put links,
// FIFOs and other people's files there, and must reach no more through this process than without
// it.
#include "platform/Preferences.h"

#include <algorithm>
#include <array>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "platform/PreferenceChanges.h"
#include "platform/PropertyListXml.h"
#include "platform/UserDatabase.h"
#include "platform/linux/Complaints.h"
#include "platform/linux/FreedMemory.h"
#include "platform/linux/PreferenceFile.h"
#include "platform/linux/UserRights.h"

namespace platform {
namespace {

constexpr const char* kUserName = "mobile";
constexpr std::string_view kSystemFolder = "/Library/Preferences/";
constexpr std::string_view kGlobalDomain = ".GlobalPreferences";

// What clients can make us keep: as many small files, and as much that was set and not written.
constexpr std::size_t kMostCachedFiles = 8;
constexpr std::size_t kLargestCachedFile = 32U << 10;
constexpr std::size_t kMostWaitingChanges = 64;
constexpr std::size_t kMostWaitingBytes = 1U << 20;

constexpr std::string_view kNoRights = "is no user whose rights to files could be taken";

/// Where a value may come from.
enum class Search : std::uint8_t { kDomain, kApplication };

bool IsDomainName(std::string_view domain) {
    return !domain.empty() && domain.size() <= kLongestPreferenceDomain &&
           domain.find('/') == std::string_view::npos &&
           domain.find('\0') == std::string_view::npos;
}

bool CheckDomainName(std::string_view domain, Complaints& complaints) {
    const bool isName = IsDomainName(domain);
    if (!isName) {
        // What was meant is cut: it may be long, and a NUL would end it anyhow.
        complaints.add("\"" + std::string(domain.substr(0, kLongestPreferenceDomain)) + "\"",
                       "cannot name a domain");
    }
    return isName;
}

/// The one record of the process: what was read, and what was set and not yet written.
class PreferenceStore {
public:
    static PreferenceStore& shared() {
        static auto* const store = new PreferenceStore();  // queue threads reach it to the very end
        return *store;
    }

    void set(std::string_view domain, PreferenceChange change) {
        Complaints complaints("preferences");
        const std::lock_guard lock(mutex_);
        if (!CheckDomainName(domain, complaints)) {
            return;
        }
        makeRoom(complaints);
        change.size = change.value
                          ? XmlPropertyListSize(*change.value).value_or(kPropertyListLimits.bytes)
                          : 0;
        PreferenceChanges& changes = waiting_[std::string(domain)];
        std::erase_if(changes, [&change](const PreferenceChange& earlier) {
            return earlier.key == change.key;
        });
        changes.push_back(std::move(change));
    }

    bool synchronize(std::string_view domain, Search search) {
        Complaints complaints("preferences");
        const std::lock_guard lock(mutex_);
        if (!IsDomainName(domain)) {
            return false;  // who set something there was told
        }
        bool isWritten = synchronizeDomain(domain, complaints);
        if (search == Search::kApplication) {
            isWritten = synchronizeDomain(kGlobalDomain, complaints) && isWritten;
        }
        returnMemoryOfLargeFile();
        return isWritten;
    }

    std::optional<PropertyList> copy(std::string_view key, std::string_view domain, Search search) {
        Complaints complaints("preferences");
        const std::lock_guard lock(mutex_);
        if (!CheckDomainName(domain, complaints)) {
            return std::nullopt;
        }
        const auto home = CopyHomeDirectoryForUser(kUserName);
        const UserRights rights(kUserName);
        if (!home || !rights.areHeld()) {
            complaints.add(kUserName, kNoRights);
            return std::nullopt;
        }
        const std::array<Source, 4> sources{{{userFolder(*home), domain, true},
                                             {userFolder(*home), kGlobalDomain, true},
                                             {std::string(kSystemFolder), domain, false},
                                             {std::string(kSystemFolder), kGlobalDomain, false}}};
        std::optional<PropertyList> value;
        const auto searched =
            std::span(sources).first(search == Search::kDomain ? 1 : sources.size());
        for (auto source = searched.begin(); !value && source != searched.end(); ++source) {
            value = copyFrom(*source, key, complaints);
        }
        returnMemoryOfLargeFile();
        return value;
    }

    void flush(std::optional<std::string_view> domain) {
        const std::lock_guard lock(mutex_);
        std::erase_if(
            cache_, [domain](const CachedFile& file) { return !domain || file.domain == *domain; });
    }

private:
    struct Source {
        std::string folder;
        std::string_view domain;
        bool isUsers = false;  ///< and may have changes waiting

        [[nodiscard]] std::string path() const { return folder + std::string(domain) + ".plist"; }
    };

    struct CachedFile {
        std::string path;
        std::string domain;
        PropertyList entries;
    };

    static std::string userFolder(const std::string& home) {
        return home + "/Library/Preferences/";
    }

    void noteSize(std::size_t fileSize) { hasReadLargeFile_ |= fileSize > kLargestCachedFile; }

    void returnMemoryOfLargeFile() {
        if (std::exchange(hasReadLargeFile_, false)) {
            ReturnFreedMemory();
        }
    }

    /// Lets one more change wait: should much wait already, it is written.
    void makeRoom(Complaints& complaints) {
        std::size_t count = 0;
        std::size_t bytes = 0;
        for (const auto& [domain, changes] : waiting_) {
            for (const PreferenceChange& change : changes) {
                ++count;
                bytes += change.size;
            }
        }
        if (count < kMostWaitingChanges && bytes <= kMostWaitingBytes) {
            return;
        }
        while (!waiting_.empty()) {
            const std::string domain = waiting_.begin()->first;
            (void)synchronizeDomain(domain, complaints);  // nobody is there to be told, but the log
        }
    }

    bool synchronizeDomain(std::string_view domain, Complaints& complaints) {
        std::erase_if(cache_, [domain](const CachedFile& file) { return file.domain == domain; });
        const auto waiting = waiting_.find(domain);
        if (waiting == waiting_.end()) {
            return true;
        }
        const PreferenceChanges changes = std::move(waiting->second);
        waiting_.erase(waiting);
        return write(domain, changes, complaints);
    }

    bool write(std::string_view domain, const PreferenceChanges& changes, Complaints& complaints) {
        const auto home = CopyHomeDirectoryForUser(kUserName);
        const UserRights rights(kUserName);
        if (!home || !rights.areHeld()) {
            complaints.add(kUserName, kNoRights);
            return false;
        }
        const std::string path = Source{userFolder(*home), domain, true}.path();
        const PreferenceFile file(path);
        PreferenceFile::Contents contents = file.read();
        noteSize(contents.fileSize);
        if (contents.state == PreferenceFile::State::kUnreadable) {
            complaints.add(path, contents.complaint + ", so it is not written over");
            return false;
        }
        if (!contents.complaint.empty()) {
            complaints.add(path, contents.complaint);
        }
        if (!ApplyPreferenceChanges(changes, contents.entries)) {
            return true;
        }
        const std::string complaint = file.replace(contents);
        if (!complaint.empty()) {
            complaints.add(path, complaint);
        }
        return complaint.empty();
    }

    std::optional<PropertyList> copyFrom(const Source& source,
                                         std::string_view key,
                                         Complaints& complaints) {
        if (const auto waiting = waiting_.find(source.domain);
            source.isUsers && waiting != waiting_.end()) {
            const auto change = std::ranges::find(waiting->second, key, &PreferenceChange::key);
            if (change != waiting->second.end()) {
                return change->value;
            }
        }
        const PropertyList entries = load(source, complaints);
        const PropertyList* const value = entries.find(key);
        return value == nullptr ? std::nullopt : std::optional(*value);
    }

    PropertyList load(const Source& source, Complaints& complaints) {
        const std::string path = source.path();
        if (const auto cached = std::ranges::find(cache_, path, &CachedFile::path);
            cached != cache_.end()) {
            return cached->entries;
        }
        const PreferenceFile::Contents contents = PreferenceFile(path).read();
        noteSize(contents.fileSize);
        if (!contents.complaint.empty()) {
            complaints.add(path, contents.complaint);
        }
        if (contents.fileSize <= kLargestCachedFile) {
            if (cache_.size() == kMostCachedFiles) {
                cache_.erase(cache_.begin());
            }
            cache_.push_back(
                {.path = path, .domain = std::string(source.domain), .entries = contents.entries});
        }
        return contents.entries;
    }

    // All of it under the mutex, the reading and writing of files as well: two threads that change
    // one domain must not overwrite each other's changes.
    std::mutex mutex_;
    bool hasReadLargeFile_ = false;
    std::vector<CachedFile> cache_;  ///< the oldest first
    std::map<std::string, PreferenceChanges, std::less<>> waiting_;
};

}  // namespace

void PreferencesSetValue(std::string_view key,
                         std::optional<PropertyList> value,
                         std::string_view domain) {
    PreferenceStore::shared().set(domain, {.key = std::string(key), .value = std::move(value)});
}

bool PreferencesSynchronize(std::string_view domain) {
    return PreferenceStore::shared().synchronize(domain, Search::kDomain);
}

std::optional<PropertyList> PreferencesCopyValue(std::string_view key, std::string_view domain) {
    return PreferenceStore::shared().copy(key, domain, Search::kDomain);
}

bool PreferencesAppSynchronize(std::string_view domain) {
    return PreferenceStore::shared().synchronize(domain, Search::kApplication);
}

std::optional<PropertyList> PreferencesCopyAppValue(std::string_view key, std::string_view domain) {
    return PreferenceStore::shared().copy(key, domain, Search::kApplication);
}

// The current user is one of any users, and there is no other whose values are kept here.
void PreferencesFlushCachesForIdentifier(std::optional<std::string_view> identifier,
                                         PreferencesUser /*user*/) {
    PreferenceStore::shared().flush(identifier);
}

}  // namespace platform
