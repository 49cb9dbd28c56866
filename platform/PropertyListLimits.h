// What a property list may take up, counted in the same way by readers and writers.
#pragma once

#include <cstddef>

namespace platform {

struct PropertyListLimits {
    std::size_t bytes = 16U << 20;
    std::size_t depth = 64;             ///< containers inside one another
    std::size_t objects = 200'000;      ///< keys count; shared ones count at each use
    std::size_t leafBytes = 64U << 20;  ///< keys, texts and data, counted likewise
};

inline constexpr PropertyListLimits kPropertyListLimits{};

/// What is left of the limits while a property list is walked. Every take is false when that was
/// too much.
class PropertyListBudget {
public:
    [[nodiscard]] bool takeObject() { return take(left_.objects, 1); }

    [[nodiscard]] bool takeLeaf(std::size_t bytes) { return take(left_.leafBytes, bytes); }

    [[nodiscard]] std::size_t objectsLeft() const { return left_.objects; }

    /// Around everything inside a container.
    [[nodiscard]] bool enter() { return take(left_.depth, 1); }

    void leave() { ++left_.depth; }

private:
    [[nodiscard]] static bool take(std::size_t& left, std::size_t amount) {
        if (amount > left) {
            return false;
        }
        left -= amount;
        return true;
    }

    PropertyListLimits left_ = kPropertyListLimits;
};

}  // namespace platform
