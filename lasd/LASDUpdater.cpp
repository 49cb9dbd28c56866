#include "lasd/LASDUpdater.h"

#include <utility>

#include "lasd/DatabaseFiles.h"
#include "lasd/HttpFetcher.h"
#include "lasd/Notifications.h"
#include "platform/BuildConstants.h"
#include "platform/Log.h"
#include "platform/Preferences.h"
#include "platform/PropertyList.h"
#include "platform/hvu/cf.h"

using platform::Log;
using platform::LogLevel;
using platform::PropertyList;

namespace {

constexpr const char* kInstalledDomain = "com.vendra.lasd";
constexpr DatabaseType kNoType{};

std::string IndexUrl() {
    return "https://" + std::string(platform::kConfigurationHost) + "/1/v3/lasd.plist";
}

/// Keeps the process from its idle exit for as long as the object lives.
class ServerHold {
public:
    explicit ServerHold(MobileHelperServer* server)
        : server_(server), token_(ServerHoldAcquire(server)) {}

    ~ServerHold() { ServerHoldRelease(server_, token_); }

    ServerHold(const ServerHold&) = delete;
    ServerHold& operator=(const ServerHold&) = delete;

private:
    MobileHelperServer* const server_;
    const std::uint32_t token_;
};

/// One check's place among those under way, given back with the last copy. Null when all are taken.
std::shared_ptr<void> TakePlace(const std::shared_ptr<std::atomic<std::uint32_t>>& taken) {
    if (++*taken > LASDUpdater::kChecksMax) {
        --*taken;
        return nullptr;
    }
    return {taken.get(), [taken](std::atomic<std::uint32_t>* /*count*/) { --*taken; }};
}

// Queue threads may use it until the process is gone. At exit this pointer is let go of, but the
// object is destroyed by a task of its queue, and from main's return no queue starts one.
const std::shared_ptr<LASDUpdater> updaterOfTheProcess = LASDUpdater::create();

}  // namespace

LASDUpdater::LASDUpdater()
    : SharedSynchronizable("LASDUpdater"),
      checksUnderWay_(std::make_shared<std::atomic<std::uint32_t>>(0)) {}

LASDUpdater& LASDUpdater::shared() {
    return *updaterOfTheProcess;
}

void LASDUpdater::checkForUpdate(MobileHelperServer* server, std::uint32_t mask) {
    Log(LogLevel::kInfo, "Trying to see if update available for mask %x", mask);
    auto place = TakePlace(checksUnderWay_);
    if (place == nullptr) {
        Log(LogLevel::kError, "database check dropped: %u are under way", kChecksMax);
        return;
    }
    const std::uint32_t hold = ServerHoldAcquire(server);
    submit([this, server, mask, hold, place = std::move(place)] {
        runUpdateCheck(server, mask, hold);
    });
}

void LASDUpdater::runUpdateCheck(MobileHelperServer* server,
                                 std::uint32_t mask,
                                 std::uint32_t hold) {
    (void)readVersionSource(kInstalledDomain, Source::kLocal, mask);  // always 0
    const std::uint32_t types = readVersionSource(IndexUrl().c_str(), Source::kRemote, mask);
    if (types == kNotFetched) {
        SendNotification(MakeNotification(NotificationKind::kUpdateFailed, kNoType));
    } else if (types == 0) {
        Log(LogLevel::kError, "No update required for any databases");
        SendNotification(MakeNotification(NotificationKind::kNoUpdateRequired, kNoType));
    } else {
        updateDatabases(server, types);
    }
    ServerHoldRelease(server, hold);
}

void LASDUpdater::updateDatabases(MobileHelperServer* server, std::uint32_t types) {
    for (const DatabaseType type : kDatabaseTypes) {
        if ((MaskOf(type) & types) != 0) {
            const ServerHold hold(server);
            updateDatabase(type);
        }
    }
}

std::uint32_t LASDUpdater::readVersionSource(const char* source, Source kind, std::uint32_t mask) {
    if (kind == Source::kLocal) {
        Log(LogLevel::kInfo, "Reading local resource %s", source);
        versions_.readInstalled(source, mask);
        return 0;
    }
    HttpFetcher fetcher;
    if (!fetcher.fetch(source, Networks::kWifiOnly)) {
        Log(LogLevel::kError, "Could not fetch data from source %s", source);
        return kNotFetched;
    }
    const auto index = platform::PropertyListCreateWithData(fetcher.body());
    if (!index || index->kind() != PropertyList::Kind::kDictionary) {
        Log(LogLevel::kError, "Could not create version dictionary from downloaded plist!");
        // Nothing to be updated, on purpose: an index that cannot be read is no failure.
        return 0;
    }
    return versions_.takeNewer(*index, mask);
}

void LASDUpdater::updateDatabase(DatabaseType type) {
    const auto* const entry = versions_.find(type);
    if (entry == nullptr) {
        Log(LogLevel::kError, "Could not find %s database URL", DatabaseTypeName(type));
        return;
    }
    std::string url;
    (void)hvu::cf::assign(url, *entry ? (*entry)->find("ContentURL") : nullptr);
    if (url.empty()) {
        Log(LogLevel::kError, "URL for %s database is empty", DatabaseTypeName(type));
        return;
    }
    const bool isInstalled = downloadDatabase(url, type);
    SendNotification(MakeNotification(
        isInstalled ? NotificationKind::kUpdateAvailable : NotificationKind::kUpdateFailed, type));
}

bool LASDUpdater::downloadDatabase(const std::string& url, DatabaseType type) {
    if (!MakeDatabaseFolder()) {
        return false;
    }
    HttpFetcher fetcher;
    if (!fetcher.fetch(url, Networks::kWifiOnly)) {
        Log(LogLevel::kError,
            "Cannot download file %s. Either Wifi is turned OFF or not Wifi attached",
            url.c_str());
        return false;
    }
    const auto name = DatabaseFileName(url);
    return name && InstallDatabaseFile(fetcher, *name) && record(type);
}

bool LASDUpdater::record(DatabaseType type) {
    if (!IsKnownDatabaseType(type)) {
        return false;  // the file stays installed
    }
    const auto* const found = versions_.find(type);
    const auto entry = found == nullptr ? std::nullopt : *found;
    platform::PreferencesSetValue(DatabaseTypeName(type), entry, kInstalledDomain);
    if (!platform::PreferencesSynchronize(kInstalledDomain)) {
        return false;
    }
    const std::string* const version = VersionOf(entry ? &*entry : nullptr);
    Log(LogLevel::kInfo,
        "Downloaded %s database version %s successfully",
        DatabaseTypeName(type),
        version == nullptr ? "" : version->c_str());
    return true;
}
