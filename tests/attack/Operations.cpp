#include "tests/attack/Operations.h"

#include <cerrno>

#include "platform/PathAccess.h"
#include "tests/attack/Attacker.h"
#include "tests/attack/Canary.h"

namespace attack {
namespace {

int PerformOne(int number, const std::string& path, Outcome& outcome) {
    const platform::PathAccess access(path);
    platform::FileStatus status;
    switch (number % 3) {
        case 0: {
            const int error = access.lstat(&status);
            outcome.sawCanary += error == 0 && status.gid == kCanaryGroup ? 1 : 0;
            return error;
        }
        case 1:
            return access.remove();
        default:
            return access.symlink("a link of the daemon's");
    }
}

}  // namespace

Outcome AttackPathAccess(int operations) {
    Outcome outcome{.operations = operations};
    Attacker attacker;
    const auto before = Snapshot::take();
    const auto paths = PathsThroughSwappedPlaces();
    for (int i = 0; i < operations; ++i) {
        const auto& path = paths[static_cast<std::size_t>(i) % paths.size()];
        // Each path sees each operation: their numbers have no common divisor with this.
        const int error = PerformOne(i / static_cast<int>(paths.size()), path, outcome);
        outcome.succeeded += error == 0 ? 1 : 0;
        outcome.refused += error == EPERM ? 1 : 0;
    }
    outcome.swaps = attacker.swaps();
    outcome.damage = before.differencesTo(Snapshot::take());
    return outcome;
}

}  // namespace attack
