#include "Helper/Shared/Server/EntitlementCache.h"

#include <cstdlib>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <utility>

#include "platform/ProcessExit.h"
#include "platform/SecTask.h"

using namespace platform;

namespace {

/// A yes, and whom it was given to. A process id alone names nobody: it is given out again.
struct CachedEntitlement {
    AuditIdentity sender;
    std::string entitlement;
};

using EntitlementCache = std::multimap<std::int32_t, CachedEntitlement>;
using ProcessExitWatchers = std::map<std::int32_t, std::shared_ptr<ProcessExitSource>>;

constinit std::mutex tableLock;  // guards both tables
constinit EntitlementCache* entitlementCache = nullptr;
constinit ProcessExitWatchers* processExitWatchers = nullptr;

void ReleaseTables() {
    const std::lock_guard guard(tableLock);
    for (const auto& [pid, watcher] : *processExitWatchers) {
        watcher->cancel();
    }
    delete std::exchange(entitlementCache, nullptr);
    delete std::exchange(processExitWatchers, nullptr);
}

void CreateTablesOnce() {
    static std::once_flag once;
    std::call_once(once, [] {
        const std::lock_guard guard(tableLock);
        entitlementCache = new EntitlementCache;
        processExitWatchers = new ProcessExitWatchers;
        (void)std::atexit(ReleaseTables);  // without it the end of the process releases them
    });
}

/// With the table lock held.
void ForgetProcess(std::int32_t pid) {
    entitlementCache->erase(pid);
    if (const auto watcher = processExitWatchers->find(pid);
        watcher != processExitWatchers->end()) {
        watcher->second->cancel();
        processExitWatchers->erase(watcher);
    }
}

void ProcessExited(std::int32_t pid) {
    const std::lock_guard guard(tableLock);
    if (entitlementCache != nullptr && processExitWatchers != nullptr) {
        ForgetProcess(pid);
    }
}

/// With the table lock held. The answer counts while the process that got it lives: when its id
/// went to another one before we heard of the exit, the entry must not speak for that one.
bool IsCached(std::string_view entitlement, const AuditIdentity& sender) {
    const auto watcher = processExitWatchers->find(sender.pid);
    if (watcher == processExitWatchers->end()) {
        return false;
    }
    if (!watcher->second->processLives()) {
        ForgetProcess(sender.pid);
        return false;
    }
    const auto [first, last] = entitlementCache->equal_range(sender.pid);
    for (auto entry = first; entry != last; ++entry) {
        if (entry->second.sender == sender && entry->second.entitlement == entitlement) {
            return true;
        }
    }
    return false;
}

/// With the table lock held. False when the process cannot be watched.
bool WatchProcess(std::int32_t pid) {
    if (processExitWatchers->contains(pid)) {
        return true;
    }
    auto watcher = ProcessExitSource::create(pid);
    if (watcher == nullptr) {
        return false;
    }
    watcher->setEventHandler([pid] { ProcessExited(pid); });
    // The source keeps itself until it is cancelled: a handler may run while the table lets go.
    watcher->setCancelHandler([retained = watcher]() mutable { retained.reset(); });
    watcher->activate();
    processExitWatchers->emplace(pid, std::move(watcher));
    return true;
}

/// Only the boolean true grants: neither the integer 1 nor the string "true" does.
bool AskSystem(std::string_view entitlement, const AuditToken& auditToken) {
    const auto task = SecTask::createWithAuditToken(auditToken);
    if (task == nullptr) {
        return false;
    }
    const auto answer = task->copyValueForEntitlement(entitlement);
    if (!answer.value.has_value() || answer.error != 0) {
        return false;
    }
    const bool* value = answer.value->as<bool>();
    return value != nullptr && *value;
}

}  // namespace

bool HasEntitlement(std::string_view entitlement, const AuditToken& auditToken) {
    CreateTablesOnce();
    const AuditIdentity sender = audit_token_to_identity(auditToken);
    {
        const std::lock_guard guard(tableLock);
        if (IsCached(entitlement, sender)) {
            return true;
        }
    }
    if (!AskSystem(entitlement, auditToken)) {
        return false;
    }
    const std::lock_guard guard(tableLock);
    if (WatchProcess(sender.pid)) {
        entitlementCache->emplace(
            sender.pid,
            CachedEntitlement{.sender = sender, .entitlement = std::string(entitlement)});
    }
    return true;
}
