// The deterministic world around the daemon: its time, its faults, its services and its journal.
//
// One thread does everything. Time moves only when nothing is ready, and what is ready at one
// instant is served in an order that the seed decides. Everything is as after Reset when a test
// begins without it: the user "mobile" (501/501) with the home /var/mobile, where /var/mobile is
// root's link to ../private/var/mobile.
#pragma once

#include <cstdint>
#include <functional>
#include <initializer_list>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Log.h"
#include "platform/Preferences.h"
#include "platform/PropertyList.h"
#include "platform/SystemLog.h"

namespace sim {

/// Thrown out of a wait that can never end: nothing is ready and nothing will become ready.
class NothingLeftToHappen : public std::logic_error {
public:
    using std::logic_error::logic_error;
};

/// Thrown at a call that breaks the contract of an interface.
class ContractBroken : public std::logic_error {
public:
    using std::logic_error::logic_error;
};

/// A new world. Every process of the old one has exited, and the daemon has heard of it.
void Reset(std::uint64_t seed = 1);

// Time.

/// Seconds since the last Reset.
[[nodiscard]] double Now();

/// Something that happens outside the daemon at that second, or in so many seconds.
void At(double seconds, std::function<void()> event);
void In(double seconds, std::function<void()> event);

/// Serves whatever is ready, on the main loop and on all queues, while no time passes.
void Settle();

/// The same, while so much time passes.
void RunFor(double seconds);

/// From inside a callout that would block its thread: lets all others go on until it holds.
void RunOthersUntil(const std::function<bool()>& holds);

/// A callout that is busy for so long.
void Spend(double seconds);

/// From now on every platform call takes a microsecond, and scripted events happen in between.
void InterleaveAtCalls(bool isOn);

/// Called after each thing that was served, until the next Reset.
void WatchSteps(std::function<void()> watch);

/// A number below `bound`, from the seed.
[[nodiscard]] std::uint64_t Random(std::uint64_t bound);

// Faults.

/// The n-th platform call from now that can fail does fail, as the real one fails. 0: none does.
void FailCall(unsigned n);

/// The same, counting the calls of one name (as in the journal) only.
void FailCall(std::string_view call, unsigned n);

/// The call that was made to fail, empty while none has been.
[[nodiscard]] const std::string& FailedCall();

// The journal: every platform call and log line, one text each, "name details".

[[nodiscard]] const std::vector<std::string>& Journal();
void ClearJournal();

/// How many entries begin with these letters.
[[nodiscard]] std::size_t JournalCount(std::string_view beginning);

/// Whether entries that begin so stand in the journal one after the other, others between them.
[[nodiscard]] bool JournalHasInOrder(std::initializer_list<std::string_view> beginnings);

// Both logs, line by line as the daemon wrote them.

struct LogLine {
    platform::LogLevel level;
    std::string text;

    bool operator==(const LogLine&) const = default;
};

struct SystemLogLine {
    platform::SystemLogPriority priority;
    std::string text;

    bool operator==(const SystemLogLine&) const = default;
};

[[nodiscard]] const std::vector<LogLine>& UnifiedLog();
[[nodiscard]] const std::vector<SystemLogLine>& SystemLogLines();
void ClearLogs();

// Closed services.

/// Binds a value to an entitlement of a group, or of one process.
void GrantToGroup(std::uint32_t gid, std::string_view entitlement, platform::PropertyList value);
void GrantToProcess(std::int32_t pid, std::string_view entitlement, platform::PropertyList value);

/// Users; no home: the user is known, and its home directory is not.
void SetUser(std::string_view name,
             std::uint32_t uid,
             std::uint32_t gid,
             std::optional<std::string> home);
void RemoveUser(std::string_view name);

struct PreferencesFlush {
    std::optional<std::string> identifier;
    platform::PreferencesUser user = platform::PreferencesUser::kCurrent;

    bool operator==(const PreferencesFlush&) const = default;
};

[[nodiscard]] const std::vector<PreferencesFlush>& PreferencesFlushes();

/// Another process writes a whole domain, or looks at it. The system's own domains, which are
/// looked at last, begin with "system:".
void StorePreferences(std::string_view domain, platform::PropertyList entries);
[[nodiscard]] platform::PropertyList StoredPreferences(std::string_view domain);

enum class Baseband : std::uint8_t { kAbsent, kDeclines, kPresent };

void SetBaseband(Baseband baseband);
void SetBasebandBusy(bool isBusy);

/// What SIGTERM does.
void RequestTermination();

/// Bytes of vm_allocate that nobody has given back.
[[nodiscard]] std::size_t AllocatedMemory();

}  // namespace sim
