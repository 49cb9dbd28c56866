#include "tests/attack/Operations.h"

#include <cerrno>
#include <filesystem>
#include <fstream>

#include "handlers/files/FileSystemManager.h"
#include "platform/PathAccess.h"
#include "tests/attack/Attacker.h"
#include "tests/attack/Canary.h"

namespace attack {
namespace {

namespace fs = std::filesystem;

const std::string kScratch = "/private/scratch";  ///< what root copies and moves to the places
const std::string kTaken = "/private/taken";      ///< what root takes from there

void MakeRootsFolders() {
    for (const auto& folder : {kScratch, kTaken}) {
        fs::remove_all(folder);
        fs::create_directory(folder);
        fs::permissions(folder, fs::perms::owner_all);
    }
    fs::create_directories(kScratch + "/full/inner");
    std::ofstream(kScratch + "/full/inner/file") << "root's own";
    std::ofstream(kScratch + "/file") << "root's own";
}

bool HoldsCanary(const fs::path& path) {
    std::ifstream file(path);
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    return text == kCanaryContents;
}

/// Looks through what was taken, and throws it away.
int CanariesTaken() {
    int canaries = 0;
    for (const auto& entry : fs::recursive_directory_iterator(kTaken)) {
        canaries += entry.symlink_status().type() == fs::file_type::regular && HoldsCanary(entry);
    }
    for (const auto& entry : fs::directory_iterator(kTaken)) {
        fs::remove_all(entry);
    }
    return canaries;
}

constexpr int kFileOperations = 9;

int PerformFileOperation(int number, const std::string& path, const std::string& place) {
    constexpr std::uint32_t kMobile = 501;
    using Recursive = FileSystemInterface::Recursive;
    FileSystemManager manager;
    const std::string taken = kTaken + "/item";
    const std::string moving = kScratch + "/moving";
    const std::vector<std::byte> data(10);
    switch (number % kFileOperations) {
        case 0:  // merges where something is
            return manager.copyItem((kScratch + "/full").c_str(), path.c_str());
        case 1:
            return manager.copyItem(path.c_str(), taken.c_str());
        case 2:
            (void)manager.copyItem((kScratch + "/file").c_str(), moving.c_str());
            return manager.moveItem(moving.c_str(), path.c_str());
        case 3:
            return manager.moveItem(path.c_str(), taken.c_str());
        case 4:
            return manager.remove(path);
        case 5:
            return manager.setOwner(place.c_str(), kMobile, kMobile, Recursive::kYes);
        case 6:
            return manager.setPermissions(place.c_str(), 0755, Recursive::kYes);
        case 7:
            return manager.createDirectory(
                path + "/new/er", 0755, FileSystemInterface::Intermediates::kCreate);
        default:
            return manager.writeData(path, &data) ? 0 : EIO;
    }
}

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
    attacker.stop();
    outcome.swaps = attacker.swaps();
    outcome.damage = before.differencesTo(Snapshot::take());
    return outcome;
}

Outcome AttackFileManager(int operations) {
    Outcome outcome{.operations = operations};
    MakeRootsFolders();
    Attacker attacker;
    const auto before = Snapshot::take();
    const auto paths = PathsThroughSwappedPlaces();
    const auto places = SwappedPlaces();
    for (int i = 0; i < operations; ++i) {
        const auto& path = paths[static_cast<std::size_t>(i) % paths.size()];
        const auto& place = places[static_cast<std::size_t>(i) % places.size()];
        // Each path sees each operation, with one more step after every round.
        const int result =
            PerformFileOperation(i + i / static_cast<int>(paths.size()), path, place);
        outcome.succeeded += result == 0 ? 1 : 0;
        outcome.refused += result == EPERM ? 1 : 0;
        outcome.sawCanary += CanariesTaken();
    }
    attacker.stop();
    outcome.swaps = attacker.swaps();
    outcome.damage = before.differencesTo(Snapshot::take());
    return outcome;
}

}  // namespace attack
