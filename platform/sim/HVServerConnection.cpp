// A telephony daemon whose answers a test decides.
#include "platform/HVServerConnection.h"

#include <algorithm>
#include <cerrno>
#include <utility>

#include "platform/sim/SimLocation.h"
#include "platform/sim/World.h"

namespace {

constexpr double kSecondsMax = 2.0;

struct Daemon {
    sim::Telephony telephony{};
    std::vector<sim::TelephonyReport> reports{};
    std::vector<std::string> identifiers{};
    std::size_t connections = 0;
};

Daemon& TheDaemon() {
    static Daemon& daemon = *new Daemon;
    return daemon;
}

}  // namespace

namespace sim {

void SetTelephony(Telephony telephony) {
    TheDaemon().telephony = std::move(telephony);
}

const std::vector<TelephonyReport>& TelephonyReports() {
    return TheDaemon().reports;
}

std::size_t TelephonyConnections() {
    return TheDaemon().connections;
}

void ResetTelephony() {
    TheDaemon() = {.connections = TheDaemon().connections};
}

}  // namespace sim

namespace platform {
namespace {

class SimConnection final : public HVServerConnection {
public:
    SimConnection(HVServerConnectionCallback callback, void* context)
        : callback_(callback), context_(context) {
        ++TheDaemon().connections;
    }

    SimConnection(const SimConnection&) = delete;
    SimConnection& operator=(const SimConnection&) = delete;

    ~SimConnection() {
        --TheDaemon().connections;
        sim::NoteCall("HVServerConnection.released");
    }

    HVError report(const char* call, std::vector<std::optional<std::string>> texts) {
        const Daemon& daemon = TheDaemon();
        const sim::Telephony telephony = daemon.telephony;
        TheDaemon().reports.push_back({.time = sim::Now(),
                                       .call = call,
                                       .texts = std::move(texts),
                                       .identifiers = daemon.identifiers});
        if (telephony.onReport) {
            telephony.onReport();
        }
        for (int i = 0; i < telephony.notifications; ++i) {
            callback_(*this, PropertyList(), context_);
        }
        const double left = madeAt_ + kSecondsMax - sim::Now();
        wait(std::clamp(telephony.delay, 0.0, std::max(left, 0.0)));
        return telephony.delay >= left ? HVError{kHVErrorDomainPOSIX, ETIMEDOUT} : telephony.status;
    }

private:
    /// The caller's thread stands still while all others go on.
    static void wait(double seconds) {
        const double end = sim::Now() + seconds;
        sim::At(end, [] {});
        sim::RunOthersUntil([end] { return sim::Now() >= end; });
    }

    const HVServerConnectionCallback callback_;
    void* const context_;
    const double madeAt_ = sim::Now();
};

SimConnection& AsSim(HVServerConnection& connection) {
    return static_cast<SimConnection&>(connection);
}

}  // namespace

void _HVServerConnectionAddIdentifierException(std::string_view identifier) {
    sim::NoteCall("HVServerConnection.addIdentifierException", identifier);
    auto& identifiers = TheDaemon().identifiers;
    if (std::ranges::find(identifiers, identifier) == identifiers.end()) {
        identifiers.emplace_back(identifier);
    }
}

std::shared_ptr<HVServerConnection> _HVServerConnectionCreate(HVServerConnectionCallback callback,
                                                              void* context) {
    const bool fails = sim::CallFails("HVServerConnection.create");
    return fails || !TheDaemon().telephony.isReachable
               ? nullptr
               : std::make_shared<SimConnection>(callback, context);
}

HVError _HVServerConnectionSetCivicInfoBasedOnCurrentLocation(
    HVServerConnection& connection,
    const std::optional<std::string>& countryCode,
    const std::optional<std::string>& state,
    const std::optional<std::string>& city,
    const std::optional<std::string>& postalCode) {
    return sim::CallFails("HVServerConnection.setCivicInfo")
               ? HVError{kHVErrorDomainPOSIX, ECONNRESET}
               : AsSim(connection).report("civic", {countryCode, state, city, postalCode});
}

HVError _HVServerConnectionSetLocalRoutableAddress(HVServerConnection& connection,
                                                   const std::optional<std::string>& address) {
    return sim::CallFails("HVServerConnection.setLocalRoutableAddress")
               ? HVError{kHVErrorDomainPOSIX, ECONNRESET}
               : AsSim(connection).report("address", {address});
}

}  // namespace platform
