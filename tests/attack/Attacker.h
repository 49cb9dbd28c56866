// The mobile user as attacker: swaps folders, links and files below the mobile home, without pause.
#pragma once

#include <atomic>
#include <cstdint>
#include <string>
#include <thread>
#include <vector>

namespace attack {

inline constexpr const char* kHome = "/private/var/mobile";

/// The attack runs on a thread of its own, with the mobile user's identity and no privilege, from
/// construction to destruction. The home and the canary are made anew before it begins.
class Attacker {
public:
    Attacker();
    ~Attacker();

    /// Nothing moves any more. Twice is harmless.
    void stop();

    Attacker(const Attacker&) = delete;
    Attacker& operator=(const Attacker&) = delete;

    /// Names that changed their meaning so far.
    [[nodiscard]] long swaps() const { return swaps_; }

private:
    void run();
    void move(int depth);
    void exchange(const std::string& place, const std::string& other, int depth);
    void replaceByLink(const std::string& place, int depth);
    void plantThing(const std::string& place);
    [[nodiscard]] std::uint32_t random(std::size_t below);

    std::atomic<bool> isOver_ = false;
    std::atomic<long> swaps_ = 0;
    std::uint32_t seed_ = 2'463'534'242;
    std::thread thread_;  // the last one: it uses the others
};

/// The places that are swapped.
[[nodiscard]] std::vector<std::string> SwappedPlaces();

/// Paths through the places that are swapped, one for each thing that can be removed or made.
[[nodiscard]] std::vector<std::string> PathsThroughSwappedPlaces();

/// The same, of those that the routines' path policy lets pass.
[[nodiscard]] std::vector<std::string> AllowedLinkPaths();
[[nodiscard]] std::vector<std::string> AllowedCarrierPaths();

}  // namespace attack
