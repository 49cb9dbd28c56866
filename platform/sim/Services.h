// What the simulated closed services remember.
#pragma once

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "platform/PreferenceChanges.h"
#include "platform/UserDatabase.h"
#include "platform/sim/Sim.h"

namespace sim {

struct User {
    platform::UserRecord record;
    std::optional<std::string> home;
};

/// Preference domains by name; the system's own begin with "system:".
struct PreferenceDomains {
    std::map<std::string, platform::PropertyList, std::less<>> stored;
    std::map<std::string, platform::PropertyList, std::less<>> seen;
    std::map<std::string, platform::PreferenceChanges, std::less<>> waiting;
};

struct Services {
    std::map<std::string, User, std::less<>> users{
        {"mobile", {.record = {.uid = 501, .gid = 501}, .home = "/var/mobile"}}};
    std::map<std::string, std::uint32_t, std::less<>> groups{{"mobile", 501}, {"wheel", 0}};
    std::vector<PreferencesFlush> flushes;
    PreferenceDomains preferences{};
    Baseband baseband = Baseband::kAbsent;
    bool isBasebandBusy = false;
    std::function<void()> terminationHandler;
};

Services& TheServices();

}  // namespace sim
