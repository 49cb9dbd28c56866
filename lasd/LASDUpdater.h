// Brings the service databases up to date: which ones the server has newer, and their installation.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>

#include "Helper/Shared/Server/HelperServerUtils.h"
#include "lasd/DatabaseTypes.h"
#include "lasd/DatabaseVersions.h"
#include "lasd/SharedSynchronizable.h"

/// One check after the other runs on the updater's own queue. Nobody waits for the outcome: the
/// telephony daemon is notified of it, and the log tells the rest.
class LASDUpdater final : public hvu::SharedSynchronizable<LASDUpdater> {
public:
    /// Where the versions of databases are read from: what is installed here, or the server's
    /// index.
    enum class Source : std::uint8_t { kLocal, kRemote };

    /// What reading a remote source answers when it could not be fetched.
    static constexpr std::uint32_t kNotFetched = 0xFFFFFFFF;

    LASDUpdater();

    /// The one of the process. It is made before main and let go of when the process exits; what
    /// its queue is at then goes on or not, and finds everything in place.
    [[nodiscard]] static LASDUpdater& shared();

    /// Checks that wait or run; more are dropped with an error line, or a client that asks faster
    /// than we work would fill our memory.
    static constexpr std::uint32_t kChecksMax = 4096;

    /// Has the databases of the mask checked, and a hold keep the process until that is done. From
    /// any thread.
    void checkForUpdate(MobileHelperServer* server, std::uint32_t mask);

    // The steps of a check, on the work queue.

    /// One whole check. Releases the hold at its end.
    void runUpdateCheck(MobileHelperServer* server, std::uint32_t mask, std::uint32_t hold);

    /// A local source is a preference domain, a remote one a URL. Gives the types to be updated, 0
    /// for a local source, or kNotFetched.
    [[nodiscard]] std::uint32_t readVersionSource(const char* source,
                                                  Source kind,
                                                  std::uint32_t mask);

    /// Installs what the entry of the type offers, and sends a notification of the outcome.
    void updateDatabase(DatabaseType type);

    /// False when it is not installed, or not recorded as installed.
    [[nodiscard]] bool downloadDatabase(const std::string& url, DatabaseType type);

private:
    void updateDatabases(MobileHelperServer* server, std::uint32_t types);
    [[nodiscard]] bool record(DatabaseType type);

    const std::shared_ptr<std::atomic<std::uint32_t>> checksUnderWay_;
    DatabaseVersions versions_;  // on the work queue
};
