// The home has places (folders that requests lead through), and beside them decoys: what each place
// is exchanged with, one after the other, for a moment. A place thus is a folder of the mobile
// user's about half of the time, and something that leads elsewhere for the rest.
#include "tests/attack/Attacker.h"

#include <fcntl.h>
#include <grp.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <stdexcept>

#include "tests/attack/Canary.h"
#include "tests/support/PhoneRoot.h"

namespace attack {
namespace {

namespace fs = std::filesystem;

const std::string kOwn = std::string(kHome) + "/own";
const std::string kDecoys = std::string(kHome) + "/decoys";
const std::string kTurn = std::string(kHome) + "/turn";
const std::string kAside = std::string(kHome) + "/aside";
const std::string kCanaryFolder = std::string(kCanary) + "/open";

const std::vector<std::string>& Places() {
    static const std::string library = phone::kMobileLibrary;
    static const std::vector<std::string> places{library,
                                                 library + "/Preferences",
                                                 library + "/Carrier Bundles",
                                                 std::string(kHome) + "/Media",
                                                 std::string(kHome) + "/Media/a",
                                                 std::string(kHome) + "/Media/a/b",
                                                 kTurn};
    return places;
}

/// What decoy links say. The first two lead to the mobile user's own and may be followed.
const std::vector<std::string>& DecoyTargets() {
    static const std::vector<std::string> targets{
        kOwn,
        "/var/mobile/own",
        kCanaryFolder,
        std::string(kCanary) + "/secret",
        std::string(kHome) + "/chain1",
        // From wherever it stands: going up at the root changes nothing.
        "../../../../../../private/canary/open",
        kOwn + "/../../../canary/open",
        "/etc",
        "/Library",
        "/proc/self/root/private/canary/open",
        kTurn,
        kTurn + "/a",
        "nowhere",
    };
    return targets;
}

const std::vector<std::string>& Decoys() {
    static const std::vector<std::string> decoys = [] {
        std::vector<std::string> names{kDecoys + "/file"};
        for (std::size_t i = 0; i < DecoyTargets().size(); ++i) {
            names.push_back(kDecoys + "/" + std::to_string(i));
        }
        return names;
    }();
    return decoys;
}

void GiveToMobileUser(const std::string& path) {
    if (lchown(path.c_str(), phone::kMobileUser, phone::kMobileUser) != 0) {
        throw std::runtime_error("cannot give away " + path);
    }
}

void MakeHome() {
    for (const auto& entry : fs::directory_iterator(kHome)) {
        fs::remove_all(entry);
    }
    for (const auto& folder :
         {std::string(phone::kMobileLibrary), kOwn, kTurn, std::string(kHome) + "/Media"}) {
        MakeLibraryLikeFolder(folder);
    }
    fs::create_directory(kDecoys);
    std::ofstream(kDecoys + "/file") << "in the middle of a path";
    for (std::size_t i = 0; i < DecoyTargets().size(); ++i) {
        fs::create_symlink(DecoyTargets()[i], kDecoys + "/" + std::to_string(i));
    }
    fs::create_symlink("chain2", std::string(kHome) + "/chain1");
    fs::create_symlink(kCanaryFolder, std::string(kHome) + "/chain2");
    for (const auto& entry : fs::recursive_directory_iterator(kHome)) {
        GiveToMobileUser(entry.path());
    }
}

/// Of the calling thread alone, which is why libc, which would change all threads, is not asked.
void BecomeMobileUser() {
    const auto id = phone::kMobileUser;
    if (syscall(SYS_setgroups, 0, nullptr) != 0 || syscall(SYS_setresgid, id, id, id) != 0 ||
        syscall(SYS_setresuid, id, id, id) != 0) {
        throw std::runtime_error("cannot become the mobile user");
    }
}

}  // namespace

Attacker::Attacker() {
    MakeCanary();
    MakeHome();
    thread_ = std::thread([this] { run(); });
    while (swaps_ == 0) {
        std::this_thread::yield();
    }
}

Attacker::~Attacker() {
    stop();
}

void Attacker::stop() {
    isOver_ = true;
    if (thread_.joinable()) {
        thread_.join();
    }
}

void Attacker::run() {
    BecomeMobileUser();
    while (!isOver_) {
        move(0);
    }
}

void Attacker::move(int depth) {
    constexpr int kPlacesAtOnce = 3;
    if (depth == kPlacesAtOnce) {
        return;
    }
    const auto& place = Places()[random(Places().size())];
    switch (random(8)) {
        case 0:
            replaceByLink(place, depth);
            break;
        case 1:
            plantThing(place);
            break;
        default:
            exchange(place, Decoys()[random(Decoys().size())], depth);
    }
    // For some time things are as they should be.
    for (auto pause = random(1U << random(10)); pause > 0; --pause) {
        std::atomic_signal_fence(std::memory_order_seq_cst);
    }
}

void Attacker::exchange(const std::string& place, const std::string& other, int depth) {
    const auto swap = [&] {
        return renameat2(AT_FDCWD, place.c_str(), AT_FDCWD, other.c_str(), RENAME_EXCHANGE) == 0;
    };
    if (swap()) {
        ++swaps_;
        move(depth + 1 + static_cast<int>(random(2)));
        swap();
    }
}

/// The same without the exchange: for a moment nothing is there.
void Attacker::replaceByLink(const std::string& place, int depth) {
    const std::string aside = kAside + std::to_string(depth);
    if (rename(place.c_str(), aside.c_str()) != 0) {
        return;
    }
    if (symlink(DecoyTargets()[random(DecoyTargets().size())].c_str(), place.c_str()) == 0) {
        ++swaps_;
        unlink(place.c_str());
    }
    rename(aside.c_str(), place.c_str());
}

/// Something to be removed or to be in the way; each call may find its name taken.
void Attacker::plantThing(const std::string& place) {
    const std::string name = place + std::array{"/file", "/link", "/empty", "/fresh"}[random(4)];
    switch (random(6)) {
        case 0:
            (void)!link((kDecoys + "/file").c_str(), name.c_str());
            break;
        case 1:  // refused where hard links are protected
            (void)!link((kCanaryFolder + "/file").c_str(), (place + "/hard").c_str());
            break;
        case 2:
            (void)!symlink((kCanaryFolder + "/file").c_str(), name.c_str());
            break;
        case 3:
            mkdir(name.c_str(), 0755);
            break;
        case 4:
            mkfifo(name.c_str(), 0644);
            break;
        default:
            unlink(name.c_str());
            rmdir(name.c_str());
    }
}

std::uint32_t Attacker::random(std::size_t below) {
    seed_ ^= seed_ << 13;
    seed_ ^= seed_ >> 17;
    seed_ ^= seed_ << 5;
    return seed_ % static_cast<std::uint32_t>(below);
}

std::vector<std::string> SwappedPlaces() {
    return Places();
}

std::vector<std::string> PathsThroughSwappedPlaces() {
    std::vector<std::string> paths;
    for (const auto& place : Places()) {
        for (const char* name : {"/file",
                                 "/link",
                                 "/empty",
                                 "/full",
                                 "/fresh",
                                 "/empty/",
                                 "/a/../fresh",
                                 "/Carrier Bundle.bundle",
                                 "/com.vendra.carrier.plist"}) {
            paths.push_back(place + name);
        }
    }
    return paths;
}

std::vector<std::string> AllowedLinkPaths() {
    const std::string library = phone::kMobileLibrary;
    return {library + "/Carrier Bundle.bundle",
            library + "/Preferences/com.vendra.carrier.plist",
            "/var/mobile/Library/Carrier Bundle.bundle"};
}

std::vector<std::string> AllowedCarrierPaths() {
    std::vector<std::string> paths = AllowedLinkPaths();
    for (const char* name :
         {"/file", "/link", "/empty", "/full", "/fresh", "/../Preferences/file"}) {
        paths.push_back(std::string(phone::kMobileLibrary) + "/Carrier Bundles" + name);
    }
    return paths;
}

}  // namespace attack
